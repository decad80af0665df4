#ifndef KOVABACKUP_TESTS_FAULTS_CALLS_H
#define KOVABACKUP_TESTS_FAULTS_CALLS_H

/// @file The system calls that are made to fail, and how each of them can fail in practice.

#include <array>
#include <cstdint>
#include <vector>

namespace KovaTest::Faults {

using Arguments = std::array<std::uint64_t, 6>;

struct Call {
  const char *name;
  std::vector<int> errors; ///< errno values, the most common one first
  bool partial = false;    ///< may transfer fewer bytes; the third argument is their number
  bool interrupts = false; ///< a signal may end it with EINTR
};

/// Returns: nullptr for a call that is never made to fail, such as one whose failure the kernel
/// rules out for these arguments.
const Call *findCall(long number, const Arguments &arguments);

/// The number under which a failed allocation is known; its name is "memory".
constexpr long kMemory = 100000;

/// "" for an unknown one.
const char *callName(long number);

} // namespace KovaTest::Faults

#endif
