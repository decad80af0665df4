#include "tools/kovabackup/facts/health.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/boot_health.h"
#include "tools/kovabackup/facts/folder_health.h"
#include "tools/kovabackup/facts/kept_edits.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/sessions.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"
#ifdef KOVA_TOOL_STANDIN
#include "platform/config/config.h"
#endif

#include <algorithm>
#include <cerrno>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct SessionCounts {
  std::ptrdiff_t all = 0;
  std::ptrdiff_t damaged = 0;
  std::ptrdiff_t lost = 0;
  std::ptrdiff_t stale = 0; // complete and lost ones
};

// A session in use is not stale however old it is: prune would leave it alone as well.
SessionCounts countSessions(const std::vector<SessionInfo> &sessions,
                            std::chrono::seconds olderThan) {
  std::vector<SessionInfo> stale;
  std::vector<Service::Error> kept;
  (void)SessionStore().prune(olderThan, true, stale, kept); // kept ones are not reported here
  const auto count = [](const std::vector<SessionInfo> &all, SessionInfo::State state) {
    return std::count_if(all.begin(), all.end(),
                         [state](const SessionInfo &session) { return session.state == state; });
  };
  SessionCounts counts;
  counts.all = static_cast<std::ptrdiff_t>(sessions.size());
  counts.lost = count(sessions, SessionInfo::State::Lost);
  counts.damaged = counts.all - counts.lost - count(sessions, SessionInfo::State::Complete);
  counts.stale =
      count(stale, SessionInfo::State::Complete) + count(stale, SessionInfo::State::Lost);
  return counts;
}

// What can be done about the sessions of each kind that there are.
std::string sessionHint(const SessionCounts &counts, const std::string &age) {
  std::string hint = "see 'kovabackup session list'";
  if (counts.damaged > 0) {
    hint += "; 'kovabackup session destroy ID' removes a damaged one, but never a foreign one";
  }
  if (counts.lost > 0) {
    hint += "; 'kovabackup session adopt PATH' keeps a lost one";
  }
  if (counts.stale > 0) {
    hint += fmt::format("; 'kovabackup session prune --older-than {0}' removes all that were not "
                        "loaded for {0}{1}",
                        age, counts.lost > 0 ? ", lost ones as well" : "");
  }
  return hint;
}

Finding notListed(const Service::Error &error) {
  if (isVolumesUnknown(error)) {
    return {
        Verdict::Remark, "sessions", whyNotListed(),
        fmt::format("correct {}; until then lost sessions are not found", volumeConfiguration())};
  }
  return {Verdict::Remark, "sessions",
          fmt::format("cannot read {}: {}", error.path, reasonAlone(error.code)),
          error.code == EACCES ? "run this command as root"
                               : "correct what the other rows name first"};
}

void checkSessions(Findings &findings, std::chrono::seconds olderThan, const std::string &age) {
  std::vector<SessionInfo> sessions;
  Service::Error error;
  if (!SessionStore().list(sessions, error)) { // only root may read the root, as it should be
    findings.push_back(notListed(error));
    return;
  }
  const SessionCounts counts = countSessions(sessions, olderThan);
  const std::string all = fmt::format("{} in all", counts.all);
  if (counts.damaged + counts.lost + counts.stale == 0) {
    findings.push_back({Verdict::Good, "sessions", all});
    return;
  }
  const std::string lost = counts.lost == 0 ? "" : fmt::format(", {} lost", counts.lost);
  findings.push_back({Verdict::Wrong, "sessions",
                      fmt::format("{}, {} damaged{}, {} not loaded for {}", all, counts.damaged,
                                  lost, counts.stale, age),
                      sessionHint(counts, age)});
}

// Nothing else leads to them once the message that named them is gone.
void checkKeptEdits(Findings &findings) {
  for (const KeptEdit &edit : keptEdits()) {
    findings.push_back(
        {Verdict::Remark, "edited text",
         fmt::format("{}: {}, edited {} ago, was not saved", edit.file,
                     edit.subject.empty() ? "a section" : edit.subject, humanAge(edit.age)),
         fmt::format("take from it what is needed, then: rm -r {}", edit.folder)});
  }
}

// The library compares mere bytes, so /tmpdata counts, too.
void noteLocalSessions(Findings &findings, const Volume &volume, const std::string &folder) {
  if (folder.rfind("/tmp", 0) == 0) {
    findings.push_back({Verdict::Remark, "volume",
                        fmt::format("{}: its path begins with /tmp, so sessions that a rule places "
                                    "there are local",
                                    volume.path),
                        "use a directory elsewhere for sessions that are to be on a volume"});
  }
}

// Ordinary users need not be able to write: the services run as root.
Finding unusable(const Volume &volume, const Usability &use) {
  const std::string detail = fmt::format("{}: {}", volume.path, use.why);
  if (use.forRoot) {
    return {Verdict::Remark, "volume", detail, "run this command as root"};
  }
  return {Verdict::Wrong, "volume", detail,
          use.missing ? fmt::format("create it, or correct its path in {}; until then no service "
                                    "uses it",
                                    volumeConfiguration())
                      : fmt::format("no service uses it: correct that, or {}", volumeAdvice())};
}

// A volume is tried as a service would try it: its temporary directory must exist or be creatable,
// and be writable.
void checkVolumes(Findings &findings, int minFreePercent) {
  std::vector<Volume> volumes;
  try {
    volumes = listVolumes();
  } catch (const Failure &failure) {
    findings.push_back({Verdict::Wrong, "volumes", failure.what(),
                        "correct what the message names; until then no service finds a volume"});
    return;
  }
  if (volumes.empty()) {
    findings.push_back(
        {Verdict::Remark, "volumes", "the platform reports none",
         fmt::format("{}; until then services that may use /tmp do so", volumeAdvice())});
  }
  for (const Volume &volume : volumes) {
    const Usability use = usability(volume);
    noteLocalSessions(findings, volume, use.folder);
    if (use.folder.empty()) {
      findings.push_back(unusable(volume, use));
    } else if (checkSpace(findings, "volume", volume.path, minFreePercent)) {
      findings.push_back({Verdict::Good, "volume", volume.path});
    }
  }
}

#ifdef KOVA_TOOL_STANDIN
// The platform's own code reads the configuration, so the doctor examines the file that services
// use. A configuration that it refuses leaves no key file to examine.
bool findKeyFile(Findings &findings, std::string &file) {
  KovaPlatform::Config config;
  clearPlatformError();
  if (!KovaPlatform::loadConfig(config)) {
    findings.push_back(
        {Verdict::Wrong, "key file", platformError(),
         fmt::format("fix {}; until then no secret can be used", KovaPlatform::configPath())});
    return false;
  }
  file = KovaPlatform::secretKeyPath(config);
  return true;
}

// No service can create the file that a dangling link names, so this is not a key that merely does
// not exist yet.
Finding unreachableKey(const std::string &file, int error) {
  struct stat info;
  if (error != ENOENT) {
    const bool forRoot = mayHelpAsRoot(error); // only root should get there
    return {forRoot ? Verdict::Remark : Verdict::Wrong, "key file",
            fmt::format("cannot access {}: {}", file, reasonAlone(error)),
            forRoot ? "run this command as root"
                    : "make it accessible; until then no secret can "
                      "be used"};
  }
  if (::lstat(file.c_str(), &info) == 0) {
    return {Verdict::Wrong, "key file",
            fmt::format("{} is a link whose target does not exist", file),
            "restore the file to which it leads, or remove the link and set all secrets again"};
  }
  return {Verdict::Remark, "key file",
          fmt::format("{} does not exist yet; it is created with the first secret", file),
          "nothing has to be done, unless secrets were stored before: then restore it"};
}

// Returns: false when there is no usable key. Trying one would create it, or fail once more.
bool checkKeyFile(Findings &findings) {
  constexpr off_t kKeyBytes = 32;
  std::string file;
  if (!findKeyFile(findings, file)) {
    return false;
  }
  struct stat info;
  if (::stat(file.c_str(), &info) != 0) {
    findings.push_back(unreachableKey(file, errno));
    return false;
  }
  std::string why;
  Fix fix;
  std::string hint = "restore the right one, or remove it and set all secrets again";
  if (!S_ISREG(info.st_mode) || info.st_size != kKeyBytes) {
    why = fmt::format("{} is not a regular file of {} bytes", file, kKeyBytes);
  } else if (!isTrustedOwner(info.st_uid)) {
    why = fmt::format("{} belongs to user {}, who is neither root nor you", file, info.st_uid);
  } else if ((info.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    why = fmt::format("{} has mode {:04o}: other users may use it", file, info.st_mode & kModeBits);
    hint = fmt::format("chmod 0600 {}", file);
    fix = modeFix(file, 0600);
  }
  findings.push_back({why.empty() ? Verdict::Good : Verdict::Wrong, "key file",
                      why.empty() ? file : why, why.empty() ? "" : hint, fix});
  return why.empty();
}
#else
bool checkKeyFile(Findings &) {
  return true; // where another platform keeps its key is unknown; that secrets work can be tried
}
#endif

// The only check that every platform allows: a text survives encryption and decryption.
void checkSecrets(Findings &findings) {
  const std::string text = "kovabackup doctor";
  OptionMap map;
  clearPlatformError();
  map.optSet("secret", text, true);
  const bool same = map.optSecret("secret", "") == text;
  findings.push_back({same ? Verdict::Good : Verdict::Wrong, "secrets",
                      same ? "encrypted and decrypted"
                           : fmt::format("cannot be encrypted and decrypted: {}", platformError()),
                      same ? "" : "restore the platform's key, or set all secrets again"});
}

// The library reports every failure there and nowhere else.
void checkSystemLog(Findings &findings) {
  struct stat info;
  const bool exists = ::stat("/dev/log", &info) == 0 && S_ISSOCK(info.st_mode);
  findings.push_back({exists ? Verdict::Good : Verdict::Remark, "system log",
                      exists ? "/dev/log" : "/dev/log is not a socket: messages are lost",
                      exists ? "" : "start the system's logger; in a container, mount /dev/log"});
}

} // namespace

// From the outside in: what is wrong with /tmp makes every later finding doubtful.
Findings checkHealth(const HealthLimits &limits) {
  Findings findings;
  checkTmp(findings, limits.minFreePercent);
  checkFolder(findings, "ipc root", Path::getIpcTempPath(), 0755);
  checkFolder(findings, "session root", SessionStore::root(), 0700);
  checkFolder(findings, "lock folder", Path::join(Path::getIpcTempPath(), "lock"), 0770);
  checkBoot(findings);
  checkSessions(findings, limits.olderThan, limits.age);
  checkKeptEdits(findings);
  checkVolumes(findings, limits.minFreePercent);
  if (checkKeyFile(findings)) {
    checkSecrets(findings);
  }
  checkSystemLog(findings);
  return findings;
}

} // namespace KOVA::Backup::Tool
