#ifndef KOVABACKUP_TESTS_CRASH_SHARED_H
#define KOVABACKUP_TESTS_CRASH_SHARED_H

/// @file What processes promise before they are killed, in memory that they share with the process
/// that checks it: neither a kill nor a power cut of the disk undoes it.

#include "tests/support/shared_memory.h"

#include <array>
#include <atomic>
#include <string>

namespace KovaTest::Crash {

/// The numbers that one process writes, one after the other. At a crash the disk must have kept, or
/// attempted if the process did not come to the end.
struct Progress {
  std::atomic<int> attempted{0}; ///< set before the operation
  std::atomic<int> kept{0};      ///< set when the library has reported success

  bool allows(int found) const { return found >= kept && found <= attempted; }
  /// What was found on the disk counts from now on.
  void settle(int found) {
    attempted = found;
    kept = found;
  }
};

/// The first thing that a process was refused, and whether the disk has failed by then.
class Refusal {
public:
  /// Once the disk has failed, whatever is refused is expected.
  void expectFromNowOn() { isExpected_ = true; }
  void reset();
  void note(const char *what);
  /// "" if nothing was refused.
  std::string text() const;

private:
  std::atomic<bool> isExpected_{false};
  std::atomic<bool> isNoted_{false};
  std::array<char, 256> text_{};
};

Refusal &refusal();

/// In a process that is to be killed: when the operation failed, notes that and waits for the end.
void require(bool succeeded, const char *what);

} // namespace KovaTest::Crash

#endif
