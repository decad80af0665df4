#ifndef KOVABACKUP_TESTS_FAULTS_ATTEMPT_H
#define KOVABACKUP_TESTS_FAULTS_ATTEMPT_H

/// @file Several operations in one scenario, each of which may run out of memory by itself.

#include "tests/faults/report.h"
#include "tests/faults/scenario.h"

#include <new>
#include <string_view>

namespace KovaTest::Faults {

/// What is said of an operation that threw std::bad_alloc.
constexpr std::string_view kBadAlloc = "bad_alloc";

/// Calls an operation and says what it returned, a text, a truth value or an int.
template <typename Operation>
void attempt(const char *name, const Operation &operation) {
  try {
    const auto result = operation();
    say(name, result);
  } catch (const std::bad_alloc &) {
    say(name, kBadAlloc);
  }
}

/// A check that every operation has returned what it returns when nothing fails, or has run out of
/// memory.
void checkAttempts(const Seen &seen, Findings &findings);

/// The same for one of them.
void checkAttempt(const Seen &seen, Findings &findings, const std::string &name);

} // namespace KovaTest::Faults

#endif
