// Every system call of Command fails once and lastingly.

#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/fault.h"

#include <cerrno>
#include <sys/wait.h>

using KovaTest::CommandTest;
using KovaTest::countOpenDescriptors;
using KovaTest::Fault;
using KovaTest::forEachFailure;
using KovaTest::Pipe;
using testing::SizeIs;

namespace {

class CommandFault : public CommandTest {
protected:
  /// A command with everything that there is to set up: "copy" with a text.
  Command full() {
    Command command = helper({"copy"});
    command.input("text").capture(Stream::Out, 100).toFile(Stream::Err, folder_ / "err", 0640);
    command.passFd(gate_.readEnd(), 30).ownGroup().limit(std::chrono::minutes(5));
    return command;
  }

  /// Fails every call of a function before the program is executed.
  void expectNotStarted(const char *function, int error, const char *step) {
    forEachFailure(function, error, [&](Fault &fault) {
      const int before = countOpenDescriptors();
      const Result result = full().run();
      if (fault.fired()) {
        EXPECT_EQ(End::NotStarted, result.end);
        EXPECT_EQ(127, result.code);
        EXPECT_EQ(error, result.error.code);
        EXPECT_EQ(step, result.error.step);
        EXPECT_THAT(log_.take(), SizeIs(1));
      } else {
        EXPECT_TRUE(result.ok());
        EXPECT_EQ("text", result.out.text);
      }
      EXPECT_EQ(before, countOpenDescriptors());
      EXPECT_TRUE(hasNoChild());
    });
  }

  /// Fails one call after the other by EINTR, to no effect.
  void expectRetried(const char *function, int calls) {
    for (int nth = 1; nth <= calls; ++nth) {
      SCOPED_TRACE(testing::Message() << function << " is interrupted at call " << nth);
      const Fault fault(function, nth, EINTR);
      const Result result = full().run();
      EXPECT_TRUE(result.ok());
      EXPECT_EQ("text", result.out.text);
      EXPECT_TRUE(fault.fired() || nth > 1) << "not called at all";
    }
  }

  static bool hasNoChild() {
    siginfo_t info;
    return ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT) == -1 && errno == ECHILD;
  }

  Pipe gate_;
};

class CommandChildFault : public CommandFault {
protected:
  void SetUp() override {
    if (kBuiltWithSanitizer) {
      GTEST_SKIP() << "skipped: the child of a sanitizer's program does not share our memory";
    }
  }
};

} // namespace

TEST_F(CommandFault, IsReportedWhenTheStreamsCannotBeOpened) {
  expectNotStarted("memfd_create", ENOMEM, "memfd_create");
  expectNotStarted("write", ENOSPC, "write");
  expectNotStarted("lseek", EIO, "lseek");
  expectNotStarted("pipe2", EMFILE, "pipe2");
  expectNotStarted("fchmod", EPERM, "fchmod");
}

TEST_F(CommandFault, IsReportedWhenDevNullOrAFileCannotBeOpened) {
  forEachFailure("open", EACCES, [&](Fault &fault) {
    Command command = given({"exit", "0"});
    const Result result = command.toFile(Stream::Out, folder_ / "out").run();
    EXPECT_EQ(!fault.fired(), result.ok());
    if (fault.fired()) {
      EXPECT_EQ(EACCES, result.error.code);
      EXPECT_EQ("open", result.error.step);
      EXPECT_THAT(log_.take(), SizeIs(1));
    }
    EXPECT_TRUE(hasNoChild());
  });
}

TEST_F(CommandFault, IsReportedWhenSignalsCannotBeBlocked) {
  forEachFailure("pthread_sigmask", EINVAL, [&](Fault &fault) {
    const Result result = full().run();
    if (fault.fired() && fault.calls() == 1) { // the second call restores the mask
      EXPECT_EQ(End::NotStarted, result.end);
      EXPECT_EQ("pthread_sigmask", result.error.step);
      EXPECT_THAT(log_.take(), SizeIs(1));
    } else {
      EXPECT_TRUE(result.ok());
      sigset_t none;
      ::sigemptyset(&none);
      ::sigprocmask(SIG_SETMASK, &none, nullptr);
    }
  });
}

TEST_F(CommandFault, DoesWithoutTheFlagOfNewKernels) {
  const Fault fault("memfd_create", 1, EINVAL);
  EXPECT_TRUE(full().run().ok());
  EXPECT_EQ(2, fault.calls());
}

TEST_F(CommandChildFault, IsReportedWhenNoChildCanBeCreated) {
  expectNotStarted("mmap", ENOMEM, "mmap");
  expectNotStarted("mprotect", ENOMEM, "mprotect");
  expectNotStarted("clone", EAGAIN, "clone");
}

TEST_F(CommandFault, IsReportedWhenNoChildCanBeForked) {
  if (!kBuiltWithSanitizer) {
    GTEST_SKIP() << "skipped: only a sanitizer's program creates its children by fork";
  }
  expectNotStarted("fork", EAGAIN, "fork");
  expectNotStarted("pidfd_open", EMFILE, "pidfd_open");
}

TEST_F(CommandChildFault, IsReportedForEachStep) {
  expectNotStarted("fcntl", EMFILE, "fcntl"); // of the parent, too
  expectNotStarted("setpgid", EPERM, "setpgid");
  expectNotStarted("prctl", EINVAL, "prctl");
  expectNotStarted("sigaction", EINVAL, "sigaction");
  expectNotStarted("sigprocmask", EINVAL, "sigprocmask");
  expectNotStarted("dup2", EBADF, "dup2");
  expectNotStarted("execve", EACCES, "execve");
}

TEST_F(CommandChildFault, DoesNotMatterForTheFolder) {
  forEachFailure("chdir", EACCES, [&](Fault &) { EXPECT_TRUE(full().run().ok()); });
}

TEST_F(CommandChildFault, EndsAChildWhoseParentIsGone) {
  const Fault fault("getppid", 1, 0);
  const Result result = full().run();
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ(127, result.code);
  EXPECT_EQ("", result.out.text);
}

TEST_F(CommandChildFault, ClosesByListWithoutCloseRange) {
  for (const int error : {ENOSYS, EPERM}) {
    forEachFailure("close_range", error, [&](Fault &) {
      const int stray = ::dup(gate_.readEnd());
      Command command = given({"report", folder_ / "report"});
      command.passFd(gate_.readEnd(), 20).passFd(gate_.readEnd(), 25);
      EXPECT_TRUE(command.run().ok());
      ::close(stray);
      const auto report = KovaTest::parseReport(KovaTest::readFile(folder_ / "report"));
      EXPECT_THAT(KovaTest::withPrefix(report, "fd "), SizeIs(5));
    });
  }
}

TEST_F(CommandChildFault, ClosesManyByList) {
  const Fault fault("close_range", 1, ENOSYS, true);
  std::vector<int> stray;
  for (int i = 0; i < 500; ++i) { // more than one buffer of the list
    stray.push_back(::dup(gate_.readEnd()));
  }
  Command command = given({"report", folder_ / "report"});
  EXPECT_TRUE(command.run().ok());
  for (const int fd : stray) {
    ::close(fd);
  }
  const auto report = KovaTest::parseReport(KovaTest::readFile(folder_ / "report"));
  EXPECT_THAT(KovaTest::withPrefix(report, "fd "), SizeIs(3));
}

TEST_F(CommandChildFault, ClosesTheFirstBehindTheStandardStreamsByList) {
  const Fault fault("close_range", 1, ENOSYS, true);
  const int flags = ::fcntl(3, F_GETFD); // -1: nothing has this number
  ASSERT_LE(0, flags < 0 ? ::dup2(gate_.readEnd(), 3) : ::fcntl(3, F_SETFD, 0));
  Command command = given({"report", folder_ / "report"});
  EXPECT_TRUE(command.run().ok());
  ASSERT_EQ(0, flags < 0 ? ::close(3) : ::fcntl(3, F_SETFD, flags));
  const auto report = KovaTest::parseReport(KovaTest::readFile(folder_ / "report"));
  EXPECT_THAT(KovaTest::withPrefix(report, "fd "), SizeIs(3));
}

TEST_F(CommandChildFault, IsReportedWhenDescriptorsCannotBeClosed) {
  const Fault unknown("close_range", 1, ENOSYS, true);
  expectNotStarted("getdents64", EIO, "close_range");
  const Fault list("open", 2, EMFILE); // the first is that of the file
  const Result result = full().run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ("close_range", result.error.step);
  EXPECT_EQ(EMFILE, result.error.code);
  EXPECT_THAT(log_.take(), SizeIs(1));
}

// The first call reads the report of the child, the others the command's output.
TEST_F(CommandFault, IsReportedWhenAPipeCannotBeRead) {
  forEachFailure("read", EIO, [&](Fault &fault) {
    const int before = countOpenDescriptors();
    const Result result = full().run();
    EXPECT_EQ(!fault.fired(), result.ok());
    if (fault.fired()) {
      EXPECT_EQ(EIO, result.error.code);
      EXPECT_EQ("read", result.error.step);
      EXPECT_THAT(log_.take(), SizeIs(result.end == End::NotStarted ? 1 : 0));
    }
    EXPECT_EQ(before, countOpenDescriptors());
    EXPECT_TRUE(hasNoChild());
  });
}

TEST_F(CommandFault, IsReportedAsNotStartedWhenTheReportCannotBeRead) {
  const Fault fault("read", 1, EIO);
  EXPECT_EQ(End::NotStarted, full().run().end);
  EXPECT_THAT(log_.take(), SizeIs(1));
}

// When the host ignores SIGCHLD, the number of a child that has ended may be another's.
TEST_F(CommandFault, IsKilledByItsPidfdWhenTheReportCannotBeRead) {
  const Fault fault("read", 1, EIO);
  const Fault byNumber("kill", 1, EPERM);
  const Fault byPidfd("pidfd_send_signal", 2, EPERM);
  EXPECT_EQ(End::NotStarted, full().run().end);
  EXPECT_EQ(0, byNumber.calls());
  EXPECT_EQ(1, byPidfd.calls());
  EXPECT_TRUE(hasNoChild());
  EXPECT_THAT(log_.take(), SizeIs(1));
}

TEST_F(CommandFault, KillsTheCommandThatCannotBeWaitedFor) {
  forEachFailure("ppoll", ENOMEM, [&](Fault &fault) {
    const int before = countOpenDescriptors();
    const Result result = full().run();
    EXPECT_EQ(!fault.fired(), result.ok());
    if (fault.fired()) {
      EXPECT_EQ(ENOMEM, result.error.code);
      EXPECT_EQ("ppoll", result.error.step);
    }
    EXPECT_EQ(before, countOpenDescriptors());
    EXPECT_TRUE(hasNoChild());
  });
}

TEST_F(CommandFault, LosesTheStatusThatCannotBeTaken) {
  forEachFailure("waitid with usage", EINVAL, [&](Fault &fault) {
    const int before = countOpenDescriptors();
    const Result result = full().run();
    EXPECT_EQ(!fault.fired(), result.ok());
    if (fault.fired()) {
      EXPECT_EQ(End::StatusLost, result.end);
      EXPECT_EQ(-1, result.code);
      EXPECT_EQ("waitid", result.error.step);
      EXPECT_EQ("text", result.out.text);
      EXPECT_GT(::waitpid(-1, nullptr, 0), 0); // what is left since the call never came
    }
    EXPECT_EQ(before, countOpenDescriptors());
  });
}

TEST_F(CommandFault, ReadsTheRestEvenIfItsSizeCannotBeHad) {
  forEachFailure("ioctl", EINVAL, [&](Fault &) {
    Command command = helper({"leave", "8"}); // its stream does not end with it
    Pipe gate;
    Pipe held;
    command.passFd(gate.readEnd(), 8).passFd(held.writeEnd(), 9).capture(Stream::Out, 100);
    EXPECT_EQ("left\n", command.run().out.text);
    gate.closeWriteEnd();
    EXPECT_EQ("", held.readToEnd());
  });
}

TEST_F(CommandFault, IsReportedWhenTheCommandCannotBeStopped) {
  for (const bool group : {false, true}) {
    const int error = group ? EPERM : EINVAL; // for EPERM of the pidfd there is another way
    forEachFailure(group ? "kill" : "pidfd_send_signal", error, [&](Fault &fault) {
      Pipe gate;
      Command command = helper({"await", "8"});
      command.passFd(gate.readEnd(), 8).limit(Millis(0), Millis(0)).ownGroup(group);
      command.every(Millis(1), [&] { fault.calls() >= 2 ? gate.closeWriteEnd() : void(); });
      const Result result = command.run();
      EXPECT_TRUE(result.timedOut);
      EXPECT_FALSE(result.ok());
      EXPECT_EQ(fault.fired() ? error : 0, result.error.code);
      if (fault.fired()) {
        EXPECT_EQ(group ? "kill" : "pidfd_send_signal", result.error.step);
      }
    });
  }
}

TEST_F(CommandFault, StopsByNumberWhereThePidfdDoesNotServe) {
  for (const int refusal : {ENOSYS, EPERM}) {
    const Fault fault("pidfd_send_signal", 1, refusal, true);
    Command command = helper({"await", "8"});
    const Result result = command.passFd(gate_.readEnd(), 8).limit(Millis(0)).run();
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(End::Signalled, result.end);
    EXPECT_EQ(SIGTERM, result.code);
    EXPECT_EQ(0, result.error.code);
  }
}

TEST_F(CommandFault, IsNoMatterForInterruptedCalls) {
  expectRetried("open", 2);
  expectRetried("write", 2);
  expectRetried("read", 4);
  expectRetried("ppoll", 4);
  expectRetried("waitid with usage", 2);
}

TEST_F(CommandChildFault, IsNoMatterForInterruptedSteps) {
  expectRetried("dup2", 4);
}

TEST_F(CommandFault, IsNoMatterForPartsOfATransfer) {
  const Fault parts("write in parts", 1, 0, true);
  const Fault moreParts("read in parts", 1, 0, true);
  std::string text;
  for (int i = 0; i < 1000; ++i) {
    text += std::to_string(i);
  }
  EXPECT_EQ(text, helper({"copy"}).input(text).capture(Stream::Out, 10000).run().out.text);
  EXPECT_GT(parts.calls(), 5);
  EXPECT_GT(moreParts.calls(), 100);
}
