// The libc functions that Command calls, for tests that make them fail, as those of
// tests/support.

#include "tests/support/interpose.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <fcntl.h>
#include <poll.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

using KovaTest::failsNow;
using KovaTest::realFunction;

namespace {

// By what name a test makes a call of syscall(2) fail.
const char *nameOf(long number) {
  switch (number) {
  case SYS_close_range:
    return "close_range";
  case SYS_getdents64:
    return "getdents64";
  case SYS_pidfd_open:
    return "pidfd_open";
  case SYS_pidfd_send_signal:
    return "pidfd_send_signal";
  case SYS_waitid:
    return "waitid with usage";
  default:
    return "syscall";
  }
}

} // namespace

extern "C" {

KOVA_INTERPOSE_NOTHROW(int, pipe2, -1, (int *ends, int flags), (ends, flags))
KOVA_INTERPOSE_NOTHROW(int, memfd_create, -1, (const char *name, unsigned int flags), (name, flags))
KOVA_INTERPOSE_NOTHROW(off_t, lseek, -1, (int fd, off_t offset, int whence), (fd, offset, whence))
KOVA_INTERPOSE_NOTHROW(int, setpgid, -1, (pid_t pid, pid_t group), (pid, group))
KOVA_INTERPOSE_NOTHROW(pid_t, getppid, -1, (), ())
KOVA_INTERPOSE_NOTHROW(int, execve, -1, (const char *path, char *const argv[], char *const envp[]),
                       (path, argv, envp))
KOVA_INTERPOSE(int, poll, -1, (struct pollfd * fds, nfds_t count, int limit), (fds, count, limit))
KOVA_INTERPOSE(int, ppoll, -1,
               (struct pollfd * fds, nfds_t count, const struct timespec *limit,
                const sigset_t *mask),
               (fds, count, limit, mask))
KOVA_INTERPOSE(int, waitid, -1, (idtype_t type, id_t id, siginfo_t *info, int options),
               (type, id, info, options))

// Reports its failure by its result.
__attribute__((weak)) int pthread_sigmask(int how, const sigset_t *set, sigset_t *old) noexcept {
  static auto *const real = realFunction<int(int, const sigset_t *, sigset_t *)>("pthread_sigmask");
  return failsNow("pthread_sigmask") ? errno : real(how, set, old);
}

ssize_t write(int fd, const void *data, size_t size) {
  static auto *const real = realFunction<ssize_t(int, const void *, size_t)>("write");
  if (failsNow("write")) {
    return -1;
  }
  return real(fd, data, size > 1 && failsNow("write in parts") ? size / 2 : size);
}

ssize_t read(int fd, void *data, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  if (failsNow("read")) {
    return -1;
  }
  return real(fd, data, size > 1000 && failsNow("read in parts") ? 7 : size);
}

__attribute__((weak)) int fcntl(int fd, int command, ...) {
  static auto *const real = realFunction<int(int, int, ...)>("fcntl");
  va_list args;
  va_start(args, command);
  void *const argument = va_arg(args, void *);
  va_end(args);
  return failsNow("fcntl") ? -1 : real(fd, command, argument);
}

__attribute__((weak)) int ioctl(int fd, unsigned long request, ...) noexcept {
  static auto *const real = realFunction<int(int, unsigned long, ...)>("ioctl");
  va_list args;
  va_start(args, request);
  void *const argument = va_arg(args, void *);
  va_end(args);
  return failsNow("ioctl") ? -1 : real(fd, request, argument);
}

__attribute__((weak)) int prctl(int option, ...) noexcept {
  static auto *const real = realFunction<int(int, ...)>("prctl");
  va_list args;
  va_start(args, option);
  const unsigned long argument = va_arg(args, unsigned long);
  va_end(args);
  return failsNow("prctl") ? -1 : real(option, argument, 0UL, 0UL, 0UL);
}

__attribute__((weak)) long syscall(long number, ...) noexcept {
  static auto *const real = realFunction<long(long, ...)>("syscall");
  va_list args;
  va_start(args, number);
  long values[6];
  for (long &value : values) {
    value = va_arg(args, long);
  }
  va_end(args);
  return failsNow(nameOf(number))
             ? -1
             : real(number, values[0], values[1], values[2], values[3], values[4], values[5]);
}

// A sanitizer has its own; its programs create children by fork(2).
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)

KOVA_INTERPOSE_NOTHROW(void *, mmap, MAP_FAILED,
                       (void *at, size_t size, int access, int flags, int fd, off_t offset),
                       (at, size, access, flags, fd, offset))
KOVA_INTERPOSE_NOTHROW(int, mprotect, -1, (void *at, size_t size, int access), (at, size, access))

__attribute__((weak)) int clone(int (*function)(void *), void *stack, int flags, void *argument,
                                ...) noexcept {
  using Clone = int(int (*)(void *), void *, int, void *, ...);
  static auto *const real = realFunction<Clone>("clone");
  va_list args;
  va_start(args, argument);
  void *const pidfd = va_arg(args, void *);
  va_end(args);
  return failsNow("clone") ? -1 : real(function, stack, flags, argument, pidfd);
}

#endif
}
