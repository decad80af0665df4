// Command where the kernel, the host or the caller leaves it less than usual: memory that is not
// shared, refused pidfd calls, closed standard descriptors, a failure whose name cannot be stored.

#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/fault.h"

#include <cerrno>
#include <cstdarg>
#include <functional>
#include <optional>
#include <poll.h>
#include <sched.h>
#include <sys/ioctl.h> // gives the function below its name on every machine

using namespace KovaTest;
using KOVA::Backup::Service::runPipeline;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

bool cloneSharesNothing = false;
int moreCloneFlags = 0;
std::function<void()> beforeClone;
std::function<void()> beforeIoctl;

// Forks a process that has all descriptors of this one until the gate's write end is closed here;
// its exit status is 1 if that takes too long.
pid_t forkHolder(Pipe &gate) {
  const pid_t holder = ::fork();
  if (holder == 0) {
    gate.closeWriteEnd();
    struct pollfd end = {gate.readEnd(), POLLIN, 0};
    ::_exit(::poll(&end, 1, 30000) == 1 ? 0 : 1);
  }
  return holder;
}

class CommandSurroundings : public CommandTest {
protected:
  void SetUp() override {
    if (kBuiltWithSanitizer) {
      GTEST_SKIP() << "skipped: the child of a sanitizer's program does not share our memory";
    }
  }

  static bool hasNoChild() {
    siginfo_t info;
    return ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT) == -1 && errno == ECHILD;
  }
};

// A stop fails in a way that only the pidfd can show, since the status cannot be examined. The
// command ends by itself.
class CommandStopFailure : public CommandSurroundings {
protected:
  Result stopInVain() {
    const Fault unexamined("waitid", 1, ECHILD, true);
    const Fault refused("pidfd_send_signal", 1, EPERM, true);
    Command command({"/bin/sleep", "0.05"});
    return command.ownGroup().limit(Millis(0)).run();
  }
};

} // namespace

extern "C" int clone(int (*function)(void *), void *stack, int flags, void *argument,
                     ...) noexcept {
  using Clone = int(int (*)(void *), void *, int, void *, ...);
  va_list args;
  va_start(args, argument);
  void *const pidfd = va_arg(args, void *);
  va_end(args);
  if (beforeClone) {
    beforeClone();
  }
  const int fewer = cloneSharesNothing ? flags & ~(CLONE_VM | CLONE_VFORK) : flags;
  const int used = fewer | moreCloneFlags;
  return failsNow("clone") ? -1
                           : realFunction<Clone>("clone")(function, stack, used, argument, pidfd);
}

extern "C" int ioctl(int fd, unsigned long request, ...) noexcept {
  va_list args;
  va_start(args, request);
  void *const argument = va_arg(args, void *);
  va_end(args);
  if (beforeIoctl) {
    beforeIoctl();
  }
  return failsNow("ioctl")
             ? -1
             : realFunction<int(int, unsigned long, ...)>("ioctl")(fd, request, argument);
}

// As under valgrind. The report of the child is waited for then.
TEST_F(CommandSurroundings, RunsWhereTheChildSharesNoMemory) {
  cloneSharesNothing = true;
  const Result result = helper({"copy"}).input("text").capture(Stream::Out, 100).run();
  const Result absent = Command({"/tmp/absent"}).run();
  cloneSharesNothing = false;
  EXPECT_TRUE(result.ok());
  EXPECT_EQ("text", result.out.text);
  EXPECT_EQ(End::NotStarted, absent.end);
  EXPECT_EQ(ENOENT, absent.error.code);
  EXPECT_THAT(log_.take(),
              ElementsAre(notExecuted("/tmp/absent", "execve", "/tmp/absent", ENOENT)));
}

TEST_F(CommandSurroundings, LearnsOfAFailureWhoseReportASignalInterrupts) {
  const Fault interrupted("write", 1, EINTR);
  const Result absent = Command({"/tmp/absent"}).run();
  EXPECT_EQ(2, interrupted.calls());
  EXPECT_EQ(End::NotStarted, absent.end);
  EXPECT_EQ(ENOENT, absent.error.code);
  EXPECT_THAT(log_.take(),
              ElementsAre(notExecuted("/tmp/absent", "execve", "/tmp/absent", ENOENT)));
}

TEST_F(CommandSurroundings, ReapsAChildThatExecutesNothingEvenIfASignalInterrupts) {
  const Fault interrupted("waitid", 1, EINTR);
  EXPECT_EQ(End::NotStarted, Command({"/tmp/absent"}).run().end);
  EXPECT_EQ(2, interrupted.calls());
  EXPECT_TRUE(hasNoChild());
  EXPECT_THAT(log_.take(), SizeIs(1));
}

TEST_F(CommandSurroundings, WaitsForTheReportOnWhenASignalInterruptsThat) {
  cloneSharesNothing = true;
  const Fault interrupted("poll", 1, EINTR);
  const Result absent = Command({"/tmp/absent"}).run();
  cloneSharesNothing = false;
  EXPECT_EQ(2, interrupted.calls());
  EXPECT_EQ(End::NotStarted, absent.end);
  EXPECT_EQ(ENOENT, absent.error.code);
  EXPECT_THAT(log_.take(),
              ElementsAre(notExecuted("/tmp/absent", "execve", "/tmp/absent", ENOENT)));
}

// As a process that another thread forks between the creation of the report's pipe and that of the
// child.
TEST_F(CommandSurroundings, StartsWhileAnotherProcessHoldsThePipeOfTheReport) {
  Pipe gate;
  pid_t holder = -1;
  beforeClone = [&] { holder = forkHolder(gate); };
  Running running = helper({"copy"}).input("text").capture(Stream::Out, 100).start();
  beforeClone = nullptr;
  gate.closeWriteEnd();
  int status = -1;
  ASSERT_EQ(holder, ::waitpid(holder, &status, 0));
  EXPECT_EQ(0, status) << "start has waited for the holder";
  EXPECT_EQ("text", running.wait().out.text);
}

TEST_F(CommandSurroundings, NamesTheClosedStandardInputThatWasToBeHandedOn) {
  const int code = runInChild([&] {
    ::close(STDIN_FILENO);
    const Result result = helper({"copy"}).inputFd(STDIN_FILENO).run();
    const bool reported = result.end == End::NotStarted && result.error.code == EBADF &&
                          result.error.step == "fcntl" && result.error.path == "0";
    return reported ? 0 : 1;
  });
  EXPECT_EQ(0, code);
}

TEST_F(CommandSurroundings, IsKilledByItsNumberWhereThePidfdIsRefused) {
  Pipe gate; // the command would wait for its end
  const Fault report("read", 1, EIO);
  const Fault byPidfd("pidfd_send_signal", 1, EPERM);
  const Fault byNumber("kill", 2, EPERM);
  const Result result = helper({"await", "8"}).passFd(gate.readEnd(), 8).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ("read", result.error.step);
  EXPECT_EQ(1, byNumber.calls());
  EXPECT_TRUE(hasNoChild());
  EXPECT_THAT(log_.take(), SizeIs(1));
}

TEST_F(CommandSurroundings, IsKilledByItsNumberWhateverRefusesThePidfd) {
  Pipe gate; // the command would wait for its end
  const Fault report("read", 1, EIO);
  const Fault byPidfd("pidfd_send_signal", 1, EINVAL);
  const Fault byNumber("kill", 2, EPERM);
  const Result result = helper({"await", "8"}).passFd(gate.readEnd(), 8).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(1, byNumber.calls());
  EXPECT_TRUE(hasNoChild());
  EXPECT_THAT(log_.take(), SizeIs(1));
}

// A child that holds the stream keeps it open, so what is left in it is read at the end.
TEST_F(CommandSurroundings, IsReportedWhenTheRestOfTheOutputCannotBeRead) {
  Pipe gate;
  Pipe held;
  std::optional<Fault> unreadable;
  const Fault unsized("ioctl", 1, EINVAL);
  beforeIoctl = [&] { unreadable.emplace("read", 1, EIO); };
  Command command = helper({"leave", "8"});
  command.passFd(gate.readEnd(), 8).passFd(held.writeEnd(), 9).capture(Stream::Out, 100);
  const Result result = command.run();
  beforeIoctl = nullptr;
  unreadable.reset();
  gate.closeWriteEnd();
  EXPECT_EQ("", held.readToEnd());
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(EIO, result.error.code);
  EXPECT_EQ("read", result.error.step);
}

TEST_F(CommandSurroundings, IsNoMatterWhenAStreamIsEmptyAfterAll) {
  for (int nth = 1; nth <= 3; ++nth) {
    const Fault fault("read", nth, EAGAIN);
    const Result result = helper({"copy"}).input("text").capture(Stream::Out, 100).run();
    EXPECT_TRUE(result.ok()) << nth;
    EXPECT_EQ("text", result.out.text) << nth;
  }
}

// The first process of a PID namespace has no parent that it could see.
TEST_F(CommandSurroundings, RunsInAPidNamespaceOfItsOwn) {
  if (::geteuid() != 0) {
    GTEST_SKIP() << "skipped: only root may make a PID namespace";
  }
  moreCloneFlags = CLONE_NEWPID;
  const Result result = helper({"copy"}).input("text").capture(Stream::Out, 100).run();
  moreCloneFlags = 0;
  EXPECT_TRUE(result.ok()) << result.error.step << " " << result.error.code;
  EXPECT_EQ("text", result.out.text);
}

TEST_F(CommandSurroundings, PassesOnTheStandardInputOfTheCaller) {
  const int flags = ::fcntl(STDIN_FILENO, F_GETFD);
  ASSERT_EQ(0, ::fcntl(STDIN_FILENO, F_SETFD, FD_CLOEXEC));
  const Result result = helper({"copy"}).inputFd(STDIN_FILENO).run();
  EXPECT_EQ(0, ::fcntl(STDIN_FILENO, F_SETFD, flags));
  EXPECT_TRUE(result.ok()) << result.code; // it could not read a closed descriptor
}

// The numbers of closed standard descriptors are those of the command, so nothing else may have
// them.
TEST_F(CommandSurroundings, IsReportedWhenADescriptorCannotLeaveTheStandardOnes) {
  const int code = runInChild([&] {
    ::close(STDIN_FILENO);
    const Fault fault("fcntl", 1, EMFILE);
    const Result result = helper({"copy"}).run();
    const bool reported = result.end == End::NotStarted && result.error.code == EMFILE &&
                          result.error.step == "fcntl";
    return reported ? 0 : 1;
  });
  EXPECT_EQ(0, code);
}

TEST_F(CommandSurroundings, IsReportedWhereverADescriptorCannotLeaveTheStandardOnes) {
  const int code = runInChild([&] {
    ::close(STDIN_FILENO);
    ::close(STDOUT_FILENO);
    for (int nth = 1;; ++nth) {
      const Fault fault("fcntl", nth, EMFILE);
      const Result result = helper({"copy"}).input("text").capture(Stream::Out, 9).run();
      if (!fault.fired()) {
        return result.out.text == "text" && nth > 4 ? 0 : 1;
      }
      if (result.end != End::NotStarted || result.error.code != EMFILE ||
          result.error.step != "fcntl") {
        return 10 + nth;
      }
    }
  });
  EXPECT_EQ(0, code);
}

TEST_F(CommandSurroundings, RunsWithTheStandardDescriptorsClosed) {
  const int code = runInChild([&] {
    ::close(STDIN_FILENO);
    ::close(STDOUT_FILENO);
    return helper({"copy"}).input("text").capture(Stream::Out, 9).run().out.text == "text" ? 0 : 1;
  });
  EXPECT_EQ(0, code);
}

TEST_F(CommandSurroundings, NothingOfAPipelineRunsWithoutAPipe) {
  const Fault fault("pipe2", 1, EMFILE);
  const Command first = helper({"copy"});
  const Command second = helper({"copy"});
  const std::vector<Result> results = runPipeline({&first, &second});
  ASSERT_THAT(results, SizeIs(2));
  EXPECT_EQ(End::NotStarted, results[0].end);
  EXPECT_EQ(EMFILE, results[0].error.code);
  EXPECT_EQ("pipe2", results[0].error.step);
  EXPECT_EQ(End::NotStarted, results[1].end);
  EXPECT_EQ(ECANCELED, results[1].error.code);
  EXPECT_THAT(log_.take(), ElementsAre(notStarted(kCommandHelper, "pipe2", "", EMFILE)));
}

// The command writes and waits, so its output is read while it runs.
TEST_F(CommandSurroundings, IsReportedWhenTheOutputOfARunningCommandCannotBeRead) {
  const Fault fault("read", 2, EIO); // the first call reads the report of the child
  Pipe gate;
  Command command = helper({"await", "8"});
  command.passFd(gate.readEnd(), 8).capture(Stream::Out, 100);
  command.every(Millis(1), [&] { fault.fired() ? gate.closeWriteEnd() : void(); });
  const Result result = command.run();
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(EIO, result.error.code);
  EXPECT_EQ("read", result.error.step);
}

TEST_F(CommandStopFailure, IsReportedWhenOnlyThePidfdNamesTheGroup) {
  const Result result = stopInVain();
  EXPECT_EQ(EPERM, result.error.code);
  EXPECT_EQ("pidfd_send_signal", result.error.step);
  EXPECT_TRUE(hasNoChild());
}

TEST_F(CommandStopFailure, IsNoneWhenTheGroupIsGone) {
  const Fault unexamined("waitid", 1, ECHILD, true);
  const Fault gone("pidfd_send_signal", 1, ESRCH, true);
  Command command({"/bin/sleep", "0.05"});
  const Result result = command.ownGroup().limit(Millis(0)).run();
  EXPECT_TRUE(gone.fired());
  EXPECT_TRUE(result.timedOut);
  EXPECT_EQ(0, result.error.code);
  EXPECT_EQ("", result.error.step);
}

TEST_F(CommandStopFailure, IsNoneWhenTheGroupWasKilledWithIt) {
  Pipe gate;
  Cancel cancel;
  const Fault refused("pidfd_send_signal", 1, EINVAL, true);
  Command command = helper({"await", "8", std::to_string(SIGTERM)});
  command.passFd(gate.readEnd(), 8).ownGroup().limit(Millis(-1), Millis(10)).cancelledBy(cancel);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  const Result result = command.run();
  EXPECT_TRUE(refused.fired());
  EXPECT_EQ(End::Signalled, result.end);
  EXPECT_EQ(SIGKILL, result.code);
  EXPECT_TRUE(result.killed);
  EXPECT_EQ(0, result.error.code);
}

// The name of the call is longer than a string holds in itself.
TEST_F(CommandStopFailure, HasItsCodeEvenWhenMemoryRunsOutForItsStep) {
  int withoutStep = 0;
  forEachAllocation(
      [&] {
        const Result result = stopInVain();
        EXPECT_EQ(EPERM, result.error.code);
        withoutStep += result.error.step.empty() ? 1 : 0;
      },
      [&](bool) {
        EXPECT_TRUE(hasNoChild());
        (void)log_.take();
      });
  EXPECT_EQ(1, withoutStep);
}
