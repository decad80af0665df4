#ifndef KOVABACKUP_TESTS_SERVICE_SESSION_HOOKS_H
#define KOVABACKUP_TESTS_SERVICE_SESSION_HOOKS_H

/// @file The system calls of SessionStore, for tests that act between two of them or make them
/// fail: fault.h knows renameat2, readdir, utimensat, getrandom and stat, too.

#include <functional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KovaTest {

/// For its lifetime, step(call, path) runs before each call that changes the disk (symlink,
/// renameat2, rename, unlink, unlinkat, utimensat) and before opendir and flock. path is that of
/// the entry that the call changes, of a renaming the old one; "" for flock. One at a time; not
/// called by itself again.
class EachCall {
public:
  using Step = std::function<void(const std::string &call, const std::string &path)>;

  explicit EachCall(Step step);
  ~EachCall();
  EachCall(const EachCall &) = delete;
  EachCall &operator=(const EachCall &) = delete;

  Step step;
  bool running = false;
};

/// For its lifetime, /proc lists no process except the calling one and those given, so that a test
/// does not depend on what else runs on the machine. Nest no two.
class OnlyProcesses {
public:
  explicit OnlyProcesses(std::vector<pid_t> others = {});
  ~OnlyProcesses();
  OnlyProcesses(const OnlyProcesses &) = delete;
  OnlyProcesses &operator=(const OnlyProcesses &) = delete;

  const std::vector<pid_t> others;
};

} // namespace KovaTest

#endif
