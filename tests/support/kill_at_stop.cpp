#include "tests/support/kill_at_stop.h"

#include <csignal>
#include <gtest/gtest.h>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest {
namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif

bool mayTrace() {
  const pid_t pid = startWork([] {
    if (::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0) {
      ::_exit(1);
    }
  });
  int status = 0;
  EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

} // namespace

std::string whyNoStops() {
  if (kSanitized) {
    return "skipped: a sanitizer's own system calls, not the same each time, are stops, too";
  }
  return mayTrace() ? "" : "skipped: no process may be traced here";
}

pid_t startWork(const std::function<void()> &work) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    work();
    ::_exit(testing::Test::HasFailure() ? 1 : 0);
  }
  return pid;
}

bool killAtStop(int nth, const std::function<void()> &work) {
  const pid_t pid = startWork([&] {
    (void)::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
    (void)::raise(SIGSTOP);
    work();
  });
  int status = 0;
  EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  for (int stop = 0; stop < nth && WIFSTOPPED(status); ++stop) {
    EXPECT_EQ(0, ::ptrace(PTRACE_SYSCALL, pid, nullptr, nullptr));
    EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  }
  if (!WIFSTOPPED(status)) {
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    return false;
  }
  EXPECT_EQ(0, ::kill(pid, SIGKILL));
  EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  return true;
}

} // namespace KovaTest
