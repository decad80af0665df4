#ifndef KOVA_BASE_OPEN_FILE_H
#define KOVA_BASE_OPEN_FILE_H

/// @file Opening what somebody else's path names, be it a file or not.

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"

#include <fcntl.h>

namespace KOVA::Base {

/// Opens a file that is there, links followed, and close-on-exec. Does not wait for the other side
/// of a FIFO, which may never come, nor gets a terminal that then controls the process. Waits while
/// another process gives up a lease on the file, to which the kernel holds it.
/// access: O_RDONLY or O_RDWR.
/// errno:  open(2)'s when nothing is returned; never EINTR.
inline UniqueFd openFile(const char *path, int access) {
  const int flags = access | O_CLOEXEC | O_NOCTTY;
  UniqueFd fd(retryOnEintr([&] { return ::open(path, flags | O_NONBLOCK); }));
  if (!fd && errno == EWOULDBLOCK) { // only a regular file with a lease says so
    fd.reset(retryOnEintr([&] { return ::open(path, flags); }));
  }
  return fd;
}

} // namespace KOVA::Base

#endif
