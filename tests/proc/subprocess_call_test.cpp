// Running a command and waiting for it, and what happens to a SIGTERM meanwhile.

#include "tests/proc/launch_fixture.h"
#include "tests/proc/process_hooks.h"
#include "tests/support/counting_loop.h"

#include <algorithm>
#include <atomic>
#include <csignal>
#include <thread>

using namespace KovaTest;
using KOVA::Backup::SubProcess;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using Strings = std::vector<std::string>;

// The flag that libc sets on every action that it installs.
constexpr int kRestorerFlag = 0x04000000;
constexpr std::array<int, 2> kSignals = {SIGTERM, SIGCHLD};

struct sigaction actionNow(int sig) {
  struct sigaction action = {};
  ::sigaction(sig, nullptr, &action);
  return action;
}

int flagsNow(int sig) {
  return actionNow(sig).sa_flags & ~kRestorerFlag;
}

void setAction(int sig, void (*handler)(int), int flags) {
  struct sigaction action = {};
  action.sa_handler = handler;
  action.sa_flags = flags;
  ::sigaction(sig, &action, nullptr);
}

// The host's own SIGTERM handler. Recording lists it among the calls.
volatile std::sig_atomic_t hostSignals = 0;
void hostHandler(int sig) {
  hostSignals = hostSignals + 1;
  (void)::getenv(sig == SIGTERM ? "host's handler" : "host's handler with another signal");
}

class Call : public Launch {
protected:
  Call() {
    for (std::size_t i = 0; i < kSignals.size(); ++i) {
      actions_[i] = actionNow(kSignals[i]);
    }
    hostSignals = 0;
  }
  ~Call() override {
    for (std::size_t i = 0; i < kSignals.size(); ++i) {
      ::sigaction(kSignals[i], &actions_[i], nullptr);
    }
  }

  static int call(const Strings &words) { return SubProcess(helperArgs(words)).call(); }

  // The number of the signal as an argument of the helper.
  static std::string number(int sig) { return std::to_string(sig); }

private:
  std::array<struct sigaction, kSignals.size()> actions_{};
};

void expectExit(int code, int status) {
  EXPECT_TRUE(WIFEXITED(status)) << status;
  EXPECT_EQ(code, WEXITSTATUS(status)) << status;
}

void expectKilled(int sig, int status) {
  EXPECT_TRUE(WIFSIGNALED(status)) << status;
  EXPECT_EQ(sig, WTERMSIG(status)) << status;
}

// Keeps the reader of a gate waiting. Created once the reader has opened the gate.
class Gate {
public:
  explicit Gate(std::string fifo) : fifo_(std::move(fifo)) {}
  void reach() { gate_.open(fifo_); }
  void open() { gate_.close(); }

private:
  std::string fifo_;
  std::ofstream gate_;
};

} // namespace

TEST_F(Call, GivesTheWaitStatus) {
  for (const int code : {0, 1, 3, 126, 127, 255}) {
    expectExit(code, call({"exit", std::to_string(code)}));
  }
  for (const int sig : {SIGKILL, SIGTERM, SIGUSR1}) {
    expectKilled(sig, call({"die", number(sig)}));
  }
  EXPECT_THAT(failures(), IsEmpty());
}

TEST_F(Call, TakesItsStepsInOrder) {
  const Recording calls;
  expectExit(0, call({"exit", "0"}));
  EXPECT_THAT(calls.own(), ElementsAre("sigaction 17 read", "sigaction 17 write", "fork",
                                       "sigaction 15 write", "waitpid", "sigaction 15 write",
                                       "sigaction 17 read", "sigaction 17 write"));
}

TEST_F(Call, TakesNoChildWaitOffWhileItWaitsAndPutsItBack) {
  for (const int flags : {0, SA_NOCLDWAIT, SA_NOCLDWAIT | SA_NOCLDSTOP | SA_RESTART}) {
    setAction(SIGCHLD, SIG_DFL, flags);
    const WaitScript script({{[&] { EXPECT_EQ(flags & ~SA_NOCLDWAIT, flagsNow(SIGCHLD)); }}});
    expectExit(4, call({"exit", "4"}));
    EXPECT_TRUE(script.finished());
    EXPECT_EQ(flags, flagsNow(SIGCHLD));
  }
}

TEST_F(Call, CatchesTermWithoutMaskAndFlagsWhileItWaits) {
  setAction(SIGTERM, hostHandler, SA_RESTART | SA_NODEFER);
  const WaitScript script({{[] {
    const struct sigaction action = actionNow(SIGTERM);
    EXPECT_NE(hostHandler, action.sa_handler);
    EXPECT_EQ(0, flagsNow(SIGTERM));
    for (int sig = 1; sig < NSIG; ++sig) {
      EXPECT_NE(1, ::sigismember(&action.sa_mask, sig));
    }
  }}});
  expectExit(0, call({"exit", "0"}));
  EXPECT_EQ(hostHandler, actionNow(SIGTERM).sa_handler);
  EXPECT_EQ(SA_RESTART | SA_NODEFER, flagsNow(SIGTERM));
}

TEST_F(Call, ReapsNoOtherChild) {
  const pid_t other = ::fork();
  if (other == 0) {
    ::_exit(11);
  }
  expectExit(0, call({"exit", "0"}));
  int status = 0;
  EXPECT_EQ(other, ::waitpid(other, &status, 0));
  expectExit(11, status);
}

TEST_F(Call, WaitsForAStoppedCommandUntilItIsContinuedAndEnds) {
  Gate gate(fifo("gate"));
  const WaitScript script({{[&] {
    gate.reach();
    gate.open();
    int status = 0;
    ASSERT_EQ(lastAwaited(), ::waitpid(lastAwaited(), &status, WUNTRACED));
    ASSERT_TRUE(WIFSTOPPED(status));
    ::kill(lastAwaited(), SIGCONT);
  }}});
  expectExit(8, call({"stop", file("gate"), "8"}));
}

TEST_F(Call, GivesMinusOneWhenForkFails) {
  setAction(SIGCHLD, SIG_DFL, SA_NOCLDWAIT);
  for (const int error : {EAGAIN, ENOMEM}) {
    const Fault fault("fork", 1, error);
    const Recording calls;
    EXPECT_EQ(-1, call({"exit", "0"}));
    EXPECT_EQ(failure(331, "fork", error), failures().back());
    EXPECT_EQ(SA_NOCLDWAIT, flagsNow(SIGCHLD));
    EXPECT_EQ(0, calls.count("waitpid"));
    EXPECT_EQ(0, calls.count("sigaction 15 write"));
  }
  EXPECT_EQ(2U, failures().size());
}

// The calls of sigaction, in order: SIGCHLD read, written; SIGTERM set, restored; SIGCHLD read,
// written.
TEST_F(Call, TellsWhichActionCouldNotBeChanged) {
  const std::string signalTag = std::to_string(LOG_ERR) + " (PID) [err] proc/signal:";
  const std::string reason = std::strerror(EPERM);
  const std::string reading = " sigaction get org failed: " + reason;
  const std::string writing = " sigaction set flags failed: " + reason;
  const std::string flagFailed = failure(321, "remove SA_RESTART", EPERM);
  const std::string setFailed = failure(285, "sigaction", EPERM);
  const std::string restoreFailed = failure(291, "sigaction", EPERM);
  struct Row {
    int result; // exit code, or -1
    Strings once;
    Strings lasting;
  };
  const std::vector<Row> rows = {
      {-1, {signalTag + "89" + reading, flagFailed}, {signalTag + "89" + reading, flagFailed}},
      {-1, {signalTag + "98" + writing, flagFailed}, {signalTag + "98" + writing, flagFailed}},
      {-1, {setFailed}, {setFailed, signalTag + "49" + reading}},
      {6, {restoreFailed}, {restoreFailed, signalTag + "49" + reading}},
      {6, {signalTag + "49" + reading}, {signalTag + "49" + reading}},
      {6, {signalTag + "56" + writing}, {signalTag + "56" + writing}},
      {6, {}, {}}};
  bool lasting = false;
  int nth = 0;
  forEachFailure("sigaction", EPERM, [&](Fault &) {
    if (++nth > static_cast<int>(rows.size())) {
      lasting = true;
      nth = 1;
    }
    const Row &row = rows.at(static_cast<std::size_t>(nth) - 1);
    const std::size_t before = failures().size();
    const Recording calls;
    const int status = call({"exit", "6"});
    if (row.result == -1) {
      EXPECT_EQ(-1, status);
    } else {
      expectExit(row.result, status);
    }
    Strings lines = failures();
    lines.erase(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(before));
    EXPECT_EQ(lasting ? row.lasting : row.once, lines);
    EXPECT_EQ(nth <= 2 ? 0 : 1, calls.count("fork"));
    if (nth == 3) {
      // The command keeps running; it is left to the caller.
      EXPECT_EQ(0, calls.count("waitpid"));
      EXPECT_GT(::waitpid(-1, nullptr, 0), 0);
    }
  });
  EXPECT_TRUE(lasting);
}

TEST_F(Call, AsksAgainAfterAnyOtherFailureOfTheWait) {
  const Recording calls;
  const WaitScript script({{nullptr, EINTR},
                           {nullptr, ECHILD},
                           {nullptr, EINVAL},
                           {nullptr, EAGAIN},
                           {nullptr, EINTR}});
  expectExit(3, call({"exit", "3"}));
  EXPECT_TRUE(script.finished());
  EXPECT_EQ(6, calls.count("waitpid"));
  EXPECT_EQ(0, calls.count("kill child 15"));
  EXPECT_EQ(0, calls.count("sleep 0"));
}

TEST_F(Call, GivesMinusOneWhenTheWaitGivesAnotherPid) {
  for (const pid_t other : {0, 1, 999999}) {
    const WaitScript script({{nullptr, 0, other, 0}});
    EXPECT_EQ(-1, call({"exit", "3"}));
    EXPECT_EQ(SIG_DFL, actionNow(SIGTERM).sa_handler);
    EXPECT_EQ(lastAwaited(), ::waitpid(lastAwaited(), nullptr, 0));
  }
}

TEST_F(Call, BeginsEveryWaitWithAStatusOfZero) {
  // The status of a failing wait must not be confused with that of a wait that writes none.
  const WaitScript script({{nullptr, 0, -1, 9 << 8}, {nullptr, 0, kAwaited}});
  EXPECT_EQ(0, call({"exit", "3"}));
  ::waitpid(lastAwaited(), nullptr, 0);
}

class CallForwards : public Call {};

TEST_F(CallForwards, ATermThatInterruptsTheWait) {
  setAction(SIGTERM, hostHandler, SA_RESTART);
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
    gate.reach();
    gate.open();
  }}});
  expectExit(9, call({"relay", number(SIGTERM), file("gate"), "9"}));
  EXPECT_EQ(1, calls.count("kill child 15"));
  EXPECT_EQ(1, calls.count("sleep 0"));
  EXPECT_EQ(1, hostSignals);
  EXPECT_THAT(failures(), IsEmpty());
}

TEST_F(CallForwards, FirstToTheHostThenToTheCommandAndThenSleepsAndWaits) {
  setAction(SIGTERM, hostHandler, 0);
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
                              gate.reach();
                              ::raise(SIGTERM);
                              gate.open();
                            },
                            EINTR}});
  expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  EXPECT_THAT(calls.own(),
              ElementsAre("sigaction 17 read", "sigaction 17 write", "fork", "sigaction 15 write",
                          "waitpid", "getenv host's handler", "kill child 15", "sleep 0", "waitpid",
                          "sigaction 15 write", "sigaction 17 read", "sigaction 17 write"));
}

TEST_F(CallForwards, AgainWheneverTheWaitIsInterrupted) {
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
                              gate.reach();
                              ::raise(SIGTERM);
                            },
                            EINTR},
                           {nullptr, EINTR}, // by another signal
                           {nullptr, ECHILD},
                           {[&] { gate.open(); }, EINTR}});
  expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  EXPECT_EQ(3, calls.count("kill child 15"));
  EXPECT_EQ(3, calls.count("sleep 0"));
  EXPECT_EQ(5, calls.count("waitpid"));
}

TEST_F(CallForwards, OncePerTerm) {
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
                              gate.reach();
                              ::raise(SIGTERM);
                            },
                            EINTR},
                           {[] { ::raise(SIGTERM); }, EINTR},
                           {[&] {
                              ::raise(SIGTERM);
                              gate.open();
                            },
                            EINTR}});
  expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  EXPECT_EQ(3, calls.count("kill child 15"));
  EXPECT_EQ(3, calls.count("sleep 0"));
}

// Only that signal ends the command. When such a SIGTERM was lost, this test waited for ever.
TEST_F(CallForwards, ATermThatComesJustBeforeTheWait) {
  setAction(SIGTERM, hostHandler, 0);
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
    gate.reach();
    ::raise(SIGTERM);
  }}});
  expectKilled(SIGTERM, call({"ignore", number(SIGUSR1), file("gate"), "9"}));
  EXPECT_EQ(1, calls.count("kill child 15"));
  EXPECT_EQ(1, hostSignals);
}

TEST_F(CallForwards, ATermThatComesWhenTheHandlerHasJustBeenSet) {
  const CallHook hook("sigaction 15 write", [] { ::raise(SIGTERM); });
  // Whether or not the command has been executed by then.
  expectKilled(SIGTERM, call({"hold", fifo("ready"), fifo("gate")}));
}

// At that moment, the handler of the host is not yet known. The kill is for a child that was not
// yet waited for, so the hooks list it as one for another process.
TEST_F(CallForwards, ThatTermToTheHostTooAndFirst) {
  setAction(SIGTERM, hostHandler, 0);
  Gate gate(fifo("gate"));
  const Recording calls;
  {
    const CallHook hook("sigaction 15 write", [&] {
      gate.reach(); // the command runs: until then it has the host's handler, too
      ::raise(SIGTERM);
    });
    expectKilled(SIGTERM, call({"ignore", number(SIGUSR1), file("gate"), "9"}));
  }
  EXPECT_EQ(1, hostSignals);
  EXPECT_THAT(calls.own(),
              ElementsAre("sigaction 17 read", "sigaction 17 write", "fork", "sigaction 15 write",
                          "getenv host's handler", "kill other 15", "sleep 0", "waitpid",
                          "sigaction 15 write", "sigaction 17 read", "sigaction 17 write"));
}

TEST_F(CallForwards, ATermThatComesBetweenTwoWaits) {
  Gate gate(fifo("gate"));
  const Recording calls;
  const CallHook hook("sleep 0", [] { ::raise(SIGTERM); });
  const WaitScript script({{[&] {
                              gate.reach();
                              const Fault lost("kill", 1, EPERM);
                              ::raise(SIGTERM);
                              EXPECT_TRUE(lost.fired());
                            },
                            EINTR}});
  expectKilled(SIGTERM, call({"ignore", number(SIGUSR1), file("gate"), "9"}));
  EXPECT_EQ(2, calls.count("kill child 15"));
  EXPECT_EQ(2, calls.count("sleep 0"));
}

// The handler checks whether there is still a process to send the signal to. The status is that of
// the wait.
TEST_F(CallForwards, ATermToACommandThatHasEndedAndIsNotCollectedYet) {
  const WaitScript script({{[] {
    siginfo_t info = {};
    ASSERT_EQ(0, ::waitid(P_PID, static_cast<id_t>(lastAwaited()), &info, WEXITED | WNOWAIT));
    ::raise(SIGTERM);
  }}});
  expectExit(5, call({"exit", "5"}));
  EXPECT_TRUE(script.finished());
}

TEST_F(CallForwards, NothingToACommandThatHasJustBeenCollected) {
  setAction(SIGTERM, hostHandler, 0);
  const Recording calls;
  const CallHook hook("waitpid", [] { ::raise(SIGTERM); });
  expectExit(5, call({"exit", "5"}));
  EXPECT_EQ(0, calls.count("kill child 15"));
  EXPECT_EQ(1, hostSignals);
}

// The host ignores SIGCHLD, contrary to the header. The wait then never ends; here the last step
// ends it. Meanwhile the PID of the command is free, and another process may have it by the time
// the host itself is terminated.
TEST_F(CallForwards, NothingToACommandThatTheSystemHasReaped) {
  setAction(SIGCHLD, SIG_IGN, 0);
  setAction(SIGTERM, hostHandler, 0);
  const Recording calls;
  const WaitScript script({{nullptr, 0},
                           {[] { ::raise(SIGTERM); }, ECHILD},
                           {nullptr, ECHILD},
                           {nullptr, 0, kAwaited, 0}});
  EXPECT_EQ(0, call({"exit", "0"}));
  EXPECT_TRUE(script.finished());
  EXPECT_EQ(1, hostSignals);
  EXPECT_EQ(0, calls.count("kill child 15"));
}

TEST_F(CallForwards, NothingOfAnEarlierCall) {
  Gate gate(fifo("gate"));
  {
    const WaitScript script({{[&] {
                                gate.reach();
                                ::raise(SIGTERM);
                                gate.open();
                              },
                              EINTR}});
    expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  }
  {
    setAction(SIGTERM, hostHandler, 0);
    const CallHook hook("waitpid", [] { ::raise(SIGTERM); }); // too late to be forwarded
    expectExit(0, call({"exit", "0"}));
  }
  const Recording calls;
  const WaitScript script({{nullptr, EINTR}, {nullptr, EINTR}});
  expectExit(0, call({"exit", "0"}));
  EXPECT_EQ(0, calls.count("kill child 15"));
  EXPECT_EQ(0, calls.count("kill other 15")); // before the first wait
}

TEST_F(CallForwards, ToACommandThatIgnoresItAndWaitsOn) {
  Gate gate(fifo("gate"));
  const Recording calls;
  const WaitScript script({{[&] {
                              gate.reach();
                              ::raise(SIGTERM);
                            },
                            EINTR},
                           {[&] { gate.open(); }}});
  expectExit(7, call({"ignore", number(SIGTERM), file("gate"), "7"}));
  EXPECT_EQ(1, calls.count("kill child 15"));
}

TEST_F(CallForwards, ATermThatAnotherThreadTakes) {
  sigset_t term;
  sigset_t old;
  ::sigemptyset(&term);
  ::sigaddset(&term, SIGTERM);
  std::atomic<bool> done{false};
  std::thread other([&] { // created while the signal is not blocked
    while (!done) {
      ::usleep(1000);
    }
  });
  ::sigprocmask(SIG_BLOCK, &term, &old);
  Gate gate(fifo("gate"));
  const WaitScript script({{[&] {
    gate.reach();
    ::kill(::getpid(), SIGTERM);
    gate.open();
  }}});
  expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  done = true;
  other.join();
  ::sigprocmask(SIG_SETMASK, &old, nullptr);
}

TEST_F(CallForwards, KeepsErrnoOfTheInterruptedCode) {
  Gate gate(fifo("gate"));
  const WaitScript script({{[&] {
    gate.reach();
    const Fault lost("kill", 1, EPERM);
    errno = ENOTTY;
    ::raise(SIGTERM);
    EXPECT_EQ(ENOTTY, errno);
    gate.open();
  }}});
  expectExit(7, call({"ignore", number(SIGTERM), file("gate"), "7"}));
}

// A SIGTERM at any moment around the start of the wait ends the command.
TEST_F(CallForwards, NoTermIsLost) {
  const SubProcess command(helperArgs({"ignore", number(SIGUSR1), fifo("gate"), "9"}));
  for (int delay = 0; delay < 200; ++delay) {
    Gate gate(file("gate"));
    pid_t sender = -1;
    const WaitScript script({{[&] {
      gate.reach();
      sender = ::fork();
      if (sender == 0) {
        for (volatile int i = 0; i < delay * 30; i = i + 1) {
        }
        ::kill(::getppid(), SIGTERM);
        ::_exit(0);
      }
    }}});
    expectKilled(SIGTERM, command.call());
    ::waitpid(sender, nullptr, 0);
  }
}

// A host may copy the action of SIGTERM to another signal meanwhile.
TEST_F(CallForwards, AnotherSignalToTheHostAlone) {
  setAction(SIGTERM, hostHandler, 0);
  const struct sigaction old = actionNow(SIGUSR2);
  const Recording calls;
  const WaitScript script({{[] {
                              const struct sigaction forwarding = actionNow(SIGTERM);
                              ::sigaction(SIGUSR2, &forwarding, nullptr);
                              ::raise(SIGUSR2);
                            },
                            EINTR},
                           {nullptr, EINTR}});
  expectExit(5, call({"exit", "5"}));
  ::sigaction(SIGUSR2, &old, nullptr);
  EXPECT_EQ(1, calls.count("getenv host's handler with another signal"));
  EXPECT_EQ(1, hostSignals);
  EXPECT_EQ(0, calls.count("kill child 15"));
  EXPECT_EQ(0, calls.count("sleep 0"));
}

class CallWithHostHandler : public Call {};

TEST_F(CallWithHostHandler, CallsNothingForAnIgnoredOrDefaultedTerm) {
  const std::vector<void (*)(int)> handlers = {SIG_IGN, SIG_DFL};
  for (void (*const handler)(int) : handlers) {
    setAction(SIGTERM, handler, 0);
    Gate gate(fifo("gate"));
    const Recording calls;
    const WaitScript script({{[&] {
                                gate.reach();
                                ::raise(SIGTERM);
                                gate.open();
                              },
                              EINTR}});
    expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
    EXPECT_EQ(1, calls.count("kill child 15"));
    EXPECT_EQ(handler, actionNow(SIGTERM).sa_handler);
  }
}

namespace {

volatile std::sig_atomic_t infoSignal = 0;
volatile std::sig_atomic_t infoNumber = 0;
volatile std::sig_atomic_t infoContext = 0;

void infoHandler(int sig, siginfo_t *info, void *context) {
  infoSignal = sig;
  infoNumber = info->si_signo;
  infoContext = context != nullptr ? 1 : 0;
}

} // namespace

TEST_F(CallWithHostHandler, GivesAHandlerOfThreeArgumentsSomethingToLookAt) {
  struct sigaction action = {};
  action.sa_sigaction = infoHandler;
  action.sa_flags = SA_SIGINFO;
  ::sigaction(SIGTERM, &action, nullptr);
  infoSignal = 0;
  infoNumber = 0;
  infoContext = 0;
  Gate gate(fifo("gate"));
  const WaitScript script({{[&] {
                              gate.reach();
                              ::raise(SIGTERM);
                              gate.open();
                            },
                            EINTR}});
  expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  EXPECT_EQ(SIGTERM, infoSignal);
  EXPECT_EQ(SIGTERM, infoNumber);
  EXPECT_EQ(1, infoContext);
  EXPECT_EQ(infoHandler, actionNow(SIGTERM).sa_sigaction);
  EXPECT_EQ(SA_SIGINFO, flagsNow(SIGTERM));
}

TEST_F(CallWithHostHandler, ForgetsItAfterwards) {
  Gate gate(fifo("gate"));
  const auto interrupted = [&] {
    const WaitScript script({{[&] {
                                gate.reach();
                                ::raise(SIGTERM);
                                gate.open();
                              },
                              EINTR}});
    expectExit(9, call({"until", number(SIGTERM), file("gate"), "9"}));
  };
  setAction(SIGTERM, hostHandler, 0);
  interrupted();
  EXPECT_EQ(1, hostSignals);
  struct sigaction action = {};
  action.sa_sigaction = infoHandler;
  action.sa_flags = SA_SIGINFO;
  ::sigaction(SIGTERM, &action, nullptr);
  infoSignal = 0;
  interrupted();
  EXPECT_EQ(1, hostSignals);
  EXPECT_EQ(SIGTERM, infoSignal);
  infoSignal = 0;
  setAction(SIGTERM, SIG_IGN, 0);
  interrupted();
  EXPECT_EQ(1, hostSignals);
  EXPECT_EQ(0, infoSignal);
}
