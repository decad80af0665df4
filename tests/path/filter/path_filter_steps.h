#ifndef KOVABACKUP_TESTS_PATH_FILTER_STEPS_H
#define KOVABACKUP_TESTS_PATH_FILTER_STEPS_H

/// @file Counts the work of the path filter without a clock: the basic blocks that its code enters.
///
/// The program compiles the sources of the filter itself, with -fsanitize-coverage=trace-pc, so the
/// compiler calls __sanitizer_cov_trace_pc in each basic block. The linker replaces it, since
/// libFuzzer has one of its own. Functions of the C and C++ libraries count only as far as they are
/// inline.

#include <cstdint>

namespace KovaTest {

inline std::uint64_t steps = 0;

/// Returns: how many basic blocks action enters.
template <typename Action>
std::uint64_t stepsOf(Action action) {
  const std::uint64_t before = steps;
  action();
  return steps - before;
}

} // namespace KovaTest

#endif
