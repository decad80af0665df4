#include "kovabackup/signal.h"

#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <gmock/gmock.h>
#include <string>
#include <utility>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

// The flag that libc sets on every action that it installs.
constexpr int kRestorerFlag = 0x04000000;

volatile std::sig_atomic_t handled = 0;
void countSignal(int sig) {
  handled = handled * 100 + sig;
}
void otherHandler(int) {}

// The system call itself, so that the calls of the tests are neither counted nor made to fail.
int systemSigaction(int sig, const struct sigaction *action, struct sigaction *old) {
  static auto *const real =
      realFunction<int(int, const struct sigaction *, struct sigaction *)>("sigaction");
  return real(sig, action, old);
}

int systemSigprocmask(int how, const sigset_t *set, sigset_t *old) {
  static auto *const real = realFunction<int(int, const sigset_t *, sigset_t *)>("sigprocmask");
  return real(how, set, old);
}

struct sigaction actionNow(int sig) {
  struct sigaction action = {};
  systemSigaction(sig, nullptr, &action);
  return action;
}

int flagsNow(int sig) {
  return actionNow(sig).sa_flags & ~kRestorerFlag;
}

bool maskIsEmpty(const struct sigaction &action) {
  for (int sig = 1; sig < NSIG; ++sig) {
    if (::sigismember(&action.sa_mask, sig) == 1) {
      return false;
    }
  }
  return true;
}

bool isBlocked(int sig) {
  sigset_t mask;
  systemSigprocmask(SIG_SETMASK, nullptr, &mask);
  return ::sigismember(&mask, sig) == 1;
}

// Restores the action of one signal and the mask of the thread.
class KeptAction {
public:
  explicit KeptAction(int sig) : sig_(sig), action_(actionNow(sig)) {
    systemSigprocmask(SIG_SETMASK, nullptr, &mask_);
  }
  ~KeptAction() {
    systemSigaction(sig_, &action_, nullptr);
    systemSigprocmask(SIG_SETMASK, &mask_, nullptr);
  }
  KeptAction(const KeptAction &) = delete;
  KeptAction &operator=(const KeptAction &) = delete;

private:
  int sig_;
  struct sigaction action_;
  sigset_t mask_;
};

// An action that differs from the default in handler, mask and flags.
void setUnusualAction(int sig, int flags) {
  struct sigaction action = {};
  action.sa_handler = countSignal;
  ::sigaddset(&action.sa_mask, SIGUSR2);
  action.sa_flags = flags;
  ASSERT_EQ(0, systemSigaction(sig, &action, nullptr));
}

std::string text(int error) {
  return std::strerror(error);
}

LogLine line(int number, const std::string &message) {
  return errLine("proc/signal", number, message);
}

} // namespace

TEST(SignalHandlerSet, SetsTheHandlerWithAnEmptyMaskAndRestartAsItsOnlyFlag) {
  const KeptAction kept(SIGUSR1);
  setUnusualAction(SIGUSR1, SA_NODEFER | SA_NOCLDWAIT);
  EXPECT_TRUE(signalHandlerSet(SIGUSR1, otherHandler));
  const struct sigaction action = actionNow(SIGUSR1);
  EXPECT_EQ(otherHandler, action.sa_handler);
  EXPECT_EQ(SA_RESTART, flagsNow(SIGUSR1));
  EXPECT_TRUE(maskIsEmpty(action));
}

TEST(SignalHandlerSet, RunsTheHandler) {
  const KeptAction kept(SIGUSR1);
  ASSERT_TRUE(signalHandlerSet(SIGUSR1, countSignal));
  handled = 0;
  ::raise(SIGUSR1);
  EXPECT_EQ(SIGUSR1, handled);
}

TEST(SignalHandlerSet, TakesSigIgnAndSigDfl) {
  const KeptAction kept(SIGUSR1);
  ASSERT_TRUE(signalHandlerSet(SIGUSR1, SIG_IGN));
  EXPECT_EQ(SIG_IGN, actionNow(SIGUSR1).sa_handler);
  ASSERT_TRUE(signalHandlerSet(SIGUSR1, SIG_DFL));
  EXPECT_EQ(SIG_DFL, actionNow(SIGUSR1).sa_handler);
}

TEST(SignalHandlerSet, UnblocksTheSignalAndNoOther) {
  const KeptAction kept(SIGUSR1);
  sigset_t both;
  ::sigemptyset(&both);
  ::sigaddset(&both, SIGUSR1);
  ::sigaddset(&both, SIGUSR2);
  ::sigprocmask(SIG_BLOCK, &both, nullptr);
  EXPECT_TRUE(signalHandlerSet(SIGUSR1, countSignal));
  EXPECT_FALSE(isBlocked(SIGUSR1));
  EXPECT_TRUE(isBlocked(SIGUSR2));
  EXPECT_EQ(SA_RESTART, flagsNow(SIGUSR1));
}

TEST(SignalHandlerSet, DeliversAWaitingSignalToTheOldHandler) {
  const KeptAction kept(SIGUSR1);
  setUnusualAction(SIGUSR1, 0);
  sigset_t one;
  ::sigemptyset(&one);
  ::sigaddset(&one, SIGUSR1);
  ::sigprocmask(SIG_BLOCK, &one, nullptr);
  handled = 0;
  ::raise(SIGUSR1);
  ASSERT_EQ(0, handled);
  EXPECT_TRUE(signalHandlerSet(SIGUSR1, otherHandler));
  EXPECT_EQ(SIGUSR1, handled);
}

TEST(SignalHandlerSet, NamesTheStepThatFailed) {
  const std::pair<const char *, int> steps[] = {
      {"sigemptyset", 17}, {"sigaddset", 21}, {"sigprocmask", 26}, {"sigaction", 36}};
  for (const auto &[function, number] : steps) {
    forEachFailure(function, EPERM, [&, step = std::string(function), at = number](Fault &fault) {
      const KeptAction kept(SIGUSR1);
      LogCapture log;
      errno = 0;
      const bool set = signalHandlerSet(SIGUSR1, countSignal);
      const int error = errno;
      EXPECT_EQ(!fault.fired(), set);
      if (fault.fired()) {
        EXPECT_EQ(EPERM, error);
        const std::string reason = text(EPERM);
        EXPECT_THAT(log.take(),
                    ElementsAre(line(at, step + " [" + std::to_string(SIGUSR1) + "]: " + reason)));
        EXPECT_EQ(SIG_DFL, actionNow(SIGUSR1).sa_handler);
      } else {
        EXPECT_THAT(log.take(), IsEmpty());
      }
    });
  }
}

TEST(SignalHandlerSet, RefusesWhatIsNoSignal) {
  for (const int sig : {0, -1, NSIG}) {
    LogCapture log;
    EXPECT_FALSE(signalHandlerSet(sig, countSignal));
    EXPECT_THAT(log.take(),
                ElementsAre(line(21, "sigaddset [" + std::to_string(sig) + "]: " + text(EINVAL))));
  }
}

TEST(SignalHandlerSet, RefusesSignalsThatCannotBeCaught) {
  for (const int sig : {SIGKILL, SIGSTOP}) {
    LogCapture log;
    EXPECT_FALSE(signalHandlerSet(sig, countSignal));
    EXPECT_THAT(log.take(),
                ElementsAre(line(36, "sigaction [" + std::to_string(sig) + "]: " + text(EINVAL))));
  }
}

TEST(SignalHandlerSetFlags, ReplacesTheFlagsAndKeepsHandlerAndMask) {
  const KeptAction kept(SIGCHLD);
  setUnusualAction(SIGCHLD, SA_RESTART | SA_NOCLDSTOP);
  EXPECT_TRUE(signalHandlerSetFlags(SIGCHLD, SA_NOCLDWAIT));
  EXPECT_EQ(SA_NOCLDWAIT, flagsNow(SIGCHLD));
  const struct sigaction action = actionNow(SIGCHLD);
  EXPECT_EQ(countSignal, action.sa_handler);
  EXPECT_EQ(1, ::sigismember(&action.sa_mask, SIGUSR2));
}

TEST(SignalHandlerAddFlags, AddsToTheFlagsAndTellsTheOldOnes) {
  const KeptAction kept(SIGCHLD);
  setUnusualAction(SIGCHLD, SA_NOCLDSTOP);
  int old = -1;
  EXPECT_TRUE(signalHandlerAddFlags(SIGCHLD, SA_NOCLDWAIT | SA_RESTART, old));
  EXPECT_EQ(SA_NOCLDSTOP, old & ~kRestorerFlag);
  EXPECT_EQ(SA_NOCLDSTOP | SA_NOCLDWAIT | SA_RESTART, flagsNow(SIGCHLD));
  const struct sigaction action = actionNow(SIGCHLD);
  EXPECT_EQ(countSignal, action.sa_handler);
  EXPECT_EQ(1, ::sigismember(&action.sa_mask, SIGUSR2));
}

TEST(SignalHandlerAddFlags, KeepsAFlagThatIsSetAlready) {
  const KeptAction kept(SIGCHLD);
  setUnusualAction(SIGCHLD, SA_RESTART | SA_NOCLDSTOP);
  int old = -1;
  EXPECT_TRUE(signalHandlerAddFlags(SIGCHLD, SA_RESTART | SA_NOCLDWAIT, old));
  EXPECT_EQ(SA_RESTART | SA_NOCLDSTOP, old & ~kRestorerFlag);
  EXPECT_EQ(SA_RESTART | SA_NOCLDSTOP | SA_NOCLDWAIT, flagsNow(SIGCHLD));
}

TEST(SignalHandlerRemoveFlags, ClearsTheGivenFlagsAndTellsTheOldOnes) {
  const KeptAction kept(SIGCHLD);
  setUnusualAction(SIGCHLD, SA_NOCLDWAIT | SA_RESTART);
  int old = -1;
  EXPECT_TRUE(signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, old));
  EXPECT_EQ(SA_NOCLDWAIT | SA_RESTART, old & ~kRestorerFlag);
  EXPECT_EQ(SA_RESTART, flagsNow(SIGCHLD));
  const struct sigaction action = actionNow(SIGCHLD);
  EXPECT_EQ(countSignal, action.sa_handler);
  EXPECT_EQ(1, ::sigismember(&action.sa_mask, SIGUSR2));
}

TEST(SignalHandlerRemoveFlags, SucceedsWhenTheFlagIsNotSet) {
  const KeptAction kept(SIGCHLD);
  setUnusualAction(SIGCHLD, SA_RESTART);
  int old = -1;
  EXPECT_TRUE(signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, old));
  EXPECT_EQ(SA_RESTART, old & ~kRestorerFlag);
  EXPECT_EQ(SA_RESTART, flagsNow(SIGCHLD));
}

TEST(SignalHandlerFlags, ArePutBackWithTheOldOnes) {
  const KeptAction kept(SIGCHLD);
  for (const int flags : {0, SA_NOCLDWAIT, SA_NOCLDSTOP | SA_NOCLDWAIT | SA_RESTART}) {
    setUnusualAction(SIGCHLD, flags);
    int old = 0;
    EXPECT_TRUE(signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, old));
    EXPECT_TRUE(signalHandlerSetFlags(SIGCHLD, old));
    EXPECT_EQ(flags, flagsNow(SIGCHLD));
    EXPECT_TRUE(signalHandlerAddFlags(SIGCHLD, SA_NODEFER, old));
    EXPECT_TRUE(signalHandlerSetFlags(SIGCHLD, old));
    EXPECT_EQ(flags, flagsNow(SIGCHLD));
  }
}

namespace {

// Makes first the reading and then the writing of an action fail, and checks what the function
// reports; an old value of -1 means that it is unchanged.
template <typename Change>
void expectFlagFailures(int reading, int writing, int oldAfterWriting, Change change) {
  forEachFailure("sigaction", EINVAL, [&](Fault &fault) {
    const KeptAction kept(SIGCHLD);
    LogCapture log;
    errno = 0;
    int old = -1;
    const bool changed = change(old);
    const int error = errno;
    EXPECT_EQ(!fault.fired(), changed);
    if (!fault.fired()) {
      EXPECT_THAT(log.take(), IsEmpty());
      return;
    }
    EXPECT_EQ(EINVAL, error);
    if (fault.calls() == 1) {
      EXPECT_EQ(-1, old);
      EXPECT_THAT(log.take(),
                  ElementsAre(line(reading, "sigaction get org failed: " + text(EINVAL))));
    } else {
      EXPECT_EQ(2, fault.calls());
      EXPECT_EQ(oldAfterWriting, old == -1 ? old : old & ~kRestorerFlag);
      EXPECT_THAT(log.take(),
                  ElementsAre(line(writing, "sigaction set flags failed: " + text(EINVAL))));
    }
  });
}

} // namespace

TEST(SignalHandlerSetFlags, NamesReadingOrWritingWhenItFails) {
  expectFlagFailures(49, 56, -1, [](int &) { return signalHandlerSetFlags(SIGCHLD, SA_RESTART); });
}

TEST(SignalHandlerAddFlags, NamesReadingOrWritingWhenItFails) {
  const int flags = flagsNow(SIGCHLD);
  expectFlagFailures(68, 77, flags,
                     [](int &old) { return signalHandlerAddFlags(SIGCHLD, SA_RESTART, old); });
}

TEST(SignalHandlerRemoveFlags, NamesReadingOrWritingWhenItFails) {
  const int flags = flagsNow(SIGCHLD);
  expectFlagFailures(89, 98, flags,
                     [](int &old) { return signalHandlerRemoveFlags(SIGCHLD, SA_RESTART, old); });
}

TEST(SignalHandlerFlags, CannotBeChangedForSigkill) {
  LogCapture log;
  int old = -1;
  EXPECT_FALSE(signalHandlerSetFlags(SIGKILL, 0));
  EXPECT_FALSE(signalHandlerAddFlags(SIGKILL, SA_RESTART, old));
  EXPECT_FALSE(signalHandlerRemoveFlags(SIGKILL, SA_RESTART, old));
  EXPECT_EQ(0, old);
  const std::string message = "sigaction set flags failed: " + text(EINVAL);
  EXPECT_THAT(log.take(), ElementsAre(line(56, message), line(77, message), line(98, message)));
}

TEST(ScopedTempSigHandler, ReplacesTheActionUntilItGoes) {
  const KeptAction kept(SIGUSR1);
  setUnusualAction(SIGUSR1, SA_NODEFER);
  {
    ScopedTempSigHandler scoped;
    EXPECT_TRUE(scoped.setSignalHandler(SIGUSR1, SA_NOCLDSTOP, otherHandler));
    const struct sigaction action = actionNow(SIGUSR1);
    EXPECT_EQ(otherHandler, action.sa_handler);
    EXPECT_EQ(SA_NOCLDSTOP, flagsNow(SIGUSR1));
    EXPECT_TRUE(maskIsEmpty(action));
  }
  const struct sigaction action = actionNow(SIGUSR1);
  EXPECT_EQ(countSignal, action.sa_handler);
  EXPECT_EQ(SA_NODEFER, flagsNow(SIGUSR1));
  EXPECT_EQ(1, ::sigismember(&action.sa_mask, SIGUSR2));
}

TEST(ScopedTempSigHandler, PutsTheFirstActionBackWhateverCameSince) {
  const KeptAction kept(SIGUSR1);
  setUnusualAction(SIGUSR1, SA_NODEFER);
  {
    ScopedTempSigHandler scoped;
    EXPECT_TRUE(scoped.setSignalHandler(SIGUSR1, 0, otherHandler));
    ::signal(SIGUSR1, SIG_IGN);
  }
  EXPECT_EQ(countSignal, actionNow(SIGUSR1).sa_handler);
}

TEST(ScopedTempSigHandler, ServesOneReplacementOnly) {
  const KeptAction keptOne(SIGUSR1);
  const KeptAction keptTwo(SIGUSR2);
  {
    ScopedTempSigHandler scoped;
    ASSERT_TRUE(scoped.setSignalHandler(SIGUSR1, 0, otherHandler));
    for (const int sig : {SIGUSR1, SIGUSR2}) {
      LogCapture log;
      EXPECT_FALSE(scoped.setSignalHandler(sig, SA_RESTART, countSignal));
      EXPECT_THAT(log.take(),
                  ElementsAre(line(124, "failed to set signal handler: original signum [" +
                                            std::to_string(SIGUSR1) + "]")));
    }
    EXPECT_EQ(otherHandler, actionNow(SIGUSR1).sa_handler);
    EXPECT_EQ(0, flagsNow(SIGUSR1));
    EXPECT_EQ(SIG_DFL, actionNow(SIGUSR2).sa_handler);
  }
  EXPECT_EQ(SIG_DFL, actionNow(SIGUSR1).sa_handler);
}

TEST(ScopedTempSigHandler, ChangesNothingWhenNeverSet) {
  const KeptAction kept(SIGUSR1);
  const Fault count("sigaction", 0, 0);
  { const ScopedTempSigHandler scoped; }
  EXPECT_EQ(0, count.calls());
}

TEST(ScopedTempSigHandler, SaysTrueOfASignalThatTheSystemRefuses) {
  for (const int sig : {SIGKILL, NSIG}) {
    ScopedTempSigHandler scoped;
    EXPECT_TRUE(scoped.setSignalHandler(sig, 0, countSignal));
    LogCapture log;
    EXPECT_FALSE(scoped.setSignalHandler(SIGUSR1, 0, countSignal));
    EXPECT_THAT(log.take(),
                ElementsAre(line(124, "failed to set signal handler: original signum [" +
                                          std::to_string(sig) + "]")));
  }
}

TEST(ScopedTempSigHandler, StaysUnusedAfterASignalBelowOne) {
  const KeptAction kept(SIGUSR1);
  ScopedTempSigHandler scoped;
  EXPECT_TRUE(scoped.setSignalHandler(0, 0, countSignal));
  EXPECT_TRUE(scoped.setSignalHandler(-1, 0, countSignal));
  EXPECT_TRUE(scoped.setSignalHandler(SIGUSR1, 0, countSignal));
  EXPECT_EQ(countSignal, actionNow(SIGUSR1).sa_handler);
}

TEST(ScopedTempSigHandler, SavesAndReplacesInOneCall) {
  const KeptAction kept(SIGUSR1);
  Fault count("sigaction", 0, 0);
  {
    ScopedTempSigHandler scoped;
    EXPECT_TRUE(scoped.setSignalHandler(SIGUSR1, 0, countSignal));
    EXPECT_EQ(1, count.calls());
  }
  EXPECT_EQ(2, count.calls());
}
