#include "tools/kovabackup/facts/health.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/session_store.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"
#ifdef KOVA_TOOL_STANDIN
#include "platform/config/config.h"
#endif

#include <cerrno>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

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
    volumes = listVolumes();
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
// The file in which the platform keeps its key, as the platform itself determines it.
bool findKeyFile(Findings &findings, std::string &file) {
  KovaPlatform::Config config;
  clearPlatformError();
  if (!KovaPlatform::loadConfig(config)) {
    findings.push_back(
        {Verdict::Wrong, "key file", platformError(),
         fmt::format("fix {}: until then no secret can be used", KovaPlatform::configPath())});
    return false;
  }
  file = KovaPlatform::secretKeyPath(config);
  return true;
}

// False when there is no key yet, or it is not to be used: then it is not tried either.
bool checkKeyFile(Findings &findings) {
  constexpr off_t kKeyBytes = 32;
  std::string file;
  if (!findKeyFile(findings, file)) {
    return false;
  }
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

} // namespace

Findings checkHealth(std::chrono::seconds olderThan, const std::string &age) {
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

} // namespace KOVA::Backup::Tool
