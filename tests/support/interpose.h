#ifndef KOVABACKUP_TESTS_INTERPOSE_H
#define KOVABACKUP_TESTS_INTERPOSE_H

/// @file How a libc function is defined in its place, for the files that list such functions.

#include "tests/support/fault.h"

// Passes a call on unless it is to fail. One line a function keeps the list complete and readable.
#define KOVA_INTERPOSE(result, name, failed, parameters, arguments)                                \
  __attribute__((weak)) result name parameters {                                                   \
    static auto *const real = KovaTest::realFunction<result parameters>(#name);                    \
    return KovaTest::failsNow(#name) ? (failed) : real arguments;                                  \
  }

// libc declares some of these as throwing nothing; the definitions must agree.
#define KOVA_INTERPOSE_NOTHROW(result, name, failed, parameters, arguments)                        \
  __attribute__((weak)) result name parameters noexcept {                                          \
    static auto *const real = KovaTest::realFunction<result parameters>(#name);                    \
    return KovaTest::failsNow(#name) ? (failed) : real arguments;                                  \
  }

#endif
