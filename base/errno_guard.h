#ifndef KOVA_BASE_ERRNO_GUARD_H
#define KOVA_BASE_ERRNO_GUARD_H

/// @file Restores errno to the value that it had when the guard was made.

#include <cerrno>

namespace KOVA::Base {

class ErrnoGuard {
public:
  ErrnoGuard() noexcept : saved_(errno) {}
  ~ErrnoGuard() { restore(); }
  ErrnoGuard(const ErrnoGuard &) = delete;
  ErrnoGuard &operator=(const ErrnoGuard &) = delete;

  /// Restores errno now. The destructor restores it again.
  void restore() const noexcept { errno = saved_; }

private:
  int saved_;
};

} // namespace KOVA::Base

#endif
