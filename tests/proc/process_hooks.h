#ifndef KOVABACKUP_TESTS_PROCESS_HOOKS_H
#define KOVABACKUP_TESTS_PROCESS_HOOKS_H

/// @file Records and changes the calls that start processes and wait for them, in the test's
/// process and in the children that it forks.
///
///     Recording calls;                       // from here on, in every process
///     command.call();
///     EXPECT_THAT(calls.own(), ElementsAre("fork", "waitpid", ...));
///     EXPECT_THAT(calls.children(), ElementsAre("chdir /", ...));
///
///     WaitScript script({{[] { ::raise(SIGTERM); }, -1, EINTR}});
///     command.call();                        // its first waitpid is interrupted, the second real
///
/// A Fault (tests/support/fault.h) fails a call of the test's own process, a ChildFault one of a
/// forked child's.

#include "tests/support/counting_loop.h"

#include <functional>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KovaTest {

/// Lists the calls made during its lifetime, each with the arguments that identify it: "dup2 3 1".
/// One at a time.
class Recording {
public:
  Recording();
  ~Recording();
  Recording(const Recording &) = delete;
  Recording &operator=(const Recording &) = delete;

  /// The calls of the test's own process.
  std::vector<std::string> own() const;
  /// The calls of all its forked children up to their execv.
  std::vector<std::string> children() const;
  /// The same as one list for each child, in the order of their first calls.
  std::vector<std::vector<std::string>> eachChild() const;
  /// How often the test's own process made a call; text is what own() would list.
  int count(const std::string &text) const;
};

/// What one waitpid of the test's own process does. It calls before, if that is set. Then it fails
/// with error, if that is not 0; or returns result with status, if result is set; or calls the real
/// waitpid. The result kAwaited means the PID that it was called for.
struct WaitStep {
  std::function<void()> before = nullptr;
  int error = 0;
  std::optional<pid_t> result = std::nullopt;
  std::optional<int> status = std::nullopt;
};

constexpr pid_t kAwaited = -1000000;

/// Replaces the next calls of waitpid; those after the last step are real. One at a time.
class WaitScript {
public:
  explicit WaitScript(std::vector<WaitStep> steps);
  ~WaitScript();
  WaitScript(const WaitScript &) = delete;
  WaitScript &operator=(const WaitScript &) = delete;

  bool finished() const;
};

/// Calls after once, as soon as a call of the test's own process that Recording would list as text
/// has done its work. One at a time.
class CallHook {
public:
  CallHook(const char *text, std::function<void()> after);
  ~CallHook();
  CallHook(const CallHook &) = delete;
  CallHook &operator=(const CallHook &) = delete;
};

/// The PID that the test's own process last waited for.
pid_t lastAwaited();

} // namespace KovaTest

#endif
