#ifndef KOVABACKUP_TESTS_ALLOC_FAILURE_H
#define KOVABACKUP_TESTS_ALLOC_FAILURE_H

/// @file Memory that runs out on demand. A test program that links kova_test_heap has an operator
/// new, one that links kova_test_calloc a calloc, which a Fault or a ChildFault (fault.h) can make
/// fail under the names "operator new" and "calloc". One that links kova_test_realloc has a
/// realloc, which a Fault can make fail, and one that links kova_test_malloc a malloc that a
/// MallocFailure can make fail.
///
///     forEachAllocation([&] { ...the operation... },
///                       [&](bool threw) { ...what must hold afterwards... });
///     forEachMalloc(...);           // the same, with the memory of C libraries, too

#include "tests/support/counting_loop.h"

#include <cstddef>
#include <new>

namespace KovaTest {

/// Makes the nth operator new from now (from 1) throw std::bad_alloc; if lasting, all after it,
/// too. Defined in kova_test_heap, so that a program whose operator new cannot fail does not link.
class AllocFailure {
public:
  explicit AllocFailure(int nth, bool lasting = false);

  /// Allocations seen since, the failed one included.
  int calls() const { return fault_.calls(); }
  bool fired() const { return fault_.fired(); }

private:
  const Fault fault_;
};

/// Makes the nth malloc from now (from 1) return null; if lasting, all after it, too. The operator
/// new of kova_test_heap calls malloc, so link both. Defined in kova_test_malloc.
class MallocFailure {
public:
  explicit MallocFailure(int nth, bool lasting = false);
  ~MallocFailure();
  MallocFailure(const MallocFailure &) = delete;
  MallocFailure &operator=(const MallocFailure &) = delete;

  bool fired() const { return fault_.fired(); }

private:
  const Fault fault_;
};

/// The bytes that the last calloc asked for, in programs that link kova_test_calloc; 0 when there
/// was none since the last call of this function.
std::size_t takeCallocSize();

/// The most bytes that one realloc asked for, in programs that link kova_test_realloc; 0 when there
/// was none since the last call of this function.
std::size_t takeReallocSize();

/// Runs the operation with each call of one allocating function failing in turn (counting_loop.h),
/// which an object of the class Failure brings about; after each run, with memory available again,
/// calls check with whether the operation threw std::bad_alloc.
template <typename Failure, typename Operation, typename Check>
void forEachFailedCall(const char *function, Failing failing, Operation operation, Check check) {
  countFailures(function, failing, [&](int nth, bool lasting) {
    bool threw = false;
    bool fired = false;
    {
      const Failure failure(nth, lasting);
      try {
        operation();
      } catch (const std::bad_alloc &) {
        threw = true;
      }
      fired = failure.fired();
    }
    check(threw);
    return fired;
  });
}

template <typename Operation, typename Check>
void forEachAllocation(Operation operation, Check check) {
  forEachFailedCall<AllocFailure>("operator new", Failing::Once, operation, check);
}

template <typename Operation, typename Check>
void forEachMalloc(Operation operation, Check check, Failing failing = Failing::Once) {
  forEachFailedCall<MallocFailure>("malloc", failing, operation, check);
}

} // namespace KovaTest

#endif
