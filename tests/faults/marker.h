#ifndef KOVABACKUP_TESTS_FAULTS_MARKER_H
#define KOVABACKUP_TESTS_FAULTS_MARKER_H

/// @file Where failures begin and end in a traced process. Both are system calls that have no
/// effect, and that the tracer recognises by their argument.

#include <sys/prctl.h>

namespace KovaTest::Faults {

constexpr unsigned long kBeginMarker = 0x6b6f7601;
constexpr unsigned long kEndMarker = 0x6b6f7602;

inline void markBegin() {
  (void)::prctl(static_cast<int>(kBeginMarker), 0, 0, 0, 0);
}

inline void markEnd() {
  (void)::prctl(static_cast<int>(kEndMarker), 0, 0, 0, 0);
}

} // namespace KovaTest::Faults

#endif
