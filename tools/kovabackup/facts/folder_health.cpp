#include "tools/kovabackup/facts/folder_health.h"

#include "base/unique_fd.h"
#include "tools/kovabackup/facts/space.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr mode_t kTmpMode = 01777;

// Why root could not write there either; "" when it could. Whether an ordinary user may write is
// not the question: the services run as root.
std::string whyReadOnly(const std::string &folder) {
  return ::access(folder.c_str(), W_OK) != 0 && errno == EROFS ? reason(EROFS) : "";
}

Finding absentFolder(const std::string &check, const std::string &folder) {
  const std::string why = whyReadOnly("/tmp");
  if (!why.empty()) {
    return {Verdict::Wrong, check,
            fmt::format("{} does not exist and cannot be created: {}", folder, why),
            "mount /tmp for writing"};
  }
  return {Verdict::Good, check,
          fmt::format("{} does not exist yet; it is created on first use", folder)};
}

Finding otherOwner(const std::string &check, const std::string &folder, uid_t owner) {
  return {Verdict::Wrong, check,
          fmt::format("{} belongs to user {}, who is neither root nor you", folder, owner),
          "that user may have placed what is in it: as root remove it with its contents; it is "
          "created on first use"};
}

Finding existingFolder(const std::string &check, const std::string &folder, mode_t mode,
                       const struct stat &info) {
  if (!S_ISDIR(info.st_mode)) {
    return {Verdict::Wrong, check, fmt::format("{} is not a directory", folder),
            "remove it; it is created on first use"};
  }
  if (!isTrustedOwner(info.st_uid)) {
    return otherOwner(check, folder, info.st_uid);
  }
  const std::string why = whyReadOnly(folder);
  if (!why.empty()) {
    return {Verdict::Wrong, check, fmt::format("{} cannot be written: {}", folder, why),
            "mount /tmp for writing"};
  }
  if ((info.st_mode & kModeBits) != mode) {
    return {
        Verdict::Wrong, check,
        fmt::format("{} has mode {:04o} instead of {:04o}", folder, info.st_mode & kModeBits, mode),
        fmt::format("chmod {:04o} {}", mode, folder), modeFix(folder, mode)};
  }
  return {Verdict::Good, check, folder};
}

// Opened without following a link, so that what is changed is what was checked.
std::string changeMode(const std::string &path, mode_t mode) {
  const Base::UniqueFd fd(
      ::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat info = {};
  if (!fd || ::fstat(fd.get(), &info) != 0) {
    return reason(errno);
  }
  if (!isTrustedOwner(info.st_uid) || (!S_ISDIR(info.st_mode) && !S_ISREG(info.st_mode))) {
    return "it was replaced";
  }
  return ::fchmod(fd.get(), mode) == 0 ? "" : reason(errno);
}

} // namespace

bool isTrustedOwner(uid_t owner) {
  return owner == 0 || owner == ::geteuid();
}

Fix modeFix(const std::string &path, mode_t mode) {
  return [path, mode] { return changeMode(path, mode); };
}

bool checkSpace(Findings &findings, const std::string &check, const std::string &folder,
                int minFreePercent) {
  const std::optional<Space> space = spaceOf(folder);
  if (!space || !space->isBelow(minFreePercent)) {
    return true;
  }
  findings.push_back({space->isFull() ? Verdict::Wrong : Verdict::Remark, check,
                      fmt::format("{}: {}", folder, describe(*space)),
                      "make room; 'kovabackup session prune --older-than 7d --dry-run' shows what "
                      "old sessions hold"});
  return false;
}

// Without the sticky bit any user may remove /tmp/kovabackup and create it with contents of their
// own. Without the other bits only some users can create files there.
void checkTmp(Findings &findings, int minFreePercent) {
  struct stat info;
  if (::stat("/tmp", &info) != 0 || !S_ISDIR(info.st_mode)) {
    findings.push_back(
        {Verdict::Wrong, "tmp", "/tmp is not a directory", "create it: mkdir -m 1777 /tmp"});
  } else if ((info.st_mode & (S_IWGRP | S_IWOTH)) != 0 && (info.st_mode & S_ISVTX) == 0) {
    findings.push_back({Verdict::Wrong, "tmp",
                        fmt::format("/tmp has mode {:04o}: any user may replace what is in it",
                                    info.st_mode & kModeBits),
                        "chmod 1777 /tmp", modeFix("/tmp", (info.st_mode & kModeBits) | kTmpMode)});
  } else if ((info.st_mode & kTmpMode) != kTmpMode) {
    findings.push_back(
        {Verdict::Wrong, "tmp",
         fmt::format("/tmp has mode {:04o} instead of {:04o}", info.st_mode & kModeBits, kTmpMode),
         "chmod 1777 /tmp", modeFix("/tmp", (info.st_mode & kModeBits) | kTmpMode)});
  } else if (const std::string why = whyReadOnly("/tmp"); !why.empty()) {
    findings.push_back({Verdict::Wrong, "tmp", "/tmp cannot be written: " + why,
                        "mount /tmp for writing: until then there are no sessions and no locks"});
  } else if (checkSpace(findings, "tmp", "/tmp", minFreePercent)) {
    findings.push_back({Verdict::Good, "tmp", "/tmp"});
  }
}

// lstat, because a link in its place would lead the services to a directory of another user's
// choice.
void checkFolder(Findings &findings, const std::string &check, const std::string &folder,
                 mode_t mode) {
  struct stat info;
  if (::lstat(folder.c_str(), &info) == 0) {
    findings.push_back(existingFolder(check, folder, mode, info));
  } else if (errno == ENOENT) {
    findings.push_back(absentFolder(check, folder));
  } else {
    const bool forRoot = errno == EACCES; // else root would not get there either
    findings.push_back({forRoot ? Verdict::Remark : Verdict::Wrong, check,
                        fmt::format("cannot access {}: {}", folder, reasonAlone(errno)),
                        forRoot ? "run this command as root"
                                : "remove what is in the place of a directory above it"});
  }
}

} // namespace KOVA::Backup::Tool
