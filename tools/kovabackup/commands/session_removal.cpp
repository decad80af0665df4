#include "tools/kovabackup/commands/session_removal.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tools/kovabackup/frame/cli.h"

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

bool onSameDevice(const std::string &a, const std::string &b) {
  struct stat infoA;
  struct stat infoB;
  return ::lstat(a.c_str(), &infoA) == 0 && ::lstat(b.c_str(), &infoB) == 0 &&
         infoA.st_dev == infoB.st_dev;
}

} // namespace

// Removal follows paths below these directories. A user who can write to one of them could replace
// a session by a link to anything that root is able to remove.
void requireTrustedRoot() {
  for (const std::string &folder : {Path::getIpcTempPath(), sessionRoot()}) {
    struct stat info;
    if (::lstat(folder.c_str(), &info) != 0) {
      return; // it does not exist, so nothing will be removed
    }
    const bool ours = info.st_uid == 0 || info.st_uid == ::geteuid();
    if (!S_ISDIR(info.st_mode) || !ours || (info.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
      throw Failure(kFailed, fmt::format("{} cannot be trusted: it must be a directory that only "
                                         "root or you own and write; see 'kovabackup doctor'",
                                         folder));
    }
  }
}

void removeSession(const SessionEntry &entry) {
  if (!Session::destroyById(entry.id)) {
    throw Failure(kFailed, fmt::format("session {} could not be removed completely from {}; the "
                                       "system log names the first file that remains",
                                       entry.id, entry.path));
  }
}

// removeAll stays on the file system on which it starts. Started at a part that is a mount point,
// it would empty the file system mounted there; started at the session, it does not enter it. Such
// parts are therefore left to the last step, which fails and says so.
void removeSession(const SessionEntry &entry, const std::vector<TreePart> &parts,
                   const std::function<void(std::uint64_t)> &removed) {
  for (const TreePart &part : parts) {
    const std::string path = Path::join(entry.path, part.name);
    if (onSameDevice(path, entry.path) && !removeAll(path)) {
      break; // one failure is enough in the system log; the last step tries the rest at once
    }
    removed(part.bytes);
  }
  removeSession(entry);
}

} // namespace KOVA::Backup::Tool
