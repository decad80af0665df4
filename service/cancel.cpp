#include "kovabackup/service/cancel.h"

#include "base/errno_guard.h"
#include "base/retry_on_eintr.h"

#include <cstdint>
#include <poll.h>
#include <sys/eventfd.h>
#include <system_error>
#include <unistd.h>

namespace KOVA::Backup::Service {

// Non-blocking, so that request never waits: a counter at its limit says what is to be said.
Cancel::Cancel() : fd_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  if (fd_ < 0) {
    throw std::system_error(errno, std::generic_category(), "eventfd");
  }
}

Cancel::~Cancel() {
  const Base::ErrnoGuard guard;
  (void)::close(fd_); // on Linux the descriptor is gone whatever close says
}

void Cancel::request() noexcept {
  const Base::ErrnoGuard guard;
  const std::uint64_t one = 1;
  // EAGAIN means that the counter is full of requests.
  (void)Base::retryOnEintr([&] { return ::write(fd_, &one, sizeof one); });
}

// By poll, since a read would take the request away.
bool Cancel::requested() const noexcept {
  const Base::ErrnoGuard guard;
  struct pollfd readable = {fd_, POLLIN, 0};
  return Base::retryOnEintr([&] { return ::poll(&readable, 1, 0); }) == 1;
}

} // namespace KOVA::Backup::Service
