#include "kovabackup/exec.h"

#include "kovaplatform/kovacore.h"
#include "tests/proc/process_helper.h"
#include "tests/proc/process_hooks.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"
#include "tests/support/log_interruption.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <syslog.h>
#include <utility>
#include <vector>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

// The platform's fork, so that it can be made to fail.
extern "C" pid_t KLIBCProcFork(void) {
  return failsNow("KLIBCProcFork") ? -1 : ::fork();
}

#if defined(__SANITIZE_THREAD__)
// The forwarding handler logs, as it should; the log of the tests is a list, which allocates.
extern "C" const char *__tsan_default_options() {
  return "report_signal_unsafe=0";
}
#endif

namespace {

std::vector<std::pair<int, int>> callbacks;

void recordCallback(int sig, int result) {
  callbacks.emplace_back(sig, result);
}

int execHelper(std::vector<std::string> words, void (*callback)(int, int) = recordCallback) {
  callbacks.clear();
  words.insert(words.begin(), kHelper);
  std::vector<char *> argv;
  for (std::string &word : words) {
    argv.push_back(word.data());
  }
  argv.push_back(nullptr);
  UtilExec exec;
  return exec.Execv(kHelper.c_str(), argv.data(), callback);
}

volatile std::sig_atomic_t hostSignal = 0;
void hostHandler(int sig) {
  hostSignal = sig;
}

// Saves the actions of the signals that Execv changes, and restores them at the end.
class KeptActions {
public:
  KeptActions() {
    for (std::size_t i = 0; i < kSignals.size(); ++i) {
      ::sigaction(kSignals[i], nullptr, &actions_[i]);
    }
  }
  ~KeptActions() {
    for (std::size_t i = 0; i < kSignals.size(); ++i) {
      ::sigaction(kSignals[i], &actions_[i], nullptr);
    }
  }
  KeptActions(const KeptActions &) = delete;
  KeptActions &operator=(const KeptActions &) = delete;

private:
  static constexpr std::array<int, 3> kSignals = {SIGINT, SIGTERM, SIGCHLD};
  std::array<struct sigaction, 3> actions_{};
};

struct sigaction actionNow(int sig) {
  struct sigaction action = {};
  ::sigaction(sig, nullptr, &action);
  return action;
}

void setChildFlags(int flags) {
  struct sigaction action = {};
  action.sa_handler = SIG_DFL;
  action.sa_flags = flags;
  ::sigaction(SIGCHLD, &action, nullptr);
}

bool noChildWait() {
  return (actionNow(SIGCHLD).sa_flags & SA_NOCLDWAIT) != 0;
}

LogLine notSent(unsigned pid, int error) {
  return errLine("proc/exec", 22,
                 "failed to signal [" + std::to_string(pid) + "], errno=" + std::strerror(error));
}

} // namespace

// signal(2), which restores the handlers, leaves SA_RESTART on actions that did not have it. The
// tests start from the default actions: a shell starts background jobs with SIGINT ignored, and the
// programs that a test ends by SIGINT would inherit that.
class Execv : public testing::Test {
protected:
  Execv() {
    ::signal(SIGINT, SIG_DFL);
    ::signal(SIGTERM, SIG_DFL);
  }

private:
  const KeptActions kept_;
};

TEST_F(Execv, GivesTheExitCode) {
  for (const int code : {0, 1, 3, 127, 128, 255}) {
    EXPECT_EQ(code, execHelper({"exit", std::to_string(code)}));
  }
  EXPECT_THAT(callbacks, IsEmpty());
}

TEST_F(Execv, GivesMinusOneForAProgramEndedByASignal) {
  for (const int sig : {SIGKILL, SIGTERM, SIGSEGV}) {
    EXPECT_EQ(-1, execHelper({"die", std::to_string(sig)}));
  }
}

TEST_F(Execv, GivesMinusOneSilentlyForAProgramThatCannotBeExecuted) {
  UtilExec exec;
  char name[] = "none";
  char *const argv[] = {name, nullptr};
  EXPECT_EQ(-1, exec.Execv("/none/such/program", argv, recordCallback));
  EXPECT_EQ(-1, exec.Execv("/", argv, nullptr));
}

TEST_F(Execv, CallsNothingButExecvInTheChild) {
  const Recording calls;
  EXPECT_EQ(0, execHelper({"exit", "0"}));
  EXPECT_THAT(calls.children(), ElementsAre("execv " + kHelper));
}

TEST_F(Execv, AbortsTheChildWhenExecvReturns) {
  const WaitScript script({{[] {
    // The child that the parent is about to reap, without reaping it.
    siginfo_t info = {};
    ASSERT_EQ(0, ::waitid(P_PID, static_cast<id_t>(lastAwaited()), &info, WEXITED | WNOWAIT));
    EXPECT_EQ(SIGABRT, info.si_status);
  }}});
  UtilExec exec;
  char name[] = "none";
  char *const argv[] = {name, nullptr};
  EXPECT_EQ(-1, exec.Execv("/none/such/program", argv, nullptr));
  EXPECT_TRUE(script.finished());
}

TEST_F(Execv, LeavesTheChildWhatItInherits) {
  const TestFolder folder;
  const std::string file = folder / "report";
  const int fd = ::open("/dev/null", O_RDONLY);
  ::setenv("KOVA_EXEC_TEST", "kept", 1);
  char cwd[4096] = "";
  ASSERT_NE(nullptr, ::getcwd(cwd, sizeof cwd));
  ASSERT_EQ(0, ::chdir("/usr"));
  sigset_t mask;
  sigset_t before;
  ::sigemptyset(&mask);
  ::sigaddset(&mask, SIGUSR2);
  ::sigprocmask(SIG_BLOCK, &mask, &before);
  EXPECT_EQ(4, execHelper({"report", file, "4"}));
  ::sigprocmask(SIG_SETMASK, &before, nullptr);
  ::unsetenv("KOVA_EXEC_TEST");
  ASSERT_EQ(0, ::chdir(cwd));
  ::close(fd);
  const Report report = parseReport(readFile(file));
  EXPECT_EQ("/dev/null", report.at("fd " + std::to_string(fd)));
  EXPECT_EQ("kept", report.at("env KOVA_EXEC_TEST"));
  EXPECT_EQ("/usr", report.at("cwd"));
  EXPECT_EQ("0000000000000800", report.at("SigBlk"));
  EXPECT_EQ(std::to_string(::getpid()), report.at("ppid"));
  EXPECT_THAT(withPrefix(report, "arg "),
              ElementsAre(testing::Pair("0", kHelper), testing::Pair("1", "report"),
                          testing::Pair("2", file), testing::Pair("3", "4")));
}

TEST_F(Execv, FailsWithoutATraceWhenForkFails) {
  ::signal(SIGTERM, hostHandler);
  const Fault fault("KLIBCProcFork", 1, EAGAIN);
  const Recording calls;
  EXPECT_EQ(-1, execHelper({"exit", "0"}));
  EXPECT_THAT(calls.own(), IsEmpty());
  EXPECT_EQ(hostHandler, actionNow(SIGTERM).sa_handler);
}

TEST_F(Execv, TakesItsStepsInOrder) {
  setChildFlags(SA_NOCLDWAIT);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const Recording calls;
  const WaitScript script({{[&] { openGate(gate); }}});
  EXPECT_EQ(0, execHelper({"count", std::to_string(SIGUSR1), gate}));
  std::vector<std::string> steps;
  for (const std::string &call : calls.own()) {
    if (call.rfind("open", 0) != 0 && call.rfind("close", 0) != 0) {
      steps.push_back(call);
    }
  }
  EXPECT_THAT(steps, ElementsAre("fork", "signal 2", "signal 15", "sigaction 17 read",
                                 "sigaction 17 write", "waitpid", "sigaction 17 read",
                                 "sigaction 17 write", "signal 2", "signal 15"));
}

class ExecvForwards : public Execv, public testing::WithParamInterface<int> {};

TEST_P(ExecvForwards, ASignalOfTheWaitAndTellsTheCallback) {
  hostSignal = 0;
  ::signal(GetParam(), hostHandler);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const Recording calls;
  const WaitScript script({{[&] { openGate(gate); }}});
  EXPECT_EQ(9, execHelper({"relay", std::to_string(GetParam()), gate, "9"}));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(GetParam(), 9)));
  EXPECT_EQ(1, calls.count("kill child " + std::to_string(GetParam())));
  EXPECT_EQ(0, hostSignal);
  EXPECT_EQ(hostHandler, actionNow(GetParam()).sa_handler);
}

TEST_P(ExecvForwards, ASignalThatComesJustBeforeTheWait) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  // The child cannot end before the signal has reached it.
  const WaitScript script({{[&] {
    const std::ofstream hold(gate);
    ::raise(GetParam());
  }}});
  EXPECT_EQ(1, execHelper({"count", std::to_string(GetParam()), gate}));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(GetParam(), 1)));
}

INSTANTIATE_TEST_SUITE_P(Signals, ExecvForwards, testing::Values(SIGINT, SIGTERM));

TEST_F(Execv, TellsTheCallbackTheLastSignal) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] {
    const std::ofstream hold(gate);
    ::raise(SIGTERM);
    ::raise(SIGINT);
  }}});
  const int result = execHelper({"ignore", std::to_string(SIGTERM), gate, "0"});
  EXPECT_EQ(-1, result); // ended by SIGINT
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGINT, -1)));
}

// As soon as a handler is set, it knows the process to forward to.
TEST_F(Execv, ForwardsASignalFromTheMomentItsHandlerIsSet) {
  for (const char *moment : {"signal 2", "signal 15", "sigaction 17 read"}) {
    SCOPED_TRACE(moment);
    const TestFolder folder;
    const int sig = std::strcmp(moment, "signal 2") == 0 ? SIGINT : SIGTERM;
    const CallHook hook(moment, [sig] { ::raise(sig); });
    // The gate is never opened, so only the signal ends the program.
    EXPECT_EQ(-1, execHelper({"ignore", std::to_string(SIGUSR1), makeFifo(folder / "gate"), "0"}));
    EXPECT_THAT(callbacks, ElementsAre(std::make_pair(sig, -1)));
  }
}

TEST_F(Execv, TellsTheCallbackOfASignalThatComesWhenTheProgramHasJustBeenReaped) {
  const CallHook hook("waitpid", [] { ::raise(SIGTERM); });
  LogCapture log;
  EXPECT_EQ(5, execHelper({"exit", "5"}));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGTERM, 5)));
  EXPECT_THAT(log.take(), ElementsAre(notSent(static_cast<unsigned>(lastAwaited()), ESRCH)));
}

// A host may copy the action of SIGTERM to another signal meanwhile.
TEST_F(Execv, TellsTheCallbackOfAnotherSignalWithoutSendingIt) {
  struct sigaction old = {};
  ::sigaction(SIGUSR2, nullptr, &old);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const Recording calls;
  const WaitScript script({{[&] {
    const struct sigaction forwarding = actionNow(SIGTERM);
    ::sigaction(SIGUSR2, &forwarding, nullptr);
    ::raise(SIGUSR2);
    openGate(gate);
  }}});
  EXPECT_EQ(0, execHelper({"count", std::to_string(SIGUSR2), gate}));
  ::sigaction(SIGUSR2, &old, nullptr);
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGUSR2, 0)));
  EXPECT_EQ(0, calls.count("kill child " + std::to_string(SIGUSR2)));
}

TEST_F(Execv, NeedsNoCallback) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] { openGate(gate); }}});
  EXPECT_EQ(6, execHelper({"relay", std::to_string(SIGTERM), gate, "6"}, nullptr));
}

TEST_F(Execv, ForgetsTheSignalOfAnEarlierRun) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  {
    const WaitScript script({{[&] { openGate(gate); }}});
    EXPECT_EQ(0, execHelper({"relay", std::to_string(SIGTERM), gate, "0"}));
  }
  EXPECT_EQ(0, execHelper({"exit", "0"}));
  EXPECT_THAT(callbacks, IsEmpty());
}

TEST_F(Execv, RunsTheCallbackWhileTheSignalsAreStillCaught) {
  setChildFlags(SA_NOCLDWAIT);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] { openGate(gate); }}});
  LogCapture log;
  const auto callback = [](int sig, int result) {
    recordCallback(sig, result);
    EXPECT_FALSE(noChildWait());
    ::raise(SIGTERM); // for the child, which has ended
  };
  EXPECT_EQ(2, execHelper({"relay", std::to_string(SIGINT), gate, "2"}, callback));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGINT, 2)));
  EXPECT_THAT(log.take(), ElementsAre(notSent(static_cast<unsigned>(lastAwaited()), ESRCH)));
  EXPECT_TRUE(noChildWait());
}

TEST_F(Execv, LogsASignalThatCannotBeSentOn) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  LogCapture log;
  const WaitScript script({{[&] {
    const Fault fault("kill", 1, EPERM);
    const std::ofstream hold(gate);
    errno = ENOTTY;
    ::raise(SIGTERM);
    EXPECT_EQ(ENOTTY, errno);
  }}});
  EXPECT_EQ(0, execHelper({"count", std::to_string(SIGTERM), gate}));
  EXPECT_THAT(log.take(), ElementsAre(notSent(static_cast<unsigned>(lastAwaited()), EPERM)));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGTERM, 0)));
}

// The handler of one signal is in syslog, which holds its lock, when the other signal arrives. Its
// handler logs, too, and would wait for that lock for ever.
TEST_F(Execv, LogsOneSignalAfterTheOtherAndNeverInTheMidstOfIt) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  LogCapture log;
  const WaitScript script({{[&] {
    const Fault fault("kill", 1, EPERM, true);
    const std::ofstream hold(gate);
    const Recording calls;
    const LogInterruption other([&calls] {
      ::raise(SIGTERM);
      EXPECT_EQ(0, calls.count("kill child 15"));
    });
    ::raise(SIGINT);
    EXPECT_EQ(1, calls.count("kill child 15"));
  }}});
  EXPECT_EQ(0, execHelper({"count", std::to_string(SIGINT), gate}));
  const LogLine line = notSent(static_cast<unsigned>(lastAwaited()), EPERM);
  EXPECT_THAT(log.take(), ElementsAre(line, line));
  EXPECT_THAT(callbacks, ElementsAre(std::make_pair(SIGTERM, 0)));
}

TEST_F(Execv, LogsAWaitThatGivesZeroWithoutPidAndTag) {
  LogCapture log;
  const WaitScript script({{nullptr, 0, 0}});
  EXPECT_EQ(-1, execHelper({"exit", "0"}));
  EXPECT_THAT(log.take(),
              ElementsAre(bareLine(LOG_ERR, "proc/exec", 94,
                                   "BUG: return value of waitpid is not possible to be 0")));
  EXPECT_EQ(lastAwaited(), ::waitpid(lastAwaited(), nullptr, 0));
}

TEST_F(Execv, WaitsAgainAfterAnInterruption) {
  const WaitScript script({{nullptr, EINTR}, {nullptr, EINTR}});
  EXPECT_EQ(5, execHelper({"exit", "5"}));
  EXPECT_TRUE(script.finished());
}

TEST_F(Execv, WaitsAgainAfterAnyOtherNegativeResult) {
  const WaitScript script({{nullptr, 0, -2}, {nullptr, 0, -77}});
  EXPECT_EQ(5, execHelper({"exit", "5"}));
  EXPECT_TRUE(script.finished());
}

TEST_F(Execv, GivesUpOnAnyOtherFailureOfTheWait) {
  for (const int error : {ECHILD, EINVAL}) {
    const WaitScript script({{nullptr, error}});
    EXPECT_EQ(-1, execHelper({"exit", "5"}));
    EXPECT_TRUE(script.finished());
    EXPECT_EQ(lastAwaited(), ::waitpid(lastAwaited(), nullptr, 0));
  }
}

TEST_F(Execv, GivesMinusOneWhenTheHostIgnoresItsChildren) {
  ::signal(SIGCHLD, SIG_IGN);
  EXPECT_EQ(-1, execHelper({"exit", "5"}));
}

TEST_F(Execv, TakesNoChildWaitOffForTheWaitAndPutsItBack) {
  setChildFlags(SA_NOCLDWAIT | SA_NOCLDSTOP);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] {
    EXPECT_FALSE(noChildWait());
    EXPECT_NE(0, actionNow(SIGCHLD).sa_flags & SA_NOCLDSTOP);
    openGate(gate);
  }}});
  EXPECT_EQ(0, execHelper({"count", std::to_string(SIGUSR1), gate}));
  EXPECT_TRUE(noChildWait());
  EXPECT_NE(0, actionNow(SIGCHLD).sa_flags & SA_NOCLDSTOP);
}

TEST_F(Execv, LeavesNoChildWaitUnsetWhenItWas) {
  setChildFlags(SA_NOCLDSTOP);
  const Recording calls;
  EXPECT_EQ(0, execHelper({"exit", "0"}));
  EXPECT_EQ(1, calls.count("sigaction 17 write")); // before the wait; nothing is to be set after it
  EXPECT_FALSE(noChildWait());
}

TEST_F(Execv, AddsNoChildWaitToTheActionThatTheCallbackLeft) {
  setChildFlags(SA_NOCLDWAIT);
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] { openGate(gate); }}});
  const auto callback = [](int, int) { setChildFlags(SA_NOCLDSTOP); };
  EXPECT_EQ(0, execHelper({"relay", std::to_string(SIGTERM), gate, "0"}, callback));
  EXPECT_TRUE(noChildWait());
  EXPECT_NE(0, actionNow(SIGCHLD).sa_flags & SA_NOCLDSTOP);
}

TEST_F(Execv, WorksOnWithoutAnyOneOfItsSigactionCalls) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  setChildFlags(0);
  forEachFailure("sigaction", EINVAL, [&](Fault &) {
    const WaitScript script({{[&] { openGate(gate); }}});
    EXPECT_EQ(0, execHelper({"count", std::to_string(SIGUSR1), gate}));
  });
  EXPECT_EQ(SIG_DFL, actionNow(SIGCHLD).sa_handler);
}

TEST_F(Execv, WorksOnWithoutAnyOneOfItsSignalCalls) {
  ::signal(SIGTERM, hostHandler);
  forEachFailure("signal", EINVAL, [&](Fault &) { EXPECT_EQ(0, execHelper({"exit", "0"})); });
}

TEST_F(Execv, PutsTheHostsHandlersBack) {
  const std::vector<void (*)(int)> handlers = {SIG_DFL, SIG_IGN, hostHandler};
  for (void (*const handler)(int) : handlers) {
    ::signal(SIGINT, handler);
    ::signal(SIGTERM, handler);
    EXPECT_EQ(0, execHelper({"exit", "0"}));
    EXPECT_EQ(handler, actionNow(SIGINT).sa_handler);
    EXPECT_EQ(handler, actionNow(SIGTERM).sa_handler);
  }
}

TEST_F(Execv, ReapsNoOtherChild) {
  const pid_t other = ::fork();
  if (other == 0) {
    ::_exit(11);
  }
  EXPECT_EQ(0, execHelper({"exit", "0"}));
  int status = 0;
  EXPECT_EQ(other, ::waitpid(other, &status, 0));
  EXPECT_EQ(11, WEXITSTATUS(status));
}

TEST_F(Execv, WaitsForAStoppedProgramUntilItIsContinuedAndEnds) {
  const TestFolder folder;
  const std::string gate = makeFifo(folder / "gate");
  const WaitScript script({{[&] {
    openGate(gate);
    int status = 0;
    ASSERT_EQ(lastAwaited(), ::waitpid(lastAwaited(), &status, WUNTRACED));
    ASSERT_TRUE(WIFSTOPPED(status));
    ::kill(lastAwaited(), SIGCONT);
  }}});
  EXPECT_EQ(8, execHelper({"stop", gate, "8"}));
}

class UtilExecHandlers : public Execv {};

TEST_F(UtilExecHandlers, AreSetAndPutBack) {
  ::signal(SIGINT, hostHandler);
  ::signal(SIGTERM, SIG_IGN);
  UtilExec exec;
  const Recording calls;
  exec.SetSigHandler();
  EXPECT_NE(hostHandler, actionNow(SIGINT).sa_handler);
  EXPECT_EQ(actionNow(SIGINT).sa_handler, actionNow(SIGTERM).sa_handler);
  exec.RestoreSigHandler();
  EXPECT_EQ(hostHandler, actionNow(SIGINT).sa_handler);
  EXPECT_EQ(SIG_IGN, actionNow(SIGTERM).sa_handler);
}

TEST_F(UtilExecHandlers, BecomeTheDefaultWhenNoneAreKept) {
  ::signal(SIGINT, hostHandler);
  ::signal(SIGTERM, hostHandler);
  UtilExec exec;
  exec.SetSigHandler();
  exec.RestoreSigHandler();
  exec.RestoreSigHandler();
  EXPECT_EQ(SIG_DFL, actionNow(SIGINT).sa_handler);
  EXPECT_EQ(SIG_DFL, actionNow(SIGTERM).sa_handler);
}

TEST_F(UtilExecHandlers, OverwriteThoseOfAnotherObject) {
  ::signal(SIGINT, hostHandler);
  UtilExec first;
  UtilExec second;
  first.SetSigHandler();
  void (*const forwarding)(int) = actionNow(SIGINT).sa_handler;
  second.SetSigHandler();
  first.RestoreSigHandler();
  EXPECT_EQ(hostHandler, actionNow(SIGINT).sa_handler);
  second.RestoreSigHandler();
  EXPECT_EQ(forwarding, actionNow(SIGINT).sa_handler);
}

// kill(-1, SIGTERM) would end every process that the caller may signal.
TEST_F(UtilExecHandlers, SignalNobodyWhileNothingRuns) {
  const Fault guard("kill", 1, EPERM, true); // in case it is called after all
  UtilExec exec;
  exec.SetSigHandler();
  const Recording calls;
  LogCapture log;
  ::raise(SIGTERM);
  ::raise(SIGINT);
  EXPECT_THAT(calls.own(), IsEmpty());
  EXPECT_THAT(log.take(), ElementsAre(notSent(4294967295U, ESRCH), notSent(4294967295U, ESRCH)));
  exec.RestoreSigHandler();
}

TEST_F(UtilExecHandlers, SignalNobodyOnceAProgramHasEnded) {
  const Fault guard("kill", 1, EPERM, true);
  UtilExec outer;
  outer.SetSigHandler();
  EXPECT_EQ(0, execHelper({"exit", "0"}));
  LogCapture log;
  ::raise(SIGTERM); // execHelper restored the forwarding handler, which it had found
  EXPECT_THAT(log.take(), ElementsAre(notSent(4294967295U, ESRCH)));
  outer.RestoreSigHandler();
}
