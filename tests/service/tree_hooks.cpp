#include "tests/service/tree_hooks.h"

#include "tests/support/interpose.h"

#include <cstdarg>
#include <cstddef>
#include <cstring>
#include <dirent.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <utility>

namespace KovaTest {

std::function<void(const std::string &call, const char *name)> beforeCall;
std::vector<std::uint64_t> resolvedWith;
bool recordsResolve = false;
bool withoutTypes = false;
bool withoutMountIds = false;

namespace {

bool mustFail(const char *call, const char *name) {
  if (beforeCall) {
    const auto hook = std::exchange(beforeCall, nullptr); // its own calls are not those of the test
    hook(call, name);
    beforeCall = hook;
  }
  return failsNow(call);
}

void removeTypes(char *records, ssize_t size) {
  for (ssize_t at = 0; at < size;) {
    decltype(dirent64::d_reclen) step = 0;
    std::memcpy(&step, records + at + offsetof(dirent64, d_reclen), sizeof step);
    records[at + static_cast<ssize_t>(offsetof(dirent64, d_type))] = DT_UNKNOWN;
    at += step;
  }
}

} // namespace
} // namespace KovaTest

using namespace KovaTest;

extern "C" {

int openat(int dir, const char *path, int flags, ...) {
  static auto *const real = realFunction<int(int, const char *, int, ...)>("openat");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  return mustFail("openat", path) ? -1 : real(dir, path, flags, mode);
}

int unlinkat(int dir, const char *path, int flags) noexcept {
  static auto *const real = realFunction<int(int, const char *, int)>("unlinkat");
  return mustFail("unlinkat", path) ? -1 : real(dir, path, flags);
}

int statx(int dir, const char *path, int flags, unsigned int mask, struct statx *out) noexcept {
  using Statx = int(int, const char *, int, unsigned int, struct statx *);
  static auto *const real = realFunction<Statx>("statx");
  const int result = mustFail("statx", path) ? -1 : real(dir, path, flags, mask, out);
  if (result == 0 && withoutMountIds) {
    out->stx_mask &= ~static_cast<unsigned>(STATX_MNT_ID);
  }
  return result;
}

ssize_t getdents64(int fd, void *buffer, size_t size) noexcept {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("getdents64");
  const ssize_t result = mustFail("getdents64", "") ? -1 : real(fd, buffer, size);
  if (withoutTypes) {
    removeTypes(static_cast<char *>(buffer), result);
  }
  return result;
}

// Six arguments are read, as libc does, though most callers pass fewer.
__attribute__((no_sanitize("address"))) long syscall(long number, ...) noexcept {
  static auto *const real = realFunction<long(long, ...)>("syscall");
  va_list args;
  va_start(args, number);
  long values[6];
  for (long &value : values) {
    value = va_arg(args, long);
  }
  va_end(args);
  if (number == SYS_openat2) {
    if (mustFail("openat2", reinterpret_cast<const char *>(values[1]))) {
      return -1;
    }
    if (recordsResolve) {
      resolvedWith.push_back(reinterpret_cast<const open_how *>(values[2])->resolve);
    }
  }
  return real(number, values[0], values[1], values[2], values[3], values[4], values[5]);
}

} // extern "C"
