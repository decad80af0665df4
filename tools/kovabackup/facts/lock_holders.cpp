#include "tools/kovabackup/facts/lock_holders.h"

#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/directory.h"
#include "tools/kovabackup/facts/processes.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fmt/format.h>
#include <fstream>
#include <sstream>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace KOVA::Backup::Tool {
namespace {

// One line of /proc/locks about an flock lock on the inode number that is looked for.
struct Entry {
  LockUser user;
  std::string device; // as major:minor in hexadecimal
};

// A line reads "1: FLOCK  ADVISORY  WRITE 4711 00:2e:77 0 EOF". A process that waits has "->" after
// the number. Inode numbers are only unique per device, so the caller compares the device as well.
bool parseEntry(const std::string &line, ino_t inode, Entry &entry) {
  std::istringstream words(line);
  std::string number;
  std::string kind;
  std::string advisory;
  std::string mode;
  std::string file;
  words >> number >> kind;
  entry.user.waits = kind == "->";
  if (entry.user.waits) {
    words >> kind;
  }
  words >> advisory >> mode >> entry.user.pid >> file;
  const std::size_t colon = file.rfind(':');
  if (!words || kind != "FLOCK" || colon == std::string::npos ||
      file.substr(colon + 1) != std::to_string(inode)) {
    return false;
  }
  entry.device = file.substr(0, colon);
  return true;
}

// On overlays and subvolumes stat reports another device number than /proc/locks does. In that case
// the process counts only when it has this very file open.
bool hasOpen(pid_t pid, const struct stat &file) {
  const std::string folder = fmt::format("/proc/{}/fd", pid);
  const Directory dir = openDirectory(folder);
  if (!dir) {
    return false;
  }
  while (const dirent *entry = ::readdir(dir.get())) {
    struct stat open;
    if (::stat((folder + "/" + entry->d_name).c_str(), &open) == 0 && open.st_dev == file.st_dev &&
        open.st_ino == file.st_ino) {
      return true;
    }
  }
  return false;
}

// Tokens come from the command line and become part of a path, so none may contain "." or "..". A
// slash is allowed, as it is for the services.
bool leadsOut(const std::string &token) {
  std::istringstream parts(token);
  std::string part;
  bool named = false;
  while (std::getline(parts, part, '/')) {
    if (part == "." || part == "..") {
      return true;
    }
    named = named || !part.empty();
  }
  return !named || token.back() == '/';
}

} // namespace

std::string lockFileOf(const std::string &token) {
  if (token.find('\0') != std::string::npos || leadsOut(token)) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid lock token", token));
  }
  return Path::join(Path::join(Path::getIpcTempPath(), "lock"), token);
}

bool findLockUsers(const std::string &file, std::vector<LockUser> &users) {
  struct stat info;
  if (::stat(file.c_str(), &info) != 0) {
    if (errno == ENOENT || errno == ENOTDIR) {
      return false;
    }
    throw Failure(kFailed, fmt::format("cannot access {}: {}", file, reason(errno)));
  }
  std::ifstream locks("/proc/locks");
  if (!locks) {
    throw Failure(kFailed, "cannot read /proc/locks");
  }
  const std::string device =
      fmt::format("{:02x}:{:02x}", ::major(info.st_dev), ::minor(info.st_dev));
  std::string line;
  while (std::getline(locks, line)) {
    // The device is compared first because it needs no access to the process: an ordinary user
    // cannot look into /proc/PID/fd of another one.
    Entry entry;
    if (parseEntry(line, info.st_ino, entry) &&
        (entry.device == device || hasOpen(entry.user.pid, info))) {
      entry.user.command = commandOf(entry.user.pid);
      users.push_back(entry.user);
    }
  }
  return true;
}

} // namespace KOVA::Backup::Tool
