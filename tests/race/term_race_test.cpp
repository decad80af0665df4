// SIGTERM at random moments of a command: while it is forked, runs, has ended, and just before and
// after that.

#include "kovabackup/exec.h"
#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"
#include "tests/proc/process_helper.h"
#include "tests/race/race_support.h"
#include "tests/support/census.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <ctime>
#include <functional>
#include <gmock/gmock.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

using namespace KovaTest;

namespace {

using KOVA::Backup::SubProcess;
using KOVA::Backup::UtilExec;
using KOVA::Backup::Service::Cancel;
using KOVA::Backup::Service::Command;
using KOVA::Backup::Service::Result;
using Clock = std::chrono::steady_clock;

constexpr int kExitCode = 3;
const std::vector<std::string> kShort = {kHelper, "exit", "3"};

volatile std::sig_atomic_t hostSignals = 0;
Cancel *volatile toCancel = nullptr;

void hostHandler(int) {
  hostSignals = hostSignals + 1;
  if (toCancel != nullptr) {
    toCancel->request();
  }
}

// The host's handler of SIGTERM for its lifetime, set by signal(2), which is all that Execv
// restores.
class HostHandler {
public:
  HostHandler() : before_(std::signal(SIGTERM, hostHandler)) {}
  ~HostHandler() { (void)std::signal(SIGTERM, before_); }
  HostHandler(const HostHandler &) = delete;
  HostHandler &operator=(const HostHandler &) = delete;

  static bool isSet() {
    struct sigaction action = {};
    return ::sigaction(SIGTERM, nullptr, &action) == 0 && action.sa_handler == hostHandler;
  }

private:
  void (*const before_)(int);
};

// Sends this process a SIGTERM after a while, unless it is destroyed before.
class TermTimer {
public:
  explicit TermTimer(std::chrono::nanoseconds after) {
    struct sigevent event = {};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGTERM;
    EXPECT_EQ(0, ::timer_create(CLOCK_MONOTONIC, &event, &timer_));
    struct itimerspec when = {};
    when.it_value.tv_sec = static_cast<time_t>(after.count() / 1000000000);
    when.it_value.tv_nsec = static_cast<long>(after.count() % 1000000000) + 1; // 0 would disarm it
    EXPECT_EQ(0, ::timer_settime(timer_, 0, &when, nullptr));
  }
  ~TermTimer() { ::timer_delete(timer_); }
  TermTimer(const TermTimer &) = delete;
  TermTimer &operator=(const TermTimer &) = delete;

private:
  timer_t timer_{};
};

// Lets this process reap what a host leaves behind.
class Subreaper {
public:
  Subreaper() { EXPECT_EQ(0, ::prctl(PR_SET_CHILD_SUBREAPER, 1)); }
  ~Subreaper() { EXPECT_EQ(0, ::prctl(PR_SET_CHILD_SUBREAPER, 0)); }
  Subreaper(const Subreaper &) = delete;
  Subreaper &operator=(const Subreaper &) = delete;
};

bool hasChildren() {
  siginfo_t info = {};
  return ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT) == 0 || errno != ECHILD;
}

// Random moments that reach from just before an action to some time after it.
class Moments {
public:
  explicit Moments(const std::function<void()> &action) : random_(printedSeed()) {
    std::vector<Clock::duration> times;
    for (int i = 0; i < 21; ++i) {
      const Clock::time_point begin = Clock::now();
      action();
      times.push_back(Clock::now() - begin);
    }
    std::sort(times.begin(), times.end());
    longest_ = times[times.size() / 2] * 3 / 2;
  }
  std::chrono::nanoseconds next() {
    return std::chrono::nanoseconds(random_() % static_cast<unsigned long long>(longest_.count()));
  }

private:
  std::mt19937 random_;
  std::chrono::nanoseconds longest_{};
};

// What a round did, beyond its result.
struct Round {
  int signals = 0; // that the host's handler saw
  bool clean = false;
};

Round runRound(std::chrono::nanoseconds moment, const std::function<void()> &action) {
  const int before = countOpenDescriptors();
  hostSignals = 0;
  {
    const TermTimer timer(moment);
    action();
  }
  return {hostSignals, !hasChildren() && countOpenDescriptors() == before && HostHandler::isSet()};
}

} // namespace

TEST(TermRace, OfACallReachesTheHostAndEndsNothingElse) {
  const HostHandler handler;
  const SubProcess command(kShort);
  Moments moments([&] { EXPECT_EQ(kExitCode, WEXITSTATUS(command.call())); });
  const int rounds = share(300, 2000);
  int sent = 0;
  int ended = 0;
  for (int i = 0; i < rounds; ++i) {
    int status = -1;
    const Round round = runRound(moments.next(), [&] { status = command.call(); });
    const bool terminated = WIFSIGNALED(status) && WTERMSIG(status) == SIGTERM;
    EXPECT_TRUE(terminated || (WIFEXITED(status) && WEXITSTATUS(status) == kExitCode)) << status;
    EXPECT_TRUE(round.signals == 1 || (round.signals == 0 && !terminated)) << round.signals;
    EXPECT_TRUE(round.clean);
    sent += round.signals;
    ended += terminated ? 1 : 0;
  }
  std::printf("%d calls, %d signals, %d ended by one\n", rounds, sent, ended);
  EXPECT_LT(0, ended);
  EXPECT_LT(ended, rounds);
}

namespace {

int forwarded = 0;
int forwardedResult = 0;

void onForwarded(int sig, int result) {
  EXPECT_EQ(SIGTERM, sig);
  ++forwarded;
  forwardedResult = result;
}

int execShort() {
  const std::vector<char *> argv = argumentVector(kShort);
  forwarded = 0;
  return UtilExec().Execv(argv[0], argv.data(), onForwarded);
}

bool isNotForwarded(const std::vector<LogLine> &log) {
  return log.size() == 1 && log[0].text.find("proc/exec:22 failed to signal") != std::string::npos;
}

} // namespace

// A signal is the host's or the program's. One that comes when the program has ended is logged.
TEST(TermRace, OfExecvReachesEitherTheHostOrTheProgram) {
  const HostHandler handler;
  LogCapture log;
  Moments moments([&] { EXPECT_EQ(kExitCode, execShort()); });
  const int rounds = share(300, 2000);
  int ended = 0;
  int late = 0;
  for (int i = 0; i < rounds; ++i) {
    int code = -2;
    const Round round = runRound(moments.next(), [&] { code = execShort(); });
    const std::vector<LogLine> lines = log.take();
    const bool notForwarded = isNotForwarded(lines);
    EXPECT_TRUE(lines.empty() || notForwarded) << lines[0];
    EXPECT_TRUE(code == kExitCode || code == -1) << code;
    EXPECT_GE(1, round.signals + forwarded);
    EXPECT_TRUE(!notForwarded || round.signals == 0) << "it is the host's or the program's";
    if (code == -1) {
      EXPECT_EQ(1, forwarded);
    }
    if (forwarded == 1) {
      EXPECT_EQ(code, forwardedResult);
    }
    EXPECT_TRUE(round.clean);
    ended += code == -1 ? 1 : 0;
    late += notForwarded ? 1 : 0;
  }
  std::printf("%d runs, %d ended by the signal, %d signals were late\n", rounds, ended, late);
  EXPECT_LT(0, ended);
  EXPECT_LT(ended, rounds);
}

// The command would run for a quarter of an hour, so it is the signal that ends every run.
TEST(TermRace, OfACommandCancelsIt) {
  const HostHandler handler;
  const Subreaper reaper;
  Moments moments([] { EXPECT_EQ(kExitCode, Command(kShort).run().code); });
  const int rounds = share(300, 2000);
  int notStarted = 0;
  for (int i = 0; i < rounds; ++i) {
    const bool group = i % 2 == 1;
    Cancel cancel;
    toCancel = &cancel;
    Command command({"/bin/sh", "-c", group ? "sleep 1000 & wait" : "exec sleep 1000"});
    command.ownGroup(group).cancelledBy(cancel).capture(KOVA::Backup::Service::Stream::Out, 100);
    Result result;
    const std::chrono::nanoseconds moment = moments.next();
    const Round round = runRound(moment, [&] {
      result = command.run();
      while (group && ::waitpid(-1, nullptr, 0) > 0) { // its own child, which is ours then
      }
    });
    toCancel = nullptr;
    EXPECT_TRUE(result.cancelled);
    const bool unstarted = result.end == Result::End::NotStarted;
    EXPECT_TRUE(unstarted || (result.end == Result::End::Signalled && result.code == SIGTERM))
        << static_cast<int>(result.end) << " " << result.code;
    EXPECT_FALSE(result.killed);
    EXPECT_EQ(1, round.signals);
    EXPECT_TRUE(round.clean);
    notStarted += unstarted ? 1 : 0;
  }
  std::printf("%d commands, %d were not started\n", rounds, notStarted);
}

namespace {

// Runs a host that does not handle SIGTERM. Returns: its wait status.
int hostStatus(std::chrono::nanoseconds moment, const std::function<int()> &action) {
  const pid_t host = ::fork();
  if (host == 0) {
    const TermTimer timer(moment);
    ::_exit(action());
  }
  int status = -1;
  EXPECT_EQ(host, ::waitpid(host, &status, 0));
  return status;
}

} // namespace

// What the host has started is killed with it, and the wait below ends. A child whose host is gone
// before it can ask to be killed with it ends by itself instead of executing the program.
TEST(TermRace, ThatKillsAHostKillsItsCommandToo) {
  constexpr int kHostIsGone = 127;
  const Subreaper reaper;
  Moments moments([] { EXPECT_EQ(kExitCode, Command(kShort).run().code); });
  const int rounds = share(300, 2000);
  int left = 0;
  for (int i = 0; i < rounds; ++i) {
    const int status = hostStatus(moments.next(), [] {
      (void)Command({"/bin/sleep", "1000"}).run();
      return 1;
    });
    EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGTERM) << status;
    int orphan = 0;
    while (::waitpid(-1, &orphan, 0) > 0) {
      const bool executed = !WIFEXITED(orphan) || WEXITSTATUS(orphan) != kHostIsGone;
      EXPECT_TRUE(WIFSIGNALED(orphan) || !executed) << orphan;
      left += executed ? 1 : 0;
    }
  }
  std::printf("%d hosts, %d had started their command\n", rounds, left);
  EXPECT_LT(0, left);
}

// A host without a handler is ended by a signal that comes before the wait begins; later ones are
// the command's.
TEST(TermRace, OfACallEndsEitherTheHostOrTheCommand) {
  const Subreaper reaper;
  const SubProcess command(kShort);
  Moments moments([&] { EXPECT_EQ(kExitCode, WEXITSTATUS(command.call())); });
  const int rounds = share(300, 2000);
  int hosts = 0;
  int commands = 0;
  for (int i = 0; i < rounds; ++i) {
    const int status = hostStatus(moments.next(), [&] {
      const int result = command.call();
      (void)std::signal(SIGTERM, SIG_IGN);
      return WIFEXITED(result) ? WEXITSTATUS(result) : WTERMSIG(result);
    });
    const bool hostEnded = WIFSIGNALED(status) && WTERMSIG(status) == SIGTERM;
    const int result = WEXITSTATUS(status);
    EXPECT_TRUE(hostEnded || (WIFEXITED(status) && (result == kExitCode || result == SIGTERM)))
        << status;
    while (::waitpid(-1, nullptr, 0) > 0) { // a command whose host was ended ends by itself
    }
    hosts += hostEnded ? 1 : 0;
    commands += !hostEnded && result == SIGTERM ? 1 : 0;
  }
  std::printf("%d calls, %d hosts ended, %d commands ended\n", rounds, hosts, commands);
  EXPECT_LT(0, hosts);
  EXPECT_LT(0, commands);
}
