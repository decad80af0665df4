#ifndef KOVA_BASE_OPEN_FILE_H
#define KOVA_BASE_OPEN_FILE_H

/// @file Opens a path that a caller supplied, whatever kind of file it names.

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"

#include <fcntl.h>
#include <sys/stat.h>

namespace KOVA::Base {

/// Opens an existing file, follows links and sets close-on-exec. It does not wait for the other end
/// of a FIFO, which may never be opened, and a terminal does not become the controlling terminal of
/// the process. While another process holds a lease on the file, it waits until that process has
/// released it; the kernel limits that wait.
/// access: O_RDONLY or O_RDWR.
/// errno:  that of open(2) when an empty owner is returned; never EINTR.
inline UniqueFd openFile(const char *path, int access) {
  const int flags = access | O_CLOEXEC | O_NOCTTY;
  UniqueFd fd(retryOnEintr([&] { return ::open(path, flags | O_NONBLOCK); }));
  if (!fd && errno == EWOULDBLOCK) { // reported only for a regular file with a lease
    fd.reset(retryOnEintr([&] { return ::open(path, flags); }));
  }
  return fd;
}

/// Whether an open file is a device. One such as /dev/zero has no end, so a caller that reads up to
/// the end, or up to something that may not come, must not read it.
inline bool isDevice(int fd) {
  struct stat status = {};
  return ::fstat(fd, &status) == 0 && (S_ISCHR(status.st_mode) || S_ISBLK(status.st_mode));
}

} // namespace KOVA::Base

#endif
