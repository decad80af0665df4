// Signals that a parent process has blocked or ignored, and parents that wait for every child.
#include "tests/hostile/surroundings.h"

#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class HostileSignals : public HostileTest {};

void blockAll() {
  sigset_t all;
  ::sigfillset(&all);
  ::sigprocmask(SIG_SETMASK, &all, nullptr);
}

void ignoreAll() {
  for (const int sig : {SIGCHLD, SIGPIPE, SIGTERM, SIGHUP, SIGINT, SIGQUIT, SIGUSR1}) {
    (void)std::signal(sig, SIG_IGN);
  }
}

// "Name:\t<hexadecimal set>" of a signal set of the process, as /proc shows it.
std::string signalSet(const std::string &status, const std::string &name) {
  const std::size_t start = status.find(name + ":\t");
  return start == std::string::npos
             ? "none"
             : status.substr(start + name.size() + 2, sizeof "0000000000000000" - 1);
}

// What a program does that never waits for its children.
void discardChildren() {
  struct sigaction action = {};
  action.sa_handler = SIG_DFL;
  action.sa_flags = SA_NOCLDWAIT;
  ::sigaction(SIGCHLD, &action, nullptr);
}

TEST_F(HostileSignals, DiscardedChildrenCostTheLibraryNoStatus) {
  const Outcome outcome = runLibrary(
      [] {
        SubProcess command("/bin/sh");
        command.addArgList("-c", "exit 7", nullptr);
        const int status = command.call();
        return WIFEXITED(status) && WEXITSTATUS(status) == 7;
      },
      discardChildren);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, IsEmpty());
}

TEST_F(HostileSignals, ChildrenAreDiscardedAgainAfterACall) {
  const Outcome outcome = runLibrary(
      [] {
        const bool called = SubProcess("/bin/true").call() == 0;
        struct sigaction action = {};
        ::sigaction(SIGCHLD, nullptr, &action);
        return called && (action.sa_flags & SA_NOCLDWAIT) != 0;
      },
      discardChildren);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, AServicesCommandSaysThatItsStatusWasLost) {
  const Outcome outcome = runLibrary(
      [] {
        return Service::Command({"/bin/sh", "-c", "exit 7"}).run().end ==
               Service::Result::End::StatusLost;
      },
      ignoreAll);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, BlockedSignalsDoNotKeepACommandRunningForEver) {
  const Outcome outcome = runLibrary(
      [] {
        Service::Command command({"/bin/sleep", "600"});
        command.limit(Service::Millis(50), Service::Millis(50));
        const Service::Result result = command.run();
        return result.timedOut && result.end == Service::Result::End::Signalled;
      },
      blockAll);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, BlockedSignalsAreStillBlockedAfterACall) {
  const Outcome outcome = runLibrary(
      [] {
        const bool called = SubProcess("/bin/true").call() == 0;
        sigset_t now;
        ::sigprocmask(SIG_SETMASK, nullptr, &now);
        return called && ::sigismember(&now, SIGTERM) == 1 && ::sigismember(&now, SIGCHLD) == 1;
      },
      blockAll);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, TheCommandThatIsRunHasTheSignalsOfItsCaller) {
  const Outcome outcome = runCommand({"run", "--", "cat", "/proc/self/status"},
                                     [] { (void)std::signal(SIGHUP, SIG_IGN); });
  EXPECT_EQ("0000000000000000", signalSet(outcome.out, "SigBlk")) << outcome;
  EXPECT_EQ("0000000000000001", signalSet(outcome.out, "SigIgn")) << "as under nohup";
}

TEST_F(HostileSignals, TheCommandRunsWithEverythingIgnored) {
  const Outcome outcome = runCommand({"run", "--", "sh", "-c", "exit 9"}, ignoreAll);
  EXPECT_EQ(9, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, TheCommandRunsWithEverythingBlocked) {
  const Outcome outcome = runCommand({"run", "--", "sh", "-c", "exit 9"}, blockAll);
  EXPECT_EQ(9, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, AReaderThatHasGoneIsNoDeathWhenTheSignalIsBlocked) {
  const Outcome outcome = runCommand({"session", "create"}, [] {
    int ends[2] = {-1, -1};
    need(::pipe2(ends, O_CLOEXEC) == 0, "pipe2");
    ::dup2(ends[1], STDOUT_FILENO);
    ::close(ends[0]);
    blockAll();
  });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(HostileSignals, AnotherChildThatEndsIsNotTakenForTheCommand) {
  const Outcome outcome = runLibrary([] {
    const pid_t other = ::fork();
    if (other == 0) {
      ::_exit(3);
    }
    SubProcess command("/bin/sh");
    command.addArgList("-c", "exit 7", nullptr);
    const int status = command.call();
    int others = 0;
    return WIFEXITED(status) && WEXITSTATUS(status) == 7 && ::waitpid(other, &others, 0) == other &&
           WEXITSTATUS(others) == 3;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

// A handler of the host that waits for every child, as shells and init systems have.
void reapAll(int) {
  const int error = errno;
  while (::waitpid(-1, nullptr, WNOHANG) > 0) {
  }
  errno = error;
}

TEST_F(HostileSignals, AHostThatWaitsForEveryChildLosesTheServicesStatusButNotTheEnd) {
  const Outcome outcome = runLibrary(
      [] {
        const auto end = Service::Command({"/bin/sh", "-c", "exit 7"}).run().end;
        return end == Service::Result::End::StatusLost || end == Service::Result::End::Exited;
      },
      [] { (void)std::signal(SIGCHLD, reapAll); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileSignals, WithoutATerminalPruneAsksNobody) {
  EXPECT_EQ(0, runCommand({"session", "create"}).exitCode);
  const Outcome outcome = runCommand({"session", "prune", "--older-than", "0s"},
                                     [] { need(::setsid() != -1, "setsid"); });
  EXPECT_EQ(2, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("--yes"));
  EXPECT_EQ(1U, namesIn(kSessionRoot).size());
}

} // namespace
