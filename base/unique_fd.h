#ifndef KOVA_BASE_UNIQUE_FD_H
#define KOVA_BASE_UNIQUE_FD_H

/// @file The owner of one file descriptor.
///
///     UniqueFd fd(::open(path, O_RDONLY | O_CLOEXEC));
///     if (!fd) return false;          // errno is open's
///
/// Ownership: destruction and reset close the descriptor; release passes it to the caller.
/// errno:     unchanged by closing, so an owner may go out of scope on a failure path.

#include "base/errno_guard.h"

#include <unistd.h>
#include <utility>

namespace KOVA::Base {

class UniqueFd {
public:
  UniqueFd() noexcept = default;
  explicit UniqueFd(int fd) noexcept : fd_(fd) {}
  UniqueFd(UniqueFd &&other) noexcept : fd_(other.release()) {}
  UniqueFd &operator=(UniqueFd &&other) noexcept {
    reset(other.release());
    return *this;
  }
  UniqueFd(const UniqueFd &) = delete;
  UniqueFd &operator=(const UniqueFd &) = delete;
  ~UniqueFd() { reset(); }

  int get() const noexcept { return fd_; }
  explicit operator bool() const noexcept { return fd_ >= 0; }

  int release() noexcept { return std::exchange(fd_, -1); }

  void reset(int fd = -1) noexcept {
    const int old = std::exchange(fd_, fd);
    if (old >= 0) {
      const ErrnoGuard guard;
      (void)::close(old); // Linux frees the descriptor whatever close reports: never retried
    }
  }

private:
  int fd_ = -1;
};

} // namespace KOVA::Base

#endif
