#ifndef KOVABACKUP_TESTS_WAITS_FOR_FLOCK_H
#define KOVABACKUP_TESTS_WAITS_FOR_FLOCK_H

/// @file Finds out that a process has come to wait for a lock.

#include <fstream>
#include <string>
#include <sys/types.h>

namespace KovaTest {

/// Whether the process waits for an flock. The kernel lists that as
/// "1: -> FLOCK  ADVISORY  WRITE 812".
inline bool waitsForFlock(pid_t pid) {
  std::ifstream locks("/proc/locks");
  const std::string owner = " " + std::to_string(pid) + " ";
  for (std::string line; std::getline(locks, line);) {
    if (line.find("-> FLOCK") != std::string::npos && line.find(owner) != std::string::npos) {
      return true;
    }
  }
  return false;
}

} // namespace KovaTest

#endif
