#ifndef KOVABACKUP_TESTS_INTERPOSE_H
#define KOVABACKUP_TESTS_INTERPOSE_H

/// @file Defines interposed libc functions, for the files that list them.

#include "tests/support/fault.h"

#include <cstdarg>
#include <fcntl.h>
#include <sys/types.h>

namespace KovaTest {

/// The last argument of open or openat; 0 where the flags do not call for one.
inline mode_t modeArgument(int flags, va_list args) {
  const bool creates = (flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE;
  return creates ? static_cast<mode_t>(va_arg(args, unsigned)) : 0;
}

} // namespace KovaTest

// Passes a call on unless it must fail. A macro, so that each function takes one line of a list.
#define KOVA_INTERPOSE(result, name, failed, parameters, arguments)                                \
  __attribute__((weak)) result name parameters {                                                   \
    static auto *const real = KovaTest::realFunction<result parameters>(#name);                    \
    return KovaTest::failsNow(#name) ? (failed) : real arguments;                                  \
  }

// libc declares some of these noexcept, and the definitions must agree.
#define KOVA_INTERPOSE_NOTHROW(result, name, failed, parameters, arguments)                        \
  __attribute__((weak)) result name parameters noexcept {                                          \
    static auto *const real = KovaTest::realFunction<result parameters>(#name);                    \
    return KovaTest::failsNow(#name) ? (failed) : real arguments;                                  \
  }

#endif
