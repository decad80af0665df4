#include "platform/core/regular_file.h"

#include "base/open_file.h"
#include "platform/support/failure.h"

#include <climits>
#include <fcntl.h>
#include <unistd.h>

namespace KovaPlatform {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::UniqueFd;

constexpr const char *kFile = "core/regular_file.cpp";
constexpr int kMaxLinks = 40; // the kernel's own limit

// Offset of a path's last component.
std::size_t nameOffset(const std::string &path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? 0 : slash + 1;
}

// Follows the symbolic links at the end of path. On success name is the last component, in dir, or
// in the working directory when dir is empty. Links in the middle of the path are the kernel's
// work. A target is relative to the directory of its link, so each step starts at dir. O_PATH,
// because passing through a directory takes the permission to search it, not to read it.
bool followLinks(std::string path, UniqueFd &dir, std::string &name) {
  for (int links = 0; links <= kMaxLinks; ++links) {
    const std::string folder = path.substr(0, nameOffset(path));
    name = path.substr(folder.size());
    const int from = dir ? dir.get() : AT_FDCWD;
    if (!folder.empty()) {
      dir.reset(retryOnEintr(
          [&] { return ::openat(from, folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC); }));
      if (!dir) {
        return false;
      }
    }
    char target[PATH_MAX]; // no target is longer
    const ssize_t length =
        ::readlinkat(dir ? dir.get() : AT_FDCWD, name.c_str(), target, sizeof target);
    if (length < 0) {
      return errno == EINVAL; // not a link, so all links have been followed
    }
    path.assign(target, static_cast<std::size_t>(length));
  }
  errno = ELOOP;
  return false;
}

} // namespace

bool openRegular(const char *path, int access, RegularFile &file) {
  file.fd = KOVA::Base::openFile(path, access);
  if (!file.fd) {
    // EISDIR: a directory opened for writing. ENXIO: a socket, or a device without a driver.
    const bool isSpecial = errno == EISDIR || errno == ENXIO;
    const int code = errno == ENOENT ? KLIBC_ERR_NO_FILE
                     : isSpecial     ? KLIBC_ERR_NOT_REGULAR
                                     : KLIBC_ERR_OPEN;
    return fail({code, kFile}, false);
  }
  if (::fstat(file.fd.get(), &file.status) != 0) {
    return fail({KLIBC_ERR_OPEN, kFile}, false);
  }
  return S_ISREG(file.status.st_mode) || fail({KLIBC_ERR_NOT_REGULAR, kFile}, false);
}

// The kernel followed the links when it opened the file, and applied its protections of links in
// shared directories. followLinks does neither atomically nor with these protections, so its result
// counts only when it ends at the same file.
//
// A name that is missing now may be back a moment later, when another writer moves it. So ENOENT is
// not an error here: the caller opens the path again, and that decides.
Located locate(const char *path, const RegularFile &file, DirectoryEntry &entry) {
  UniqueFd dir;
  struct stat there {};
  if (!followLinks(path, dir, entry.name)) {
    const bool gone = errno == ENOENT;
    return gone ? Located::Elsewhere : fail({KLIBC_ERR_OPEN, kFile}, Located::Failed);
  }
  // Opened for reading, because an O_PATH descriptor cannot be synced.
  entry.dir.reset(retryOnEintr([&] {
    return ::openat(dir ? dir.get() : AT_FDCWD, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  }));
  if (!entry.dir) {
    return fail({KLIBC_ERR_OPEN, kFile}, Located::Failed);
  }
  if (::fstatat(entry.dir.get(), entry.name.c_str(), &there, AT_SYMLINK_NOFOLLOW) != 0) {
    const bool gone = errno == ENOENT;
    return gone ? Located::Elsewhere : fail({KLIBC_ERR_OPEN, kFile}, Located::Failed);
  }
  const bool same = there.st_dev == file.status.st_dev && there.st_ino == file.status.st_ino;
  return same ? Located::Yes : Located::Elsewhere;
}

} // namespace KovaPlatform
