#ifndef KOVABACKUP_TESTS_ALLOC_FAILURE_H
#define KOVABACKUP_TESTS_ALLOC_FAILURE_H

/// @file Memory that runs out on demand: a test program with this file's source in it has an
/// operator new that can be told to throw.
///
///     forEachAllocation([&] {
///       try {
///         ...the operation...
///       } catch (const std::bad_alloc &) {
///         ...what must hold now...
///       }
///     });

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
/// without a failure. The operation catches what it throws.
template <typename Operation>
void forEachAllocation(Operation operation) {
  bool fired = true;
  for (int nth = 1; fired; ++nth) {
    ASSERT_LE(nth, 10000) << "allocates without end";
    SCOPED_TRACE(testing::Message() << "allocation " << nth << " fails");
    const AllocFailure failure(nth);
    operation();
    fired = failure.fired();
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
