#ifndef KOVABACKUP_TESTS_SUPPORT_PID_NAMESPACE_H
#define KOVABACKUP_TESTS_SUPPORT_PID_NAMESPACE_H

/// @file What a container hides.

#include <sys/stat.h>

namespace KovaTest {

/// Whether /proc/locks leaves out a lock whose taker has ended. The kernel lists it in the initial
/// PID namespace only, because an ended process has no PID in another one.
inline bool hidesLocksOfEndedTakers() {
  constexpr ino_t kInitialNamespace = 0xEFFFFFFC;
  struct stat info = {};
  return ::stat("/proc/self/ns/pid", &info) != 0 || info.st_ino != kInitialNamespace;
}

} // namespace KovaTest

#endif
