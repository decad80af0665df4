// The libc functions on files that a test may make fail. Weak, so that a test which needs another
// behaviour defines its own.

#include "tests/support/interpose.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <ftw.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utime.h>

using KovaTest::failsNow;
using KovaTest::modeArgument;
using KovaTest::realFunction;

extern "C" {

__attribute__((weak)) int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  return failsNow("open") ? -1 : real(path, flags, mode);
}

__attribute__((weak)) int openat(int dir, const char *path, int flags, ...) {
  static auto *const real = realFunction<int(int, const char *, int, ...)>("openat");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  // Unnamed files are a feature that a test can make fail separately.
  if ((flags & O_TMPFILE) == O_TMPFILE && failsNow("O_TMPFILE")) {
    return -1;
  }
  return failsNow("openat") ? -1 : real(dir, path, flags, mode);
}

KOVA_INTERPOSE_NOTHROW(int, mkdir, -1, (const char *path, mode_t mode), (path, mode))
KOVA_INTERPOSE_NOTHROW(int, mkdirat, -1, (int dir, const char *path, mode_t mode),
                       (dir, path, mode))
KOVA_INTERPOSE_NOTHROW(int, chmod, -1, (const char *path, mode_t mode), (path, mode))
KOVA_INTERPOSE_NOTHROW(int, fchmod, -1, (int fd, mode_t mode), (fd, mode))
KOVA_INTERPOSE_NOTHROW(int, fchown, -1, (int fd, uid_t uid, gid_t gid), (fd, uid, gid))
KOVA_INTERPOSE_NOTHROW(int, rename, -1, (const char *from, const char *to), (from, to))
KOVA_INTERPOSE_NOTHROW(int, renameat, -1,
                       (int fromDir, const char *from, int toDir, const char *to),
                       (fromDir, from, toDir, to))
KOVA_INTERPOSE_NOTHROW(int, linkat, -1,
                       (int fromDir, const char *from, int toDir, const char *to, int flags),
                       (fromDir, from, toDir, to, flags))
KOVA_INTERPOSE_NOTHROW(int, unlink, -1, (const char *path), (path))
KOVA_INTERPOSE_NOTHROW(int, unlinkat, -1, (int dir, const char *path, int flags),
                       (dir, path, flags))
KOVA_INTERPOSE_NOTHROW(int, rmdir, -1, (const char *path), (path))
KOVA_INTERPOSE_NOTHROW(int, symlink, -1, (const char *target, const char *path), (target, path))
KOVA_INTERPOSE_NOTHROW(ssize_t, readlink, -1, (const char *path, char *buf, size_t size),
                       (path, buf, size))
KOVA_INTERPOSE_NOTHROW(int, lstat, -1, (const char *path, struct stat *out), (path, out))
KOVA_INTERPOSE_NOTHROW(int, fstat, -1, (int fd, struct stat *out), (fd, out))
KOVA_INTERPOSE_NOTHROW(int, access, -1, (const char *path, int mode), (path, mode))
KOVA_INTERPOSE_NOTHROW(int, utime, -1, (const char *path, const struct utimbuf *times),
                       (path, times))
KOVA_INTERPOSE_NOTHROW(char *, getcwd, nullptr, (char *buf, size_t size), (buf, size))
KOVA_INTERPOSE_NOTHROW(char *, mkdtemp, nullptr, (char *path), (path))
KOVA_INTERPOSE_NOTHROW(int, flock, -1, (int fd, int operation), (fd, operation))
KOVA_INTERPOSE_NOTHROW(char *, strdup, nullptr, (const char *text), (text))
KOVA_INTERPOSE(int, mkstemp, -1, (char *path), (path))
KOVA_INTERPOSE(int, fsync, -1, (int fd), (fd))
}
