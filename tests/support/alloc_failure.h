#ifndef KOVABACKUP_TESTS_ALLOC_FAILURE_H
#define KOVABACKUP_TESTS_ALLOC_FAILURE_H

/// @file Memory that runs out on demand: a test program with this file's source in it has an
/// operator new that can be told to throw.
///
///     forEachAllocation([&] { ...the operation... },
///                       [&](bool threw) { ...what must hold afterwards... });

#include <gtest/gtest.h>
#include <new>

namespace KovaTest {

/// Makes the nth operator new from now (from 1) throw std::bad_alloc, once. One at a time.
class AllocFailure {
public:
  explicit AllocFailure(int nth);
  ~AllocFailure();
  AllocFailure(const AllocFailure &) = delete;
  AllocFailure &operator=(const AllocFailure &) = delete;

  /// Whether it has thrown; from then on memory is there again.
  bool fired() const;
};

/// Runs the operation with its first allocation failing, then its second and so on, until it runs
/// without a failure; after each, with memory there again, the check, told whether the operation
/// threw std::bad_alloc.
template <typename Operation, typename Check>
void forEachAllocation(Operation operation, Check check) {
  bool fired = true;
  for (int nth = 1; fired; ++nth) {
    ASSERT_LE(nth, 10000) << "allocates without end";
    bool threw = false;
    {
      const AllocFailure failure(nth);
      try {
        operation();
      } catch (const std::bad_alloc &) {
        threw = true;
      }
      fired = failure.fired();
    }
    SCOPED_TRACE(testing::Message() << "allocation " << nth << (fired ? " fails" : " is none"));
    check(threw);
    if (nth == 1) {
      EXPECT_TRUE(fired) << "nothing is allocated: the loop proves nothing";
    }
    if (testing::Test::HasFatalFailure()) {
      return;
    }
  }
}

} // namespace KovaTest

#endif
