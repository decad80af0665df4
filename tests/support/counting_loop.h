#ifndef KOVABACKUP_TESTS_COUNTING_LOOP_H
#define KOVABACKUP_TESTS_COUNTING_LOOP_H

/// @file The counting loop: the first call of a function fails, then the second and so on, until
/// the operation runs without a failure. So every failing exit is taken once.
///
///     forEachFailure("open", EIO, [&](Fault &fault) {
///       ... run the operation; when fault.fired(), check result, log and leftovers ...
///     });
///     forEachChildFailure("dup2", EBUSY, [&](int nth, const ChildFault &fault) { ... });
///     forEachAllocation([&] { ...the operation... },       // tests/support/alloc_failure.h
///                       [&](bool threw) { ...what must hold afterwards... });
///
/// A test that needs another order, such as a check after the failure has ended, calls
/// countFailures itself.

#include "tests/support/fault.h"

#include <gtest/gtest.h>
#include <string>

namespace KovaTest {

/// How the failures of a loop last.
enum class Failing {
  /// A round with one failing call, then a round in which all calls after it fail, too: an error
  /// that passes and one that stays.
  OnceAndLasting,
  /// Only the one call. For memory: an operation that has thrown releases what it holds, and the
  /// checks of the test allocate themselves.
  Once
};

/// Calls step(nth, lasting) with nth 1, 2, 3 and so on until it returns false. step makes the nth
/// call of a function fail and returns whether that has happened.
///
/// Fails the test when the first step injects nothing, since the loop then proves nothing, and when
/// the steps do not end. Ends early on a fatal failure. what names the function in messages.
template <typename Step>
void countFailures(const std::string &what, Failing failing, Step step) {
  constexpr int kMostCalls = 10000;
  for (const bool lasting : {false, true}) {
    if (lasting && failing == Failing::Once) {
      return;
    }
    bool fired = true;
    for (int nth = 1; fired; ++nth) {
      ASSERT_LE(nth, kMostCalls) << what << " is called without end";
      SCOPED_TRACE(testing::Message()
                   << what << " fails at call " << nth << (lasting ? " and after" : ""));
      fired = step(nth, lasting);
      EXPECT_TRUE(fired || nth > 1) << what << " is not called at all: the loop proves nothing";
      if (testing::Test::HasFatalFailure()) {
        return;
      }
    }
  }
}

/// Calls operation(fault) with each call of the function failing in turn.
template <typename Operation>
void forEachFailure(const char *function, int error, Operation operation) {
  countFailures(function, Failing::OnceAndLasting, [&](int nth, bool lasting) {
    Fault fault(function, nth, error, lasting);
    operation(fault);
    return fault.fired();
  });
}

/// The same for the calls of forked children: operation(nth, fault) starts the child.
template <typename Operation>
void forEachChildFailure(const char *function, int error, Operation operation) {
  countFailures(std::string("the child's ") + function, Failing::OnceAndLasting,
                [&](int nth, bool lasting) {
                  const ChildFault fault(function, nth, error, lasting);
                  operation(nth, fault);
                  return fault.fired();
                });
}

} // namespace KovaTest

#endif
