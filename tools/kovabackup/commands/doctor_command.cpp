#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/session_store.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct DoctorOptions {
  std::optional<std::string> olderThan;
  bool null = false;
};

enum class Verdict { Good, Remark, Wrong };

struct Finding {
  Verdict verdict;
  std::string check;
  std::string detail;
  std::string hint = {}; ///< what to do about it
};

using Findings = std::vector<Finding>;

constexpr mode_t kModeBits = 07777;

bool isTrustedOwner(uid_t owner) {
  return owner == 0 || owner == ::geteuid();
}

// A folder that the library makes and sets to its mode at every use.
void checkFolder(Findings &findings, const std::string &check, const std::string &folder,
                 mode_t mode) {
  struct stat info;
  if (::lstat(folder.c_str(), &info) != 0) {
    const bool absent = errno == ENOENT;
    findings.push_back({absent ? Verdict::Good : Verdict::Remark, check,
                        absent ? fmt::format("{} is not there yet: made on first use", folder)
                               : fmt::format("cannot look at {}: {}", folder, reason(errno))});
  } else if (!S_ISDIR(info.st_mode)) {
    findings.push_back({Verdict::Wrong, check, fmt::format("{} is no directory", folder),
                        "remove it: it is made on first use"});
  } else if (!isTrustedOwner(info.st_uid)) {
    findings.push_back(
        {Verdict::Wrong, check,
         fmt::format("{} belongs to user {}: neither root nor you", folder, info.st_uid),
         "what lies in it may be that user's: remove it whole as root, it is made on first use"});
  } else if ((info.st_mode & kModeBits) != mode) {
    findings.push_back({Verdict::Wrong, check,
                        fmt::format("{} has mode {:04o} instead of {:04o}", folder,
                                    info.st_mode & kModeBits, mode),
                        fmt::format("chmod {:04o} {}", mode, folder)});
  } else {
    findings.push_back({Verdict::Good, check, folder});
  }
}

// Whoever may remove what others made in /tmp may put a tree of his own in the root's place.
void checkTmp(Findings &findings) {
  struct stat info;
  if (::stat("/tmp", &info) != 0 || !S_ISDIR(info.st_mode)) {
    findings.push_back({Verdict::Wrong, "tmp", "/tmp is no directory"});
  } else if ((info.st_mode & (S_IWGRP | S_IWOTH)) != 0 && (info.st_mode & S_ISVTX) == 0) {
    findings.push_back({Verdict::Wrong, "tmp",
                        fmt::format("/tmp has mode {:04o}: others may replace what lies in it",
                                    info.st_mode & kModeBits),
                        "chmod 1777 /tmp"});
  } else {
    findings.push_back({Verdict::Good, "tmp", "/tmp"});
  }
}

void checkSessions(Findings &findings, std::chrono::seconds olderThan, const std::string &age) {
  std::size_t damaged = 0;
  std::size_t old = 0;
  std::vector<SessionEntry> sessions;
  try {
    sessions = listSessions();
  } catch (const Failure &failure) {
    findings.push_back({Verdict::Remark, "sessions", failure.what()});
    return;
  }
  const OpenPaths open;
  for (const SessionEntry &entry : sessions) {
    if (entry.state != SessionState::Whole) {
      ++damaged;
    } else if (entry.age >= olderThan && usersOf(open, entry).empty()) {
      ++old;
    }
  }
  const std::string counted = fmt::format("{} in all", sessions.size());
  if (damaged + old == 0) {
    findings.push_back({Verdict::Good, "sessions", counted});
    return;
  }
  findings.push_back(
      {Verdict::Wrong, "sessions",
       fmt::format("{}, {} damaged, {} not loaded for {}", counted, damaged, old, age),
       fmt::format("see 'kovabackup session list'; 'kovabackup session prune "
                   "--older-than {}' removes them, but never foreign ones",
                   age)});
}

void checkVolumes(Findings &findings) {
  std::vector<Volume> volumes;
  try {
    volumes = seenVolumes();
  } catch (const Failure &failure) {
    findings.push_back({Verdict::Wrong, "volumes", failure.what()});
    return;
  }
  if (volumes.empty()) {
    findings.push_back({Verdict::Remark, "volumes", "the platform sees none"});
  }
  for (const Volume &volume : volumes) {
    const Usability use = usability(volume);
    findings.push_back(
        {use.folder.empty() ? Verdict::Wrong : Verdict::Good, "volume",
         use.folder.empty() ? fmt::format("{}: {}", volume.path, use.why) : volume.path,
         use.folder.empty() ? "no service places anything there; see 'kovabackup volume list'"
                            : ""});
  }
}

#ifdef KOVA_TOOL_STANDIN
// The file that the stand-in of the platform keeps its key in.
std::string keyFile() {
  const char *named = ::secure_getenv("KOVA_PLATFORM_CONF");
  const std::string conf = named == nullptr ? "/etc/kovaplatform/platform.conf" : named;
  const std::string usual = "/var/lib/kovaplatform/secret.key";
  OptionMap secret;
  return secret.optSectionLoad(conf, "secret", -1) ? secret.optString("keyFile", usual) : usual;
}

// False when there is no key yet, or it is not to be used: then it is not tried either.
bool checkKeyFile(Findings &findings) {
  constexpr off_t kKeyBytes = 32;
  const std::string file = keyFile();
  struct stat info;
  if (::stat(file.c_str(), &info) != 0) {
    const int error = errno;
    const bool absent = error == ENOENT;
    const bool forRoot = error == EACCES && ::geteuid() != 0; // as it should be
    findings.push_back({absent || forRoot ? Verdict::Remark : Verdict::Wrong, "key file",
                        absent
                            ? fmt::format("{} is not there yet: made with the first secret", file)
                            : fmt::format("cannot look at {}: {}", file, reason(error))});
    return false;
  }
  std::string why;
  std::string hint = "bring the right one back, or remove it and set all secrets anew";
  if (!S_ISREG(info.st_mode) || info.st_size != kKeyBytes) {
    why = fmt::format("{} is no file of {} bytes", file, kKeyBytes);
  } else if (!isTrustedOwner(info.st_uid)) {
    why = fmt::format("{} belongs to user {}: neither root nor you", file, info.st_uid);
  } else if ((info.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    why = fmt::format("{} has mode {:04o}: others may use it", file, info.st_mode & kModeBits);
    hint = fmt::format("chmod 0600 {}", file);
  }
  findings.push_back({why.empty() ? Verdict::Good : Verdict::Wrong, "key file",
                      why.empty() ? file : why, why.empty() ? "" : hint});
  return why.empty();
}
#else
bool checkKeyFile(Findings &) {
  return true; // the platform's own business; whether secrets come back is what can be tried
}
#endif

void checkSecrets(Findings &findings) {
  const std::string text = "kovabackup doctor";
  OptionMap map;
  clearPlatformError();
  map.optSet("secret", text, true);
  const bool same = map.optSecret("secret", "") == text;
  findings.push_back({same ? Verdict::Good : Verdict::Wrong, "secrets",
                      same
                          ? "encrypted and decrypted"
                          : fmt::format("cannot be encrypted and decrypted: {}", platformError())});
}

// Without it every message of the library is lost.
void checkSystemLog(Findings &findings) {
  struct stat info;
  const bool there = ::stat("/dev/log", &info) == 0 && S_ISSOCK(info.st_mode);
  findings.push_back({there ? Verdict::Good : Verdict::Remark, "system log",
                      there ? "/dev/log" : "/dev/log is no socket: messages are lost"});
}

Findings examineAll(std::chrono::seconds olderThan, const std::string &age) {
  Findings findings;
  checkTmp(findings);
  checkFolder(findings, "ipc root", Path::getIpcTempPath(), 0755);
  checkFolder(findings, "session root", sessionRoot(), 0700);
  checkFolder(findings, "lock folder", Path::join(Path::getIpcTempPath(), "lock"), 0770);
  checkSessions(findings, olderThan, age);
  checkVolumes(findings);
  if (checkKeyFile(findings)) {
    checkSecrets(findings);
  }
  checkSystemLog(findings);
  return findings;
}

const char *word(Verdict verdict) {
  switch (verdict) {
  case Verdict::Good:
    return "ok";
  case Verdict::Remark:
    return "note";
  case Verdict::Wrong:
    break;
  }
  return "wrong";
}

std::string painted(const Style &style, Verdict verdict) {
  const std::string text = fmt::format("{:<5}", word(verdict));
  return verdict == Verdict::Good    ? style.good(text)
         : verdict == Verdict::Wrong ? style.bad(text)
                                     : style.faint(text);
}

Json::Value jsonFinding(const Finding &finding) {
  Json::Value entry(Json::objectValue);
  entry["verdict"] = word(finding.verdict);
  entry["check"] = finding.check;
  entry["detail"] = jsonName(finding.detail);
  entry["hint"] = finding.hint.empty() ? Json::Value() : jsonName(finding.hint);
  return entry;
}

void print(Output &out, const Finding &finding, char end) {
  const std::string detail = out.name(finding.detail);
  const std::string hint = out.name(finding.hint);
  if (out.terminal()) {
    out.write(fmt::format("{}  {:<12}  {}", painted(out.style(), finding.verdict), finding.check,
                          detail));
    out.write(hint.empty() ? "" : fmt::format("{}{:21}{}", end, "", out.style().faint(hint)));
  } else {
    out.write(fmt::format("{}\t{}\t{}", word(finding.verdict), finding.check, detail));
    out.write(hint.empty() ? "" : "\t" + hint);
  }
  out.write({&end, 1});
}

int doctor(Context &context, const DoctorOptions &options) {
  const std::string age = options.olderThan.value_or("7d");
  const std::optional<std::chrono::seconds> olderThan = parseAge(age);
  if (!olderThan) {
    throw Failure(kUsage, fmt::format("--older-than wants a number and s, m, h, d or w, as in 7d, "
                                      "not '{}'",
                                      age));
  }
  bool healthy = true;
  context.document["findings"] = Json::Value(Json::arrayValue);
  for (const Finding &finding : examineAll(*olderThan, age)) {
    healthy = healthy && finding.verdict != Verdict::Wrong;
    context.document["findings"].append(jsonFinding(finding));
    if (!context.json) {
      print(context.out, finding, options.null ? '\0' : '\n');
    }
  }
  context.document["healthy"] = healthy;
  return healthy ? kDone : kNegative;
}

} // namespace

void registerDoctor(CommandGroup &root) {
  auto options = std::make_shared<DoctorOptions>();
  root.command("doctor", "Check that everything stands as the services need it")
      .option(options->olderThan, "--older-than", "AGE",
              "sessions not loaded for so long are stale: a number and s, m, h, d or w (7d)")
      .completes(ages)
      .nullFlag(options->null, "end each row with a NUL byte")
      .note("Checked are the folders under /tmp/kovabackup with owner and mode, stale sessions, "
            "whether each volume can be written, the platform's key file, and the system log. A "
            "row is ok, note or wrong, then the check, what was found and, where there is "
            "something to do, what, with tabs between. Ends with 3 when something is wrong. The "
            "temporary directories of volumes are made when "
            "missing, as every service does; nothing else is changed.")
      .example("kovabackup doctor")
      .example("kovabackup doctor --json | jq '.findings[] | select(.verdict == \"wrong\")'")
      .action([options](Context &c) { return doctor(c, *options); });
}

} // namespace KOVA::Backup::Tool
