// Time limits, requests to cancel, process groups, callbacks, destruction and waits for several.

#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"

#include <cerrno>
#include <poll.h>
#include <stdexcept>
#include <sys/resource.h>
#include <thread>

using KovaTest::CommandTest;
using KovaTest::Handler;
using KovaTest::Pipe;
using testing::ElementsAre;

namespace {

// A command that waits until the test lets it end, or is ended. Whether a process of it is left
// shows by held.
class CommandLimit : public CommandTest {
protected:
  /// Waits for the gate, and ignores a signal unless that is 0.
  Command waiting(int ignored = 0) {
    Command command = helper({"await", "8", std::to_string(ignored)});
    command.passFd(gate_.readEnd(), 8).passFd(held_.writeEnd(), 9);
    return command;
  }

  /// The same in a child of the command, which ignores SIGTERM.
  Command waitingFamily() {
    Command command = helper({"family", "8"});
    command.passFd(gate_.readEnd(), 8).passFd(held_.writeEnd(), 10).passFd(gate_.readEnd(), 9);
    return command;
  }

  static void expectEndedBy(int sig, const Result &result) {
    EXPECT_EQ(End::Signalled, result.end);
    EXPECT_EQ(sig, result.code);
    EXPECT_EQ(sig == SIGKILL, result.killed);
    EXPECT_FALSE(result.ok());
  }

  Pipe gate_;
  Pipe held_;
};

KOVA::Backup::Service::Cancel *cancelOfHandler = nullptr;

} // namespace

TEST_F(CommandLimit, EndsACommandBySigterm) {
  const Result result = waiting().limit(Millis(1)).run();
  expectEndedBy(SIGTERM, result);
  EXPECT_TRUE(result.timedOut);
  EXPECT_FALSE(result.cancelled);
  EXPECT_GE(result.wall, std::chrono::milliseconds(1));
}

TEST_F(CommandLimit, IsNotReachedByACommandThatEnds) {
  const Result result = given({"exit", "0"}).limit(std::chrono::hours(1)).run();
  EXPECT_TRUE(result.ok());
  EXPECT_FALSE(result.timedOut);
}

TEST_F(CommandLimit, HoldsForTheLongestSpan) {
  EXPECT_TRUE(given({"exit", "0"}).limit(Millis::max(), Millis::max()).run().ok());
  EXPECT_TRUE(given({"exit", "0"}).limit(Millis::min(), Millis::min()).run().ok());
}

// By a request to cancel, since a limit might pass before the command ignores SIGTERM.
TEST_F(CommandLimit, KillsACommandThatIgnoresSigterm) {
  Cancel cancel;
  Command command = waiting(SIGTERM);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  const Result result = command.cancelledBy(cancel).limit(Millis(-1), Millis(10)).run();
  expectEndedBy(SIGKILL, result);
  EXPECT_TRUE(result.cancelled);
  EXPECT_FALSE(result.timedOut);
}

TEST_F(CommandLimit, KillsAtOnceWithoutAGracePeriod) {
  Cancel cancel;
  Command command = waiting(SIGTERM);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  expectEndedBy(SIGKILL, command.cancelledBy(cancel).limit(Millis(-1), Millis(0)).run());
}

TEST_F(CommandLimit, NeverKillsWithANegativeGracePeriod) {
  Cancel cancel;
  Command command = waiting(SIGTERM);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  int ticks = 0;
  command.every(Millis(1), [&] {
    if (cancel.requested() && ++ticks == 20) {
      gate_.closeWriteEnd();
    }
  });
  const Result result = command.cancelledBy(cancel).limit(Millis(-1), Millis(-1)).run();
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(5, result.code);
  EXPECT_TRUE(result.cancelled);
  EXPECT_FALSE(result.killed);
}

TEST_F(CommandLimit, ReachesOnlyTheCommandWithoutAGroup) {
  Cancel cancel;
  Command command = waitingFamily();
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  expectEndedBy(SIGTERM, command.cancelledBy(cancel).run());
  struct pollfd ended = {held_.readEnd(), POLLIN, 0};
  held_.closeWriteEnd();
  EXPECT_EQ(0, ::poll(&ended, 1, 0)) << "the command's child goes on";
  gate_.closeWriteEnd();
  EXPECT_EQ("", held_.readToEnd());
}

TEST_F(CommandLimit, ReachesTheGroup) {
  Cancel cancel;
  Command command = waitingFamily();
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  expectEndedBy(SIGTERM, command.cancelledBy(cancel).ownGroup().run());
  EXPECT_EQ("", held_.readToEnd()) << "the command's child is gone although it ignores SIGTERM";
}

TEST_F(CommandLimit, LeavesTheGroupOfACommandThatEndsByItself) {
  Command command = helper({"leave", "8"});
  command.passFd(gate_.readEnd(), 8).passFd(held_.writeEnd(), 9).ownGroup();
  EXPECT_TRUE(command.run().ok());
  struct pollfd ended = {held_.readEnd(), POLLIN, 0};
  held_.closeWriteEnd();
  EXPECT_EQ(0, ::poll(&ended, 1, 0));
  gate_.closeWriteEnd();
  EXPECT_EQ("", held_.readToEnd());
}

TEST_F(CommandLimit, ReachesALeaderThatLeftItsGroup) {
  Cancel cancel;
  Command command = helper({"away", "8"});
  command.passFd(gate_.readEnd(), 8).ownGroup().cancelledBy(cancel);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  expectEndedBy(SIGTERM, command.run());
  {
    Pipe ready;
    command.passFd(held_.writeEnd(), 9).toFd(Stream::Out, ready.writeEnd());
    Cancel never;
    const Running running = command.cancelledBy(never).start();
    char byte = 0;
    ASSERT_EQ(1, ::read(ready.readEnd(), &byte, 1));
  }
  EXPECT_EQ("", held_.readToEnd()) << "destruction ends it, too";
}

// The kernel reaps the leader then. Kernels before 6.9 cannot signal the group of one that is gone.
TEST_F(CommandLimit, ReachesTheGroupWhenSigchldIsIgnored) {
  struct sigaction before = {};
  struct sigaction ignore = {};
  ignore.sa_handler = SIG_IGN;
  ASSERT_EQ(0, ::sigaction(SIGCHLD, &ignore, &before));
  Cancel cancel;
  Command command = waitingFamily();
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  const Result result = command.cancelledBy(cancel).ownGroup().run();
  ASSERT_EQ(0, ::sigaction(SIGCHLD, &before, nullptr));
  EXPECT_EQ(End::StatusLost, result.end);
  if (result.error.code != 0) {
    EXPECT_EQ(EINVAL, result.error.code);
    EXPECT_EQ("pidfd_send_signal", result.error.step);
    gate_.closeWriteEnd();
    EXPECT_EQ("", held_.readToEnd());
    GTEST_SKIP() << "skipped: this kernel cannot signal a group by its pidfd";
  }
  EXPECT_EQ("", held_.readToEnd()) << "the command's child is gone although it ignores SIGTERM";
}

TEST_F(CommandLimit, IsAFailureEvenIfTheCommandEndsWithZero) {
  Cancel cancel;
  Command command(
      {"/bin/sh", "-c", "trap 'exit 0' TERM; echo ready; while read -r line; do :; done"});
  command.inputFd(gate_.readEnd()).cancelledBy(cancel);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  Result result = command.run();
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(0, result.code);
  EXPECT_FALSE(result.ok());
  result.cancelled = false;
  EXPECT_TRUE(result.ok());
  result.timedOut = true;
  EXPECT_FALSE(result.ok());
}

TEST_F(CommandLimit, DoesNotSignalAGroupWhoseLeaderAnotherWaitHasReaped) {
  Running running = waitingFamily().ownGroup().limit(Millis(0), Millis(0)).start();
  ASSERT_EQ(0, ::kill(running.pid(), SIGKILL)); // the leader only
  int status = 0;
  ASSERT_EQ(running.pid(), ::waitpid(running.pid(), &status, 0));
  const Result result = running.wait();
  EXPECT_EQ(End::StatusLost, result.end);
  EXPECT_FALSE(result.killed);
  gate_.closeWriteEnd();
  EXPECT_EQ("", held_.readToEnd());
}

TEST_F(CommandLimit, IsCancelledByASignalHandler) {
  Cancel cancel;
  cancelOfHandler = &cancel;
  const Handler handler(SIGUSR1, [](int) { cancelOfHandler->request(); });
  Command command = waiting();
  command.lines(Stream::Out, [](std::string_view) { ::raise(SIGUSR1); });
  const Result result = command.cancelledBy(cancel).run();
  expectEndedBy(SIGTERM, result);
  EXPECT_TRUE(result.cancelled);
}

TEST_F(CommandLimit, IsCancelledByAnotherThread) {
  Cancel cancel;
  Running running = waiting().cancelledBy(cancel).start();
  std::thread other([&cancel] { cancel.request(); });
  expectEndedBy(SIGTERM, running.wait());
  other.join();
}

TEST_F(CommandLimit, DoesNotStartAfterARequest) {
  Cancel cancel;
  cancel.request();
  const Result result = waiting().cancelledBy(cancel).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_TRUE(result.cancelled);
  EXPECT_EQ(ECANCELED, result.error.code);
}

TEST_F(CommandLimit, SaysWhyItStoppedFirst) {
  Cancel cancel;
  Command command = waiting(SIGTERM);
  command.lines(Stream::Out, [&cancel](std::string_view) { cancel.request(); });
  int ticks = 0;
  command.every(Millis(1), [&] { ticks += cancel.requested() ? 1 : 0; });
  const Result result = command.cancelledBy(cancel).limit(std::chrono::hours(1), Millis(5)).run();
  EXPECT_TRUE(result.cancelled);
  EXPECT_FALSE(result.timedOut);
}

TEST_F(CommandLimit, TicksWhileTheCommandRuns) {
  int ticks = 0;
  Command command = waiting();
  command.every(Millis(1), [&] {
    if (++ticks == 5) {
      gate_.closeWriteEnd();
    }
  });
  EXPECT_EQ(5, command.run().code);
  EXPECT_GE(ticks, 5);
}

TEST_F(CommandLimit, TakesAnIntervalOfNothingForAMillisecond) {
  int ticks = 0;
  Command command = waiting();
  command.every(Millis(-5), [&] { ++ticks == 2 ? gate_.closeWriteEnd() : void(); });
  EXPECT_EQ(5, command.run().code);
}

TEST_F(CommandLimit, KillsTheCommandWhoseCallbackThrows) {
  Command command = waiting(SIGTERM);
  command.lines(Stream::Out, [](std::string_view) { throw std::runtime_error("line"); });
  Running running = command.start();
  EXPECT_THROW(running.wait(), std::runtime_error);
  EXPECT_EQ("", held_.readToEnd());
  expectEndedBy(SIGKILL, running.wait());
}

TEST_F(CommandLimit, KillsTheCommandWhoseTickThrows) {
  Command command = waiting();
  command.every(Millis(1), [] { throw std::runtime_error("tick"); });
  EXPECT_THROW(command.run(), std::runtime_error);
  EXPECT_EQ("", held_.readToEnd());
}

TEST_F(CommandLimit, ReapsTheCommandWhoseLastLineThrows) {
  Command command = helper({"copy"});
  command.input("no newline");
  command.lines(Stream::Out, [](std::string_view) { throw std::runtime_error("line"); });
  EXPECT_THROW(command.run(), std::runtime_error);
}

TEST_F(CommandLimit, KillsTheGroupWhenTheObjectIsDestroyed) {
  {
    Pipe ready;
    const Running running = waitingFamily().ownGroup().toFd(Stream::Out, ready.writeEnd()).start();
    char byte = 0;
    ASSERT_EQ(1, ::read(ready.readEnd(), &byte, 1));
  }
  EXPECT_EQ("", held_.readToEnd());
}

TEST_F(CommandLimit, KillsTheCommandThatAnotherReplaces) {
  Running running = waiting().start();
  running = given({"exit", "4"}).start();
  EXPECT_EQ("", held_.readToEnd());
  EXPECT_EQ(4, running.wait().code);
}

TEST_F(CommandLimit, GoesOnWithoutItsDescription) {
  auto lines = std::make_unique<std::vector<std::string>>();
  auto command = std::make_unique<Command>(helper({"copy"}));
  command->input("one\ntwo\n").lines(Stream::Out, [&lines](std::string_view line) {
    lines->emplace_back(line);
  });
  Running first = command->start();
  command.reset();
  Running second = std::move(first);
  EXPECT_TRUE(second.wait().ok());
  EXPECT_THAT(*lines, ElementsAre("one", "two"));
}

TEST_F(CommandLimit, WaitsForTheFirstOfSeveral) {
  Running slow = waiting().start();
  Running fast = given({"exit", "3"}).start();
  EXPECT_EQ(1U, Running::waitAny({&slow, &fast}));
  EXPECT_EQ(1U, Running::waitAny({&slow, &fast})) << "it has ended before";
  EXPECT_EQ(3, fast.wait().code);
  gate_.closeWriteEnd();
  EXPECT_EQ(0U, Running::waitAny({&slow}));
  EXPECT_EQ(5, slow.wait().code);
}

TEST_F(CommandLimit, WaitsForSeveralWithALimitOfItsOwn) {
  Running running = waiting().start();
  EXPECT_EQ(1U, Running::waitAny({&running}, Millis(0)));
  EXPECT_EQ(1U, Running::waitAny({&running}, Millis(5)));
  gate_.closeWriteEnd();
  const Result result = running.wait();
  EXPECT_EQ(5, result.code);
  EXPECT_FALSE(result.timedOut);
}

// ppoll(2) refuses more entries than that many.
TEST_F(CommandLimit, WaitsForMoreThanTheLimitOnOpenFilesWouldHoldAtFourEach) {
  struct rlimit before = {};
  ASSERT_EQ(0, ::getrlimit(RLIMIT_NOFILE, &before));
  Cancel cancel;
  std::vector<Running> commands;
  std::vector<Running *> all;
  for (int i = 0; i < 20; ++i) {
    commands.push_back(waiting().cancelledBy(cancel).start());
  }
  for (Running &running : commands) {
    all.push_back(&running);
  }
  const struct rlimit few = {64, before.rlim_max};
  ASSERT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &few));
  EXPECT_EQ(all.size(), Running::waitAny(all, Millis(1)));
  cancel.request();
  for (Running *running : all) {
    expectEndedBy(SIGTERM, running->wait());
  }
  EXPECT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &before));
}

TEST_F(CommandLimit, WaitsForNone) {
  EXPECT_EQ(0U, Running::waitAny({}));
}

TEST_F(CommandLimit, ReportsAtOnceWhatWasNotStarted) {
  Running slow = waiting().start();
  Running missing = Command({"/nowhere/program"}).start();
  EXPECT_EQ(1U, Running::waitAny({&slow, &missing}));
  EXPECT_EQ(1U, log_.take().size());
}

TEST_F(CommandLimit, ServesAllThatItWaitsFor) {
  const std::string text(1000000, 'x');
  Command copy = helper({"copy"});
  copy.input(text).capture(Stream::Out, text.size());
  Running first = copy.start();
  Running second = copy.start();
  Running limited = waiting().limit(Millis(1)).start();
  std::vector<Running *> left = {&first, &second, &limited};
  while (!left.empty()) {
    left.erase(left.begin() + static_cast<std::ptrdiff_t>(Running::waitAny(left)));
  }
  EXPECT_EQ(text, first.wait().out.text);
  EXPECT_EQ(text, second.wait().out.text);
  EXPECT_TRUE(limited.wait().timedOut);
}

TEST_F(CommandLimit, KillsOnlyTheCommandWhoseCallbackThrows) {
  Running good = waiting().start();
  Command bad = helper({"copy"});
  bad.input("x\n").lines(Stream::Out, [](std::string_view) { throw std::runtime_error("line"); });
  Running thrower = bad.start();
  EXPECT_THROW(Running::waitAny({&good, &thrower}), std::runtime_error);
  gate_.closeWriteEnd();
  EXPECT_EQ(5, good.wait().code);
}

TEST_F(CommandLimit, IsNotEndedByASignal) {
  const Handler handler(SIGTERM);
  int ticks = 0;
  Command command = waiting();
  command.every(Millis(1), [&] {
    ::raise(SIGTERM);
    if (++ticks == 10) {
      gate_.closeWriteEnd();
    }
  });
  EXPECT_EQ(5, command.run().code);
}
