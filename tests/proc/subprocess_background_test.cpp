// Starting a command without waiting for it.

#include "tests/proc/launch_fixture.h"
#include "tests/proc/process_hooks.h"
#include "tests/support/counting_loop.h"

#include <csignal>
#include <sys/prctl.h>

using namespace KovaTest;
using KOVA::Backup::SubProcess;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using Strings = std::vector<std::string>;

constexpr int kRestorerFlag = 0x04000000;

struct sigaction childAction() {
  struct sigaction action = {};
  ::sigaction(SIGCHLD, nullptr, &action);
  return action;
}

int childFlags() {
  return childAction().sa_flags & ~kRestorerFlag;
}

bool hasChildren() {
  siginfo_t info = {};
  return ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT) == 0;
}

// For its lifetime, orphaned descendants become children of the test, so that it can wait for them;
// otherwise a command left running would affect the next test.
class Subreaper {
public:
  Subreaper() { ::prctl(PR_SET_CHILD_SUBREAPER, 1); }
  ~Subreaper() {
    ::prctl(PR_SET_CHILD_SUBREAPER, 0);
    while (::waitpid(-1, nullptr, 0) > 0) {
    }
  }
  Subreaper(const Subreaper &) = delete;
  Subreaper &operator=(const Subreaper &) = delete;
};

class CallBackground : public Launch {
protected:
  CallBackground() : action_(childAction()) {}
  ~CallBackground() override { ::sigaction(SIGCHLD, &action_, nullptr); }

  static void setChildFlags(int flags) {
    struct sigaction action = {};
    action.sa_handler = SIG_DFL;
    action.sa_flags = flags;
    ::sigaction(SIGCHLD, &action, nullptr);
  }

  // Waits for the one command that was started, and returns its wait status.
  static int awaitCommand() {
    int status = 0;
    EXPECT_GT(::waitpid(-1, &status, 0), 0);
    EXPECT_FALSE(hasChildren());
    return status;
  }

  // Starts the helper's report, lets it continue once callBackground has returned, and reads it.
  Report reportOf(bool newSession) {
    const SubProcess command(helperArgs({"report", fifo("report"), "0", fifo("gate")}));
    EXPECT_TRUE(command.callBackground(newSession));
    openGate(file("gate"));
    return parseReport(readFile(file("report")));
  }

private:
  const Subreaper subreaper_;
  struct sigaction action_;
};

} // namespace

TEST_F(CallBackground, ReturnsWhileTheCommandRunsAndLeavesNoChild) {
  ::prctl(PR_SET_CHILD_SUBREAPER, 0);
  const SubProcess command(helperArgs({"hold", fifo("ready"), fifo("gate")}));
  EXPECT_TRUE(command.callBackground(true));
  EXPECT_FALSE(hasChildren());
  EXPECT_EQ("ready\n", readFile(file("ready")));
  openGate(file("gate"));
}

TEST_F(CallBackground, GivesTheCommandToTheSubreaper) {
  const Report report = reportOf(false);
  EXPECT_EQ(std::to_string(::getpid()), report.at("ppid"));
  EXPECT_EQ(0, awaitCommand());
}

TEST_F(CallBackground, LeavesTheCommandInTheHostsSession) {
  const Report report = reportOf(false);
  EXPECT_EQ(std::to_string(::getsid(0)), report.at("sid"));
  EXPECT_EQ(std::to_string(::getpgrp()), report.at("pgid"));
  EXPECT_EQ(0, awaitCommand());
}

TEST_F(CallBackground, GivesTheCommandASessionOfItsOwnWhenAsked) {
  const Report report = reportOf(true);
  EXPECT_EQ(report.at("pid"), report.at("sid"));
  EXPECT_EQ(report.at("pid"), report.at("pgid"));
  EXPECT_NE(std::to_string(::getsid(0)), report.at("sid"));
  EXPECT_EQ(0, awaitCommand());
}

TEST_F(CallBackground, PreparesTheCommandAsCallDoes) {
  ::setenv("KOVA_HOST_VARIABLE", "1", 1);
  SubProcess command(helperArgs({"report", fifo("report")}));
  command.setEnv("NAME", "value");
  command.setStdError(file("err"), 0640);
  EXPECT_TRUE(command.callBackground(false));
  ::unsetenv("KOVA_HOST_VARIABLE");
  const Report report = parseReport(readFile(file("report")));
  EXPECT_EQ(0, awaitCommand());
  EXPECT_EQ("/", report.at("cwd"));
  EXPECT_EQ(2U, withPrefix(report, "env ").size());
  EXPECT_EQ("value", report.at("env NAME"));
  EXPECT_THAT(withPrefix(report, "fd "),
              ElementsAre(testing::Pair("0", "/dev/null"), testing::Pair("1", "/dev/null"),
                          testing::Pair("2", file("err"))));
}

TEST_F(CallBackground, TakesItsStepsInOrder) {
  for (const bool newSession : {false, true}) {
    const SubProcess command(helperArgs({"exit", "0"}));
    const Recording calls;
    EXPECT_TRUE(command.callBackground(newSession));
    EXPECT_EQ(0, awaitCommand());
    EXPECT_THAT(calls.own(),
                ElementsAre("sigaction 17 read", "sigaction 17 write", "fork", "waitpid",
                            "sigaction 17 read", "sigaction 17 write", "waitpid"));
    const std::vector<Strings> children = calls.eachChild();
    ASSERT_EQ(2U, children.size());
    EXPECT_THAT(children[0], ElementsAre("fork", "_exit 0"));
    Strings expected = {"sigaction 17 read", "sigaction 17 write"};
    if (newSession) {
      expected.emplace_back("setsid");
    }
    expected.emplace_back("chdir /");
    EXPECT_EQ(expected,
              Strings(children[1].begin(),
                      children[1].begin() + static_cast<std::ptrdiff_t>(expected.size())));
  }
}

TEST_F(CallBackground, SaysNothingOfACommandThatCannotBeExecuted) {
  EXPECT_TRUE(SubProcess("/none/such/program").callBackground(false));
  const int status = awaitCommand();
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(127, WEXITSTATUS(status));
  EXPECT_THAT(failures(), ElementsAre(failure(256, "execv [/none/such/program]", ENOENT)));
}

TEST_F(CallBackground, PutsTheFlagsOfSigchldBack) {
  for (const int flags : {0, SA_NOCLDWAIT, SA_NOCLDWAIT | SA_NOCLDSTOP}) {
    setChildFlags(flags);
    const WaitScript script({{[&] { EXPECT_EQ(flags & ~SA_NOCLDWAIT, childFlags()); }}});
    EXPECT_TRUE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
    EXPECT_TRUE(script.finished());
    EXPECT_EQ(flags, childFlags());
  }
}

TEST_F(CallBackground, LeavesTermAlone) {
  const Recording calls;
  EXPECT_TRUE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
  EXPECT_EQ(0, calls.count("sigaction 15 write"));
}

TEST_F(CallBackground, ReapsNoOtherChild) {
  const pid_t other = ::fork();
  if (other == 0) {
    ::_exit(11);
  }
  EXPECT_TRUE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
  int status = 0;
  EXPECT_EQ(other, ::waitpid(other, &status, 0));
  EXPECT_EQ(11, WEXITSTATUS(status));
}

TEST_F(CallBackground, FailsWhenTheFirstForkFails) {
  setChildFlags(SA_NOCLDWAIT);
  const Fault fault("fork", 1, EAGAIN);
  EXPECT_FALSE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
  EXPECT_THAT(failures(), ElementsAre(failure(358, "fork", EAGAIN)));
  EXPECT_EQ(SA_NOCLDWAIT, childFlags());
}

TEST_F(CallBackground, FailsWhenTheSecondForkFails) {
  setChildFlags(SA_NOCLDWAIT);
  const ChildFault fault("fork", 1, ENOMEM);
  const Recording calls;
  EXPECT_FALSE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
  EXPECT_THAT(failures(), ElementsAre(failure(364, "fork", ENOMEM)));
  EXPECT_THAT(calls.children(), ElementsAre("fork", "_exit 127"));
  EXPECT_EQ(SA_NOCLDWAIT, childFlags());
}

// The calls of sigaction, in order: SIGCHLD read, written; SIGCHLD read, written.
TEST_F(CallBackground, IsDeliberatelyTrueWhenTheFlagsCannotBeChanged) {
  const std::string tag = std::to_string(LOG_ERR) + " (PID) [err] proc/signal:";
  const std::string reason = std::strerror(EPERM);
  const std::string reading = " sigaction get org failed: " + reason;
  const std::string writing = " sigaction set flags failed: " + reason;
  const std::string flagFailed = failure(348, "remove SA_RESTART", EPERM);
  const std::vector<Strings> rows = {{tag + "89" + reading, flagFailed},
                                     {tag + "98" + writing, flagFailed},
                                     {tag + "49" + reading},
                                     {tag + "56" + writing},
                                     {}};
  int call = 0;
  forEachFailure("sigaction", EPERM, [&](Fault &) {
    const Strings &row = rows.at(static_cast<std::size_t>(call++) % rows.size());
    const std::size_t before = failures().size();
    const Recording calls;
    EXPECT_TRUE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
    const bool started = calls.count("fork") == 1;
    EXPECT_EQ(row.size() < 2, started);
    if (started) {
      EXPECT_EQ(0, awaitCommand());
    }
    EXPECT_FALSE(hasChildren());
    Strings lines = failures();
    lines.erase(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(before));
    EXPECT_EQ(row, lines);
  });
}

TEST_F(CallBackground, AsksAgainAfterAnyFailureOfTheWait) {
  const WaitScript script({{nullptr, EINTR}, {nullptr, ECHILD}, {nullptr, EINVAL}});
  EXPECT_TRUE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
  EXPECT_TRUE(script.finished());
  EXPECT_THAT(failures(), IsEmpty());
}

TEST_F(CallBackground, FailsForAnyOtherEndOfTheProcessBetween) {
  struct End {
    pid_t pid;
    int status;
  };
  for (const End end : {End{kAwaited, SIGKILL}, End{kAwaited, 1 << 8}, End{kAwaited, 127 << 8},
                        End{0, 0}, End{999999, 0}}) {
    const WaitScript script({{nullptr, 0, end.pid, end.status}});
    EXPECT_FALSE(SubProcess(helperArgs({"exit", "0"})).callBackground(false));
    EXPECT_EQ(lastAwaited(), ::waitpid(lastAwaited(), nullptr, 0));
  }
  EXPECT_THAT(failures(), IsEmpty());
}
