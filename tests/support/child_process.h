#ifndef KOVABACKUP_TESTS_CHILD_PROCESS_H
#define KOVABACKUP_TESTS_CHILD_PROCESS_H

/// @file Work in forked children, and shell commands with their output.

#include <atomic>
#include <functional>
#include <string>

namespace KovaTest {

/// Runs the work in a forked child. Returns: the work's result, as an exit code; -1 when a signal
/// ended the child.
int runInChild(const std::function<int()> &work);

/// Runs work(0) to work(count - 1) in that many children at once; each must return true.
void runInChildren(int count, const std::function<bool(int)> &work);

struct ShellResult {
  int exitCode = -1; ///< -1 when the command cannot be started or a signal ended it
  std::string output;
};

/// Runs a command in the shell and collects what it writes to standard output.
ShellResult runShell(const std::string &command);

/// A number that this process and its forked children share, at first 0.
class SharedCounter {
public:
  SharedCounter();
  ~SharedCounter();
  SharedCounter(const SharedCounter &) = delete;
  SharedCounter &operator=(const SharedCounter &) = delete;

  std::atomic<int> &operator*() const { return *counter_; }
  std::atomic<int> *operator->() const { return counter_; }

private:
  static_assert(std::atomic<int>::is_always_lock_free);
  std::atomic<int> *counter_;
};

} // namespace KovaTest

#endif
