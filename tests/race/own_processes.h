#ifndef KOVABACKUP_TESTS_RACE_OWN_PROCESSES_H
#define KOVABACKUP_TESTS_RACE_OWN_PROCESSES_H

/// @file Work among processes of its own, so that what looks at all processes sees only these.

#include "tests/support/child_process.h"

#include <functional>
#include <gtest/gtest.h>
#include <sched.h>
#include <string>
#include <sys/mount.h>

namespace KovaTest {

/// Runs the work as process 1 of a PID namespace, in a mount namespace with a /proc of that. All of
/// its processes end with it.
/// Fails the test when an expectation failed in it. Returns: why it could not be run, or "".
inline std::string runAmongOwnProcesses(const std::function<void()> &work) {
  constexpr int kNoNamespace = 3;
  const int code = runInChild([&] {
    if (::unshare(CLONE_NEWPID | CLONE_NEWNS) != 0) {
      return kNoNamespace;
    }
    return runInChild([&] {
      if (::mount("proc", "/proc", "proc", MS_NOSUID | MS_NODEV | MS_NOEXEC, nullptr) != 0) {
        return kNoNamespace;
      }
      work();
      return testing::Test::HasFailure() ? 1 : 0;
    });
  });
  EXPECT_TRUE(code == 0 || code == kNoNamespace) << code;
  return code == kNoNamespace ? "skipped: no namespace of processes with a /proc" : "";
}

} // namespace KovaTest

#endif
