#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"
#include "tests/support/census.h"

#include <cerrno>
#include <climits>
#include <map>
#include <sys/resource.h>
#include <sys/stat.h>
#include <thread>

using KovaTest::CommandTest;
using KovaTest::kCommandHelper;
using KovaTest::kHelper;
using KovaTest::Pipe;
using KovaTest::readFile;
using KovaTest::Report;
using KovaTest::runInChild;
using KovaTest::withPrefix;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;

namespace {

class CommandLaunch : public CommandTest {};

/// Ignores every signal that can be ignored, while the object exists.
class AllIgnored {
public:
  AllIgnored() {
    struct sigaction ignore = {};
    ignore.sa_handler = SIG_IGN;
    for (int sig = 1; sig < NSIG; ++sig) {
      struct sigaction before = {};
      if (::sigaction(sig, &ignore, &before) == 0) {
        before_.emplace(sig, before);
      }
    }
  }
  ~AllIgnored() {
    for (const auto &[sig, before] : before_) {
      ::sigaction(sig, &before, nullptr);
    }
  }
  AllIgnored(const AllIgnored &) = delete;
  AllIgnored &operator=(const AllIgnored &) = delete;

  bool has(int sig) const { return before_.count(sig) != 0; }

private:
  std::map<int, struct sigaction> before_;
};

std::chrono::nanoseconds timeOf(const struct timeval &time) {
  return std::chrono::seconds(time.tv_sec) + std::chrono::microseconds(time.tv_usec);
}

} // namespace

TEST_F(CommandLaunch, ReportsTheExitStatus) {
  const Result result = given({"exit", "7"}).run();
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(7, result.code);
  EXPECT_FALSE(result.ok());
  EXPECT_FALSE(result.timedOut || result.cancelled || result.killed);
  EXPECT_EQ(0, result.error.code);
}

TEST_F(CommandLaunch, IsOkForStatusZero) {
  EXPECT_TRUE(given({"exit", "0"}).run().ok());
}

TEST_F(CommandLaunch, ReportsTheSignalThatEndedIt) {
  const Result result = given({"die", std::to_string(SIGUSR1)}).run();
  EXPECT_EQ(End::Signalled, result.end);
  EXPECT_EQ(SIGUSR1, result.code);
  EXPECT_FALSE(result.ok());
  EXPECT_FALSE(result.killed) << "we sent nothing";
}

TEST_F(CommandLaunch, ReportsResourcesAndTime) {
  const Result result = given({"exit", "0"}).run();
  EXPECT_GT(result.usage.ru_maxrss, 0);
  EXPECT_GT(result.wall.count(), 0);
}

// A program without threads cannot use more than has passed. The second is room for the clocks,
// which differ.
TEST_F(CommandLaunch, ReportsTheProcessorTimeThatItUsed) {
  const Result result = given({"exit", "0"}).run();
  const auto used = timeOf(result.usage.ru_utime) + timeOf(result.usage.ru_stime);
  EXPECT_GT(used.count(), 0);
  EXPECT_LT(used, result.wall + std::chrono::seconds(1));
}

TEST_F(CommandLaunch, RunsAgainAndAgain) {
  const Command command = given({"exit", "3"});
  EXPECT_EQ(3, command.run().code);
  EXPECT_EQ(3, command.run().code);
}

TEST_F(CommandLaunch, RunsWhenThePlaceOfItsDescriptionIsAnother) {
  Command first = given({"exit", "4"});
  Command second = std::move(first);
  EXPECT_EQ(4, second.run().code);
}

TEST_F(CommandLaunch, PassesArgumentsUnchanged) {
  const std::string odd = " two  words\n$HOME *";
  const Report report = reportWith([&](Command &command) {
    command = given({"report", folder_ / "report", "0", "/dev/null", odd, ""});
  });
  EXPECT_THAT(withPrefix(report, "arg "),
              UnorderedElementsAre(
                  Pair("0", kHelper), Pair("1", "report"), Pair("2", folder_ / "report"),
                  Pair("3", "0"), Pair("4", "/dev/null"), Pair("5", " two  words"), Pair("6", "")));
}

TEST_F(CommandLaunch, LeavesOnlyPathOfTheEnvironment) {
  ASSERT_EQ(0, ::setenv("KOVA_SECRET", "x", 1));
  const Report environment = withPrefix(reportWith([](Command &) {}), "env ");
  ::unsetenv("KOVA_SECRET");
  EXPECT_THAT(environment, ElementsAre(Pair("PATH", ::getenv("PATH"))));
}

TEST_F(CommandLaunch, SetsVariables) {
  const Report report = reportWith([](Command &command) {
    command.env("LC_ALL", "C").env("EMPTY", "").env("PATH", "/nowhere").env("LC_ALL", "POSIX");
    command.env("", "ignored").env("A=B", "ignored");
  });
  EXPECT_THAT(withPrefix(report, "env "),
              ElementsAre(Pair("EMPTY", ""), Pair("LC_ALL", "POSIX"), Pair("PATH", "/nowhere")));
}

TEST_F(CommandLaunch, HasNoPathWhereTheCallerHasNone) {
  const std::string path = ::getenv("PATH");
  ::unsetenv("PATH");
  const Report environment = withPrefix(reportWith([](Command &) {}), "env ");
  ::setenv("PATH", path.c_str(), 1);
  EXPECT_THAT(environment, IsEmpty());
}

TEST_F(CommandLaunch, WorksInTheRootFolder) {
  EXPECT_EQ("/", reportWith([](Command &) {}).at("cwd"));
}

TEST_F(CommandLaunch, TakesARelativeProgramFromTheRootFolder) {
  EXPECT_EQ(9, Command({kHelper.substr(1), "exit", "9"}).run().code);
}

TEST_F(CommandLaunch, ConnectsStandardStreamsToDevNull) {
  const Report report = reportWith([](Command &) {});
  EXPECT_THAT(withPrefix(report, "fd "),
              ElementsAre(Pair("0", "/dev/null"), Pair("1", "/dev/null"), Pair("2", "/dev/null")));
  EXPECT_EQ(std::to_string(O_RDWR), report.at("flags 0"));
}

TEST_F(CommandLaunch, ClosesEveryOtherDescriptor) {
  std::vector<int> open;
  for (int i = 0; i < 200; ++i) {
    open.push_back(::open("/dev/zero", O_RDONLY)); // deliberately without O_CLOEXEC
  }
  ::close(open[50]); // a gap
  const Report report = reportWith([](Command &) {});
  for (std::size_t i = 0; i < open.size(); ++i) {
    if (i != 50) {
      ::close(open[i]);
    }
  }
  EXPECT_EQ(3U, withPrefix(report, "fd ").size());
}

TEST_F(CommandLaunch, ResetsSignals) {
  struct sigaction ignore = {};
  ignore.sa_handler = SIG_IGN;
  struct sigaction before = {};
  struct sigaction beforeLast = {};
  ::sigaction(SIGPIPE, &ignore, &before);
  ::sigaction(SIGRTMAX, &ignore, &beforeLast);
  sigset_t blocked;
  sigset_t mask;
  ::sigemptyset(&blocked);
  ::sigaddset(&blocked, SIGTERM);
  ::sigprocmask(SIG_BLOCK, &blocked, &mask);
  const Report report = reportWith([](Command &) {});
  sigset_t now;
  ::sigprocmask(SIG_SETMASK, &mask, &now);
  ::sigaction(SIGPIPE, &before, nullptr);
  ::sigaction(SIGRTMAX, &beforeLast, nullptr);
  EXPECT_EQ("0000000000000000", report.at("SigIgn"));
  EXPECT_EQ("0000000000000000", report.at("SigBlk"));
  EXPECT_EQ(1, ::sigismember(&now, SIGTERM)) << "the caller's mask is restored";
}

TEST_F(CommandLaunch, ResetsEverySignalThatCanBeIgnored) {
  {
    const AllIgnored ignored;
    for (const int sig : {SIGHUP, SIGCHLD, SIGSYS, SIGRTMIN, SIGRTMAX}) {
      EXPECT_TRUE(ignored.has(sig)) << sig;
    }
    (void)given({"report", folder_ / "report"}).run(); // its status is lost without SIGCHLD
  }
  const Report report = KovaTest::parseReport(readFile(folder_ / "report"));
  EXPECT_EQ("0000000000000000", report.at("SigIgn"));
}

TEST_F(CommandLaunch, KeepsUmaskSessionAndGroup) {
  const mode_t mask = ::umask(0027);
  const Report report = reportWith([](Command &) {});
  ::umask(mask);
  EXPECT_EQ(std::to_string(0027), report.at("umask"));
  EXPECT_EQ(std::to_string(::getsid(0)), report.at("sid"));
  EXPECT_EQ(std::to_string(::getpgrp()), report.at("pgid"));
  EXPECT_EQ(std::to_string(::getpid()), report.at("ppid"));
}

TEST_F(CommandLaunch, LeadsItsOwnGroupOnDemand) {
  const Report report = reportWith([](Command &command) { command.ownGroup(); });
  EXPECT_EQ(report.at("pid"), report.at("pgid"));
}

TEST_F(CommandLaunch, HasThePidThatItReports) {
  Command command = given({"report", folder_ / "report"});
  Running running = command.start();
  const pid_t pid = running.pid();
  EXPECT_TRUE(running.wait().ok());
  EXPECT_EQ(std::to_string(pid), KovaTest::parseReport(readFile(folder_ / "report")).at("pid"));
}

TEST_F(CommandLaunch, SaysWhyTheProgramWasNotExecuted) {
  const Result result = Command({"/nowhere/program", "x"}).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(127, result.code);
  EXPECT_FALSE(result.ok());
  EXPECT_EQ(ENOENT, result.error.code);
  EXPECT_EQ("execve", result.error.step);
  EXPECT_EQ("/nowhere/program", result.error.path);
  EXPECT_THAT(log_.take(),
              ElementsAre(notExecuted("/nowhere/program", "execve", "/nowhere/program", ENOENT)));
}

TEST_F(CommandLaunch, AdvisesAnAbsolutePathWhereANameIsNotFound) {
  EXPECT_EQ(ENOENT, Command({"no-such-program"}).run().error.code);
  KovaTest::LogLine line = notExecuted("no-such-program", "execve", "no-such-program", ENOENT);
  line.text += "; PATH is not searched: give an absolute path";
  EXPECT_THAT(log_.take(), ElementsAre(line));
}

TEST_F(CommandLaunch, DistinguishesTheCommandsOwn127) {
  const Result result = given({"exit", "127"}).run();
  EXPECT_EQ(End::Exited, result.end);
  EXPECT_EQ(127, result.code);
}

TEST_F(CommandLaunch, HasNoPidWhenNotStarted) {
  Running running = Command({"/nowhere/program"}).start();
  EXPECT_EQ(-1, running.pid());
  EXPECT_EQ(End::NotStarted, running.wait().end);
  EXPECT_EQ(1U, log_.take().size());
}

TEST_F(CommandLaunch, RefusesACommandWithoutArguments) {
  const Result result = Command({}).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(EINVAL, result.error.code);
  EXPECT_THAT(log_.take(), ElementsAre(notStarted("", "execve", "", EINVAL)));
}

TEST_F(CommandLaunch, HandsOnDescriptors) {
  const int fd = ::open("/dev/zero", O_RDONLY | O_CLOEXEC);
  const Report report = reportWith([fd](Command &command) { command.passFd(fd, 9); });
  EXPECT_THAT(withPrefix(report, "fd "),
              ElementsAre(Pair("0", "/dev/null"), Pair("1", "/dev/null"), Pair("2", "/dev/null"),
                          Pair("9", "/dev/zero")));
  ::close(fd);
}

TEST_F(CommandLaunch, HandsOnADescriptorUnderItsOwnNumber) {
  const int fd = ::open("/dev/zero", O_RDONLY | O_CLOEXEC);
  const Report report = reportWith([fd](Command &command) { command.passFd(fd, fd); });
  EXPECT_EQ("/dev/zero", report.at("fd " + std::to_string(fd)));
  EXPECT_EQ(4U, withPrefix(report, "fd ").size());
  ::close(fd);
}

TEST_F(CommandLaunch, ExchangesNumbers) {
  const int zero = ::open("/dev/zero", O_RDONLY | O_CLOEXEC);
  const int full = ::open("/dev/full", O_RDONLY | O_CLOEXEC);
  const Report report =
      reportWith([&](Command &command) { command.passFd(zero, full).passFd(full, zero); });
  EXPECT_EQ("/dev/full", report.at("fd " + std::to_string(zero)));
  EXPECT_EQ("/dev/zero", report.at("fd " + std::to_string(full)));
  EXPECT_EQ(5U, withPrefix(report, "fd ").size());
  ::close(zero);
  ::close(full);
}

// Targets on the numbers of what the launch itself opens, and sources among the standard streams.
TEST_F(CommandLaunch, HandsOnDescriptorsUnderNumbersThatAreInUse) {
  const int input = ::dup(0);
  const int zero = ::open("/dev/zero", O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(0, ::dup2(zero, 0)); // so that it is known what the standard input is
  const Report report = reportWith([&](Command &command) {
    for (int as = 3; as < 12; ++as) {
      command.passFd(0, as);
    }
    command.capture(Stream::Out, 10).capture(Stream::Err, 10).input("text");
  });
  ::dup2(input, 0);
  ::close(input);
  ::close(zero);
  for (int as = 3; as < 12; ++as) {
    EXPECT_EQ("/dev/zero", report.at("fd " + std::to_string(as)));
  }
  EXPECT_EQ(12U, withPrefix(report, "fd ").size());
  EXPECT_THAT(report.at("fd 0"), testing::HasSubstr("memfd:"));
  EXPECT_THAT(report.at("fd 1"), testing::HasSubstr("pipe:"));
}

TEST_F(CommandLaunch, RefusesStandardNumbersForOtherDescriptors) {
  const Result result = given({"exit", "0"}).passFd(0, 2).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(EINVAL, result.error.code);
  EXPECT_THAT(log_.take(), ElementsAre(notStarted(kHelper, "dup2", "0", EINVAL)));
}

TEST_F(CommandLaunch, RefusesANumberThatLeavesNoneAbove) {
  const Result result = given({"exit", "0"}).passFd(0, INT_MAX).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(EINVAL, result.error.code);
  EXPECT_THAT(log_.take(), ElementsAre(notStarted(kHelper, "dup2", "0", EINVAL)));
}

TEST_F(CommandLaunch, SaysWhichDescriptorIsNotOpen) {
  const Result result = given({"exit", "0"}).passFd(1000, 5).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(EBADF, result.error.code);
  EXPECT_EQ("1000", result.error.path);
  EXPECT_THAT(log_.take(), ElementsAre(notExecuted(kHelper, "dup2", "1000", EBADF)));
}

TEST_F(CommandLaunch, WorksForACallerWithoutStandardStreams) {
  const std::string path = folder_ / "report";
  EXPECT_EQ(0, runInChild([&] {
              ::close(0);
              ::close(1);
              ::close(2);
              Command command = given({"report", path});
              command.input("text").capture(Stream::Out, 10).toFile(Stream::Err, folder_ / "err");
              return command.run().ok() ? 0 : 1;
            }));
  const Report report = KovaTest::parseReport(readFile(path));
  EXPECT_THAT(report.at("fd 0"), testing::HasSubstr("memfd:"));
  EXPECT_THAT(report.at("fd 1"), testing::HasSubstr("pipe:"));
  EXPECT_EQ(folder_ / "err", report.at("fd 2"));
  EXPECT_EQ(3U, withPrefix(report, "fd ").size());
}

TEST_F(CommandLaunch, LosesTheStatusWhereTheHostIgnoresItsChildren) {
  EXPECT_EQ(0, runInChild([] {
              ::signal(SIGCHLD, SIG_IGN);
              const Result result = given({"exit", "3"}).run();
              return result.end == End::StatusLost && result.code == -1 && !result.ok() ? 0 : 1;
            }));
}

TEST_F(CommandLaunch, LosesTheStatusToAnotherWait) {
  Running running = given({"exit", "3"}).start();
  int status = 0;
  ASSERT_EQ(running.pid(), ::waitpid(-1, &status, 0));
  const Result result = running.wait();
  EXPECT_EQ(End::StatusLost, result.end);
  EXPECT_EQ(-1, result.code);
  EXPECT_EQ(0, result.error.code);
}

TEST_F(CommandLaunch, ReportsAFailureWhereTheHostIgnoresItsChildren) {
  EXPECT_EQ(0, runInChild([] {
              ::signal(SIGCHLD, SIG_IGN);
              const Result result = Command({"/nowhere/program"}).run();
              return result.end == End::NotStarted && result.error.code == ENOENT ? 0 : 1;
            }));
}

TEST_F(CommandLaunch, DiesWithItsService) {
  Pipe gate; // stays open, so that the command does not end by itself
  Pipe held;
  Command orphan = helper({"orphan", std::to_string(SIGKILL), "8", kCommandHelper, "await", "8"});
  orphan.passFd(gate.readEnd(), 8).passFd(held.writeEnd(), 9);
  EXPECT_EQ(SIGKILL, orphan.run().code);
  EXPECT_EQ("", held.readToEnd());
}

TEST_F(CommandLaunch, OutlivesItsServiceOnDemand) {
  Pipe gate;
  Pipe held;
  Command command = helper({"await", "8"});
  command.passFd(gate.readEnd(), 8).passFd(held.writeEnd(), 9).diesWithUs(false);
  EXPECT_EQ(0, runInChild([&] {
              Running running = command.start();
              if (running.pid() < 0) {
                return 1;
              }
              ::_exit(0); // without destroying it
            }));
  char byte = 0;
  ::fcntl(held.readEnd(), F_SETFL, O_NONBLOCK);
  held.closeWriteEnd();
  EXPECT_EQ(-1, ::read(held.readEnd(), &byte, 1));
  EXPECT_EQ(EAGAIN, errno) << "the command still holds it";
  ::fcntl(held.readEnd(), F_SETFL, 0);
  gate.closeWriteEnd(); // lets it end
  EXPECT_EQ("", held.readToEnd());
}

TEST_F(CommandLaunch, DiesWithTheThreadThatStartedIt) {
  Pipe gate;
  std::vector<Running> started;
  std::thread thread([&] {
    started.push_back(helper({"await", "8"}).passFd(gate.readEnd(), 8).start());
  });
  thread.join();
  const Result result = started.front().wait();
  EXPECT_EQ(End::Signalled, result.end);
  EXPECT_EQ(SIGKILL, result.code);
  EXPECT_FALSE(result.killed) << "the kernel did it";
}
