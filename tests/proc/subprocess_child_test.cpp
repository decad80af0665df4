// The environment in which a command starts, and how the child reports that it could not start it.

#include "tests/proc/launch_fixture.h"
#include "tests/proc/process_hooks.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <fstream>
#include <random>
#include <sys/resource.h>
#include <sys/stat.h>

using namespace KovaTest;
using KOVA::Backup::SubProcess;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

namespace {

using Strings = std::vector<std::string>;

const std::string kNull = "/dev/null";

// The exit code of a child in which the test itself could not do its part.
constexpr int kBroken = 77;

class CommandStart : public Launch {
protected:
  // The descriptors in a report of the helper.
  static Report descriptors(const Report &report) { return withPrefix(report, "fd "); }

  Report savedReport() const { return parseReport(readFile(file("report"))); }

  SubProcess reporter() const { return SubProcess(helperArgs({"report", file("report")})); }

  // Runs a command that must end with 127, and returns the failures that the child logged.
  Strings failuresOf(const SubProcess &command) {
    const std::size_t before = failures().size();
    const int status = command.call();
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(127, WEXITSTATUS(status));
    Strings lines = failures();
    lines.erase(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(before));
    return lines;
  }
};

// Changes the limit on descriptors for its lifetime.
class DescriptorLimit {
public:
  explicit DescriptorLimit(rlim_t soft) {
    ::getrlimit(RLIMIT_NOFILE, &old_);
    const rlimit wanted = {std::min(soft, old_.rlim_max), old_.rlim_max};
    ::setrlimit(RLIMIT_NOFILE, &wanted);
    soft_ = wanted.rlim_cur;
  }
  ~DescriptorLimit() { ::setrlimit(RLIMIT_NOFILE, &old_); }
  DescriptorLimit(const DescriptorLimit &) = delete;
  DescriptorLimit &operator=(const DescriptorLimit &) = delete;

  rlim_t soft() const { return soft_; }

private:
  rlimit old_{};
  rlim_t soft_;
};

// Descriptors that a child would inherit.
class ManyDescriptors {
public:
  explicit ManyDescriptors(std::size_t count) {
    while (descriptors_.size() < count) {
      const int fd = ::open("/dev/zero", O_RDONLY);
      if (fd < 0) {
        break;
      }
      descriptors_.push_back(fd);
    }
  }
  ~ManyDescriptors() {
    for (const int fd : descriptors_) {
      ::close(fd);
    }
  }
  ManyDescriptors(const ManyDescriptors &) = delete;
  ManyDescriptors &operator=(const ManyDescriptors &) = delete;

  std::size_t count() const { return descriptors_.size(); }
  void closeFirst(int count) {
    for (int i = 0; i < count; ++i) {
      ::close(descriptors_.front());
      descriptors_.erase(descriptors_.begin());
    }
  }
  void closeLast(int count) {
    for (int i = 0; i < count; ++i) {
      ::close(descriptors_.back());
      descriptors_.pop_back();
    }
  }

private:
  std::vector<int> descriptors_;
};

// The calls of the children whose text starts with prefix.
int countCalls(const Strings &calls, const std::string &prefix) {
  return static_cast<int>(std::count_if(calls.begin(), calls.end(), [&](const std::string &call) {
    return call.rfind(prefix, 0) == 0;
  }));
}

} // namespace

TEST_F(CommandStart, HasNullForItsStreamsAndNoOtherDescriptor) {
  const int open = ::open("/dev/zero", O_RDONLY); // would be inherited
  const Report report = reportWith([](SubProcess &) {});
  ::close(open);
  EXPECT_THAT(descriptors(report),
              ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
  for (const char *fd : {"0", "1", "2"}) {
    EXPECT_EQ(std::to_string(O_RDWR), report.at(std::string("flags ") + fd));
  }
}

TEST_F(CommandStart, StandsInTheRootFolder) {
  EXPECT_EQ("/", reportWith([](SubProcess &) {}).at("cwd"));
}

TEST_F(CommandStart, FindsPathAndTheVariablesSetForItAndNoOthers) {
  ::setenv("KOVA_HOST_VARIABLE", "1", 1);
  const Report report = reportWith([](SubProcess &command) {
    command.setEnv("ZZZ", "z");
    command.setEnv("AAA", "a b=c\"");
    command.setEnv("EMPTY", "");
  });
  ::unsetenv("KOVA_HOST_VARIABLE");
  EXPECT_THAT(withPrefix(report, "env "),
              ElementsAre(Pair("AAA", "a b=c\""), Pair("EMPTY", ""), Pair("PATH", ::getenv("PATH")),
                          Pair("ZZZ", "z")));
}

TEST_F(CommandStart, FindsNoPathWhenTheHostHasNone) {
  const std::string path = ::getenv("PATH");
  ::unsetenv("PATH");
  const Report report = reportWith([](SubProcess &) {});
  ::setenv("PATH", path.c_str(), 1);
  EXPECT_THAT(withPrefix(report, "env "), IsEmpty());
}

TEST_F(CommandStart, FindsAnEmptyOrLongPathUnchanged) {
  const std::string path = ::getenv("PATH");
  for (const std::string &value : {std::string(), std::string(100000, 'p')}) {
    ::setenv("PATH", value.c_str(), 1);
    const Report report = reportWith([](SubProcess &) {});
    EXPECT_EQ(value, report.at("env PATH"));
  }
  ::setenv("PATH", path.c_str(), 1);
}

TEST_F(CommandStart, FindsThePathSetForItRatherThanTheHosts) {
  const Report report = reportWith([](SubProcess &command) { command.setEnv("PATH", "/other"); });
  EXPECT_THAT(withPrefix(report, "env "), ElementsAre(Pair("PATH", "/other")));
}

TEST_F(CommandStart, FindsNoVariableWhoseNameIsNone) {
  const Report report = reportWith([](SubProcess &command) {
    command.setEnv("", "1");
    command.setEnv("A=B", "1");
    command.setEnv("GOOD", "1");
  });
  EXPECT_EQ(2U, withPrefix(report, "env ").size());
  EXPECT_EQ("1", report.at("env GOOD"));
}

// Includes what the tests themselves were started with: SIGHUP is ignored under nohup(1).
TEST_F(CommandStart, KeepsTheHostsMaskIgnoredSignalsAndUmask) {
  const auto signals = [](const Report &report, const char *name) {
    return std::stoull(report.at(name), nullptr, 16);
  };
  const auto bit = [](int sig) { return 1ULL << static_cast<unsigned>(sig - 1); };
  const Report before = reportWith([](SubProcess &) {});
  struct sigaction old = {};
  struct sigaction ignored = {};
  ignored.sa_handler = SIG_IGN;
  ::sigaction(SIGUSR1, &ignored, &old);
  sigset_t mask;
  sigset_t oldMask;
  ::sigemptyset(&mask);
  ::sigaddset(&mask, SIGUSR2);
  ::sigprocmask(SIG_BLOCK, &mask, &oldMask);
  const mode_t oldUmask = ::umask(027);
  const Report report = reportWith([](SubProcess &) {});
  ::umask(oldUmask);
  ::sigprocmask(SIG_SETMASK, &oldMask, nullptr);
  ::sigaction(SIGUSR1, &old, nullptr);
  EXPECT_EQ(signals(before, "SigBlk") | bit(SIGUSR2), signals(report, "SigBlk"));
  EXPECT_EQ(signals(before, "SigIgn") | bit(SIGUSR1), signals(report, "SigIgn"));
  EXPECT_NE(signals(before, "SigBlk"), signals(report, "SigBlk"));
  EXPECT_NE(signals(before, "SigIgn"), signals(report, "SigIgn"));
  EXPECT_EQ(std::to_string(027), report.at("umask"));
  EXPECT_EQ(std::to_string(::getpid()), report.at("ppid"));
  EXPECT_EQ(std::to_string(::getpgrp()), report.at("pgid"));
}

TEST_F(CommandStart, AppendsToAFileThatItCreatesWithMode0600) {
  const std::string out = file("out");
  const mode_t old = ::umask(0);
  const Report report = reportWith([&](SubProcess &command) { command.setStdOutput(out, 0); });
  EXPECT_EQ(0600, modeOf(out));
  EXPECT_EQ(out, report.at("fd 1"));
  EXPECT_EQ(kNull, report.at("fd 2"));
  EXPECT_EQ(std::to_string(O_RDWR | O_APPEND), report.at("flags 1"));
  ::umask(0200);
  (void)reportWith([&](SubProcess &command) { command.setStdError(file("err"), 0); });
  EXPECT_EQ(0400, modeOf(file("err")));
  ::umask(old);
}

TEST_F(CommandStart, AppendsToWhatTheFileHolds) {
  std::ofstream(file("out")) << "before\n" << std::flush;
  for (int i = 0; i < 2; ++i) {
    SubProcess echo("/bin/echo");
    echo.addArg("text");
    echo.setStdOutput(file("out"), 0);
    EXPECT_EQ(0, echo.call());
  }
  EXPECT_EQ("before\ntext\ntext\n", readFile(file("out")));
}

TEST_F(CommandStart, SharesAFileThatBothStreamsName) {
  SubProcess shell(Strings{"/bin/sh", "-c", "echo one; echo two >&2; echo three"});
  shell.setStdOutput(file("both"), 0640);
  shell.setStdError(file("both"), 0);
  EXPECT_EQ(0, shell.call());
  EXPECT_EQ("one\ntwo\nthree\n", readFile(file("both")));
  EXPECT_EQ(0640, modeOf(file("both")));
}

TEST_F(CommandStart, GivesTheFileExactlyTheModeAskedFor) {
  const mode_t old = ::umask(077);
  for (const int mode : {0640, 0666, 0777, 0400, 01604}) {
    const std::string out = file("out" + std::to_string(mode));
    (void)reportWith([&](SubProcess &command) { command.setStdOutput(out, mode); });
    EXPECT_EQ(mode, modeOf(out));
  }
  ::umask(old);
}

TEST_F(CommandStart, SetsTheModeOfAFileThatExistsOnlyWhenAsked) {
  const std::string out = file("out");
  std::ofstream(out) << std::flush;
  ::chmod(out.c_str(), 0644);
  (void)reportWith([&](SubProcess &command) { command.setStdError(out, 0); });
  EXPECT_EQ(0644, modeOf(out));
  (void)reportWith([&](SubProcess &command) { command.setStdError(out, 0604); });
  EXPECT_EQ(0604, modeOf(out));
}

TEST_F(CommandStart, TakesARelativeFileFromTheRootFolder) {
  const std::string relative = file("out").substr(1);
  const Report report = reportWith([&](SubProcess &command) { command.setStdOutput(relative, 0); });
  EXPECT_EQ(file("out"), report.at("fd 1"));
}

TEST_F(CommandStart, MakesOneRedirectionAfterTheOther) {
  const int one = ::open(file("one").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  const int two = ::open(file("two").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  Report report = reportWith([&](SubProcess &command) {
    command.setStdOutput(one);
    command.setStdError(two);
  });
  EXPECT_EQ(file("one"), report.at("fd 1"));
  EXPECT_EQ(file("two"), report.at("fd 2"));
  // Standard error after standard output, to the new target of the latter.
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(one);
    command.setStdError(1);
  });
  EXPECT_EQ(file("one"), report.at("fd 2"));
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(file("three"), 0);
    command.setStdError(1);
  });
  EXPECT_EQ(file("three"), report.at("fd 2"));
  // Standard input is /dev/null before anything else is redirected.
  report = reportWith([&](SubProcess &command) { command.setStdOutput(0); });
  EXPECT_EQ(kNull, report.at("fd 1"));
  // The same descriptor twice.
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(two);
    command.setStdError(two);
  });
  EXPECT_EQ(file("two"), report.at("fd 1"));
  EXPECT_EQ(file("two"), report.at("fd 2"));
  EXPECT_THAT(descriptors(report), testing::SizeIs(3));
  ::close(one);
  ::close(two);
}

namespace {

// Opens separate files as descriptors 0 to 2 of the process, and sets their flags.
bool ownStreams(const std::string &folder, int descriptorFlags) {
  for (int fd = 0; fd <= 2; ++fd) {
    const std::string path = folder + std::to_string(fd);
    const int opened = ::open(path.c_str(), O_RDWR | O_CREAT, 0600);
    if (opened < 0 || ::dup2(opened, fd) != fd || (opened > 2 && ::close(opened) != 0) ||
        ::fcntl(fd, F_SETFD, descriptorFlags) != 0) {
      return false;
    }
  }
  return true;
}

} // namespace

TEST_F(CommandStart, HasTheHostsStreamsWhenToldTo) {
  for (const int flags : {0, FD_CLOEXEC}) {
    ::unlink(file("report").c_str());
    EXPECT_EQ(0, runInChild([&] {
                SubProcess command = SubProcess(helperArgs({"report", file("report")}));
                command.setStdOutput(1);
                command.setStdError(2);
                return ownStreams(file("host"), flags) ? command.call() : kBroken;
              }));
    EXPECT_THAT(descriptors(savedReport()),
                ElementsAre(Pair("0", kNull), Pair("1", file("host1")), Pair("2", file("host2"))))
        << "descriptor flags " << flags;
  }
}

TEST_F(CommandStart, HasNullWhereOnlyOneStreamIsTheHosts) {
  EXPECT_EQ(0, runInChild([&] {
              SubProcess command = SubProcess(helperArgs({"report", file("report")}));
              command.setStdOutput(1);
              return ownStreams(file("host"), FD_CLOEXEC) ? command.call() : kBroken;
            }));
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", file("host1")), Pair("2", kNull)));
}

TEST_F(CommandStart, HasNullAsInputThoughTheHostHasNoneAndItsOwnOutput) {
  EXPECT_EQ(0, runInChild([&] {
              SubProcess command = SubProcess(helperArgs({"report", file("report")}));
              command.setStdOutput(1);
              command.setStdError(2);
              return ownStreams(file("host"), 0) && ::close(0) == 0 ? command.call() : kBroken;
            }));
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", file("host1")), Pair("2", file("host2"))));
}

TEST_F(CommandStart, DoesNotExchangeStreams) {
  EXPECT_EQ(0, runInChild([&] {
              SubProcess command = SubProcess(helperArgs({"report", file("report")}));
              command.setStdOutput(2);
              command.setStdError(1);
              return ownStreams(file("host"), 0) ? command.call() : kBroken;
            }));
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", file("host2")), Pair("2", file("host2"))));
}

TEST_F(CommandStart, IsTheSameWhateverStreamsTheHostHasClosed) {
  for (unsigned closed = 1; closed < 8; ++closed) {
    for (unsigned toFile = 0; toFile < 4; ++toFile) {
      SCOPED_TRACE(testing::Message() << "closed " << closed << ", to files " << toFile);
      ::unlink(file("report").c_str());
      EXPECT_EQ(0, runInChild([&] {
                  SubProcess command = SubProcess(helperArgs({"report", file("report")}));
                  if ((toFile & 1U) != 0) {
                    command.setStdOutput(file("out"), 0640);
                  }
                  if ((toFile & 2U) != 0) {
                    command.setStdError(file("err"), 0640);
                  }
                  for (int fd = 0; fd <= 2; ++fd) {
                    if ((closed & (1U << static_cast<unsigned>(fd))) != 0) {
                      ::close(fd);
                    }
                  }
                  return command.call();
                }));
      EXPECT_THAT(descriptors(savedReport()),
                  ElementsAre(Pair("0", kNull), Pair("1", (toFile & 1U) != 0 ? file("out") : kNull),
                              Pair("2", (toFile & 2U) != 0 ? file("err") : kNull)));
    }
  }
}

TEST_F(CommandStart, HasADescriptorOfTheHostInPlaceOfAClosedStream) {
  const int fd = ::open(file("out").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  EXPECT_EQ(0, runInChild([&] {
              SubProcess command = SubProcess(helperArgs({"report", file("report")}));
              command.setStdOutput(fd);
              ::close(1);
              ::close(2);
              return command.call();
            }));
  ::close(fd);
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", file("out")), Pair("2", kNull)));
}

class CommandStartAmongMany : public CommandStart, public testing::WithParamInterface<int> {};

TEST_P(CommandStartAmongMany, HasThreeDescriptors) {
  const DescriptorLimit limit(RLIM_INFINITY);
  const std::size_t wanted = static_cast<std::size_t>(GetParam());
  ManyDescriptors many(wanted);
  if (many.count() < wanted) {
    many.closeLast(10); // what the launch itself needs
    if (many.count() < wanted - wanted / 50) {
      GTEST_SKIP() << "skipped: no more than " << many.count() << " descriptors allowed here";
    }
  }
  EXPECT_EQ(0, reporter().call());
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
}

INSTANTIATE_TEST_SUITE_P(Descriptors, CommandStartAmongMany, testing::Values(3000, 20000));

// More than one read of the list returns, with its own descriptor among the first of them.
TEST_F(CommandStart, HasThreeDescriptorsThoughTheListIsReadBelowTheOthers) {
  constexpr std::size_t kMany = 5000;
  const DescriptorLimit limit(RLIM_INFINITY);
  ManyDescriptors many(kMany);
  if (many.count() < kMany) {
    GTEST_SKIP() << "skipped: no more than " << many.count() << " descriptors allowed here";
  }
  many.closeFirst(10);
  EXPECT_EQ(0, reporter().call());
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
}

TEST_F(CommandStart, ClosesWhatIsOpenAndNotEveryNumberThatCouldBe) {
  const DescriptorLimit limit(RLIM_INFINITY);
  const ManyDescriptors many(100);
  const Recording calls;
  EXPECT_EQ(0, reporter().call());
  const int closed = countCalls(calls.children(), "close ");
  EXPECT_GE(closed, 100);
  EXPECT_LE(closed, 150);
}

namespace {

// The descriptors above 2 of this process.
std::vector<int> othersOpen() {
  std::vector<int> open;
  DIR *const list = ::opendir("/proc/self/fd");
  while (const dirent *entry = ::readdir(list)) {
    const int fd = std::atoi(entry->d_name);
    if (fd > STDERR_FILENO && fd != ::dirfd(list)) {
      open.push_back(fd);
    }
  }
  ::closedir(list);
  return open;
}

// Opens descriptors from 3 to highest, each with the given probability, and no others.
void openSome(std::mt19937 &random, int highest, double probability) {
  for (const int fd : othersOpen()) {
    ::close(fd);
  }
  std::bernoulli_distribution chosen(probability);
  for (int fd = 3; fd <= highest; ++fd) {
    if (chosen(random)) {
      ::dup2(STDIN_FILENO, fd);
    }
  }
}

} // namespace

// Whatever gaps there are, also those that the launch fills itself, and whether the kernel closes
// ranges, closes none, or closes only one of two.
TEST_F(CommandStart, ClosesExactlyWhatTheListNames) {
  for (unsigned seed = 0; seed < 60; ++seed) {
    SCOPED_TRACE(seed);
    std::mt19937 random(seed);
    const double probability = std::array<double, 4>{0.02, 0.5, 0.95, 1}[seed % 4];
    const int highest = std::array<int, 3>{20, 300, 900}[seed % 3];
    for (const int failing : {1, 2, 99}) {
      const ChildFault refused("close_range", failing, failing == 1 ? ENOSYS : EPERM, true);
      EXPECT_EQ(0, runInChild([&] {
                  openSome(random, highest, probability);
                  const bool failed = !SubProcess("/none/such/program").exec();
                  return failed && othersOpen().empty() ? 0 : 1;
                }));
    }
  }
}

TEST_F(CommandStart, IsSparedACallForEachOfManyDescriptors) {
  const ManyDescriptors many(900);
  ASSERT_EQ(900U, many.count());
  const Recording calls;
  EXPECT_EQ(0, reporter().call());
  EXPECT_EQ(2, countCalls(calls.children(), "close_range ")); // below the list and above it
  EXPECT_LE(countCalls(calls.children(), "close "), 300);
}

TEST_F(CommandStart, HasThreeDescriptorsThoughTheKernelClosesNoRange) {
  const ManyDescriptors many(600);
  ASSERT_EQ(600U, many.count());
  for (const int error : {ENOSYS, EPERM}) {
    forEachChildFailure("close_range", error, [&](int, const ChildFault &) {
      EXPECT_EQ(0, reporter().call());
      EXPECT_THAT(descriptors(savedReport()),
                  ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
    });
  }
  EXPECT_THAT(failures(), IsEmpty());
}

TEST_F(CommandStart, ClosesFewDescriptorsOneByOne) {
  const ManyDescriptors many(100);
  const Recording calls;
  EXPECT_EQ(0, reporter().call());
  EXPECT_EQ(0, countCalls(calls.children(), "close_range "));
}

TEST_F(CommandStart, HasThreeDescriptorsWhicheverCloseReportsAFailure) {
  const ManyDescriptors many(20);
  forEachChildFailure("close", EIO, [&](int, const ChildFault &) {
    EXPECT_EQ(0, reporter().call());
    EXPECT_THAT(descriptors(savedReport()),
                ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
  });
}

TEST_F(CommandStart, IsRidOfDescriptorsBeyondALimitThatWasLowered) {
  constexpr int kHigh = 15000;
  const DescriptorLimit raised(RLIM_INFINITY);
  const int low = ::open("/dev/zero", O_RDONLY);
  const int high = ::fcntl(low, F_DUPFD, kHigh);
  if (high < 0) {
    ::close(low);
    GTEST_SKIP() << "skipped: no descriptor " << kHigh << " allowed here";
  }
  {
    const DescriptorLimit lowered(64);
    EXPECT_EQ(0, reporter().call());
  }
  ::close(high);
  ::close(low);
  EXPECT_THAT(descriptors(savedReport()),
              ElementsAre(Pair("0", kNull), Pair("1", kNull), Pair("2", kNull)));
}

TEST_F(CommandStart, KeepsWhatItInheritsWhenTheListCannotBeRead) {
  const int open = ::open("/dev/zero", O_RDONLY);
  const ChildFault fault("opendir", 1, EMFILE);
  EXPECT_EQ(0, reporter().call());
  const Report found = descriptors(savedReport());
  EXPECT_EQ("/dev/zero", found.at(std::to_string(open)));
  EXPECT_THAT(failures(), IsEmpty());
  EXPECT_TRUE(fault.fired());
  ::close(open);
}

TEST_F(CommandStart, IsPreparedInThisOrder) {
  const int fd = ::open(file("descriptor").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  command.setEnv("B", "2");
  command.setEnv("A", "1");
  command.setStdOutput(file("out"), 0640);
  command.setStdError(fd);
  const Recording calls;
  EXPECT_EQ(0, command.call());
  Strings steps;
  for (std::string call : calls.children()) {
    // Numbers that depend on other open descriptors.
    if (call.rfind("dup2 ", 0) == 0 || call.rfind("fchmod ", 0) == 0) {
      call.replace(call.find(' ') + 1, call.rfind(' ') - call.find(' ') - 1, "N");
    }
    if (call.rfind("close ", 0) == 0) {
      call = "close";
    }
    if (steps.empty() || steps.back() != call || call != "close") {
      steps.push_back(call);
    }
  }
  ::close(fd);
  const std::string flags = "0x442"; // O_RDWR | O_CREAT | O_APPEND
  EXPECT_THAT(steps, ElementsAre("sigaction 17 read", "sigaction 17 write", "chdir /",
                                 "getenv PATH", "clearenv", "setenv PATH 1", "setenv A 1",
                                 "setenv B 1", "open /dev/null 0x2 0", "dup2 N 0",
                                 "open " + file("out") + " " + flags + " 600", "fchmod N 640",
                                 "dup2 N 1", "close", "dup2 N 2", "opendir /proc/self/fd", "close",
                                 "closedir", "execv " + kHelper));
}

TEST_F(CommandStart, IsLoggedBeforeItHappens) {
  SubProcess command = SubProcess(helperArgs({"exit", "3", "a b", "", "%s%n"}));
  EXPECT_EQ(3, WEXITSTATUS(command.call()));
  const std::string tag = std::to_string(LOG_DEBUG) + " (PID) [debug] proc/subprocess:";
  EXPECT_THAT(logged(),
              ElementsAre(tag + "247 launch command:", tag + "250 arg[0] = [" + kHelper + "]",
                          tag + "250 arg[1] = [exit]", tag + "250 arg[2] = [3]",
                          tag + "250 arg[3] = [a b]", tag + "250 arg[4] = []",
                          tag + "250 arg[5] = [%s%n]"));
}

TEST_F(CommandStart, IsLoggedWholeHoweverLong) {
  const std::string text(100000, 'x');
  SubProcess command = SubProcess(helperArgs({"exit", "0", text}));
  EXPECT_EQ(0, command.call());
  EXPECT_EQ("7 (PID) [debug] proc/subprocess:250 arg[3] = [" + text + "]", logged().at(4));
}

TEST_F(CommandStart, IgnoresFailuresOfFolderAndEnvironment) {
  for (const char *function : {"chdir", "clearenv", "setenv"}) {
    forEachChildFailure(function, ENOMEM, [&](int, const ChildFault &) {
      SubProcess command = SubProcess(helperArgs({"exit", "0"}));
      command.setEnv("NAME", "value");
      EXPECT_EQ(0, command.call());
    });
  }
  EXPECT_THAT(failures(), IsEmpty());
}

TEST_F(CommandStart, GoesOnWithTheVariablesWhenTheEnvironmentCannotBeCleared) {
  const ChildFault fault("clearenv", 1, ENOMEM);
  const Report report = reportWith([](SubProcess &command) { command.setEnv("NAME", "value"); });
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ(::getenv("PATH"), report.at("env PATH"));
  EXPECT_EQ("value", report.at("env NAME"));
}

TEST_F(CommandStart, LacksOnlyTheVariableThatCannotBeSet) {
  const std::vector<std::string> names = {"PATH", "A", "B"}; // in the order of their setting
  for (std::size_t failed = 0; failed < names.size(); ++failed) {
    const ChildFault fault("setenv", static_cast<int>(failed) + 1, ENOMEM);
    const Report report = reportWith([](SubProcess &command) {
      command.setEnv("A", "1");
      command.setEnv("B", "2");
    });
    for (std::size_t i = 0; i < names.size(); ++i) {
      EXPECT_EQ(i == failed ? 0U : 1U, report.count("env " + names[i])) << names[i];
    }
  }
}

TEST_F(CommandStart, FailsWithoutNullOrAFileOfItsStreams) {
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  command.setStdOutput(file("out"), 0);
  command.setStdError(file("err"), 0);
  const Strings expected = {failure(213, "open /dev/null", EMFILE),
                            failure(140, "open [" + file("out") + "]", EMFILE),
                            failure(140, "open [" + file("err") + "]", EMFILE)};
  forEachChildFailure("open", EMFILE, [&](int nth, const ChildFault &) {
    if (nth <= 3) {
      EXPECT_THAT(failuresOf(command), ElementsAre(expected[static_cast<std::size_t>(nth - 1)]));
    } else {
      EXPECT_EQ(0, command.call());
    }
  });
}

TEST_F(CommandStart, FailsWithoutTheModeOfAFile) {
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  command.setStdOutput(file("out"), 0640);
  command.setStdError(file("err"), 0640);
  forEachChildFailure("fchmod", EPERM, [&](int nth, const ChildFault &) {
    if (nth <= 2) {
      EXPECT_THAT(failuresOf(command), ElementsAre(failure(146, "fchmod", EPERM)));
    } else {
      EXPECT_EQ(0, command.call());
    }
  });
}

TEST_F(CommandStart, FailsWithoutAnyOneOfItsStreams) {
  const std::array<std::string, 3> expected = {failure(222, "dup2 0", EBUSY),
                                               failure(159, "dup2(1)", EBUSY),
                                               failure(159, "dup2(2)", EBUSY)};
  const auto expectFailures = [&](const SubProcess &command) {
    forEachChildFailure("dup2", EBUSY, [&](int nth, const ChildFault &) {
      if (nth <= 3) {
        EXPECT_THAT(failuresOf(command), ElementsAre(expected[static_cast<std::size_t>(nth - 1)]));
      } else {
        EXPECT_EQ(0, command.call());
      }
    });
  };
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  expectFailures(command);
  command.setStdOutput(file("out"), 0);
  command.setStdError(file("err"), 0);
  expectFailures(command);
  const int fd = ::open(file("out").c_str(), O_RDWR | O_CLOEXEC);
  command.setStdOutput(fd);
  command.setStdError(fd);
  expectFailures(command);
  ::close(fd);
}

TEST_F(CommandStart, FailsWithoutAnyCopyOfTheHostsOwnStream) {
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  command.setStdOutput(1);
  forEachChildFailure("dup2", EBUSY, [&](int nth, const ChildFault &) {
    if (nth == 1) {
      EXPECT_THAT(failuresOf(command), ElementsAre(failure(222, "dup2 0", EBUSY)));
    } else if (nth <= 4) {
      EXPECT_THAT(failuresOf(command), ElementsAre(failure(159, "dup2(1)", EBUSY)));
    } else if (nth == 5) {
      EXPECT_THAT(failuresOf(command), ElementsAre(failure(159, "dup2(2)", EBUSY)));
    } else {
      EXPECT_EQ(0, command.call());
    }
  });
}

TEST_F(CommandStart, FailsForADescriptorThatIsNotOpen) {
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  command.setStdOutput(12345);
  EXPECT_THAT(failuresOf(command), ElementsAre(failure(159, "dup2(1)", EBADF)));
  command.setStdOutput(-1);
  command.setStdError(12345);
  EXPECT_THAT(failuresOf(command), ElementsAre(failure(159, "dup2(2)", EBADF)));
}

// By the time of the redirection, /dev/null has the next free number.
TEST_F(CommandStart, HasNullForADescriptorThatIsTheFirstFreeOne) {
  EXPECT_EQ(0, runInChild([&] {
              SubProcess command = SubProcess(helperArgs({"report", file("report")}));
              command.setStdError(2);
              ::close(2);
              return command.call();
            }));
  EXPECT_EQ(kNull, savedReport().at("fd 2"));
}

TEST_F(CommandStart, FailsForAFileThatCannotBeOpened) {
  SubProcess command = SubProcess(helperArgs({"exit", "0"}));
  const std::string path = file("none/out");
  command.setStdOutput(path, 0);
  EXPECT_THAT(failuresOf(command), ElementsAre(failure(140, "open [" + path + "]", ENOENT)));
  command.setStdOutput("/", 0);
  EXPECT_THAT(failuresOf(command), ElementsAre(failure(140, "open [/]", EISDIR)));
}

TEST_F(CommandStart, FailsForWhatCannotBeExecuted) {
  std::ofstream(file("text")) << "no program" << std::flush;
  const std::vector<std::pair<std::string, int>> programs = {{"/none/such/program", ENOENT},
                                                             {"true", ENOENT},
                                                             {"", ENOENT},
                                                             {"/", EACCES},
                                                             {file("text"), EACCES}};
  for (const auto &[program, error] : programs) {
    EXPECT_THAT(failuresOf(SubProcess(program)),
                ElementsAre(failure(256, "execv [" + program + "]", error)));
  }
}

TEST_F(CommandStart, FailsForAnArgumentLongerThanTheSystemTakes) {
  const std::size_t tooLong = 32U * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) + 1;
  EXPECT_THAT(failuresOf(SubProcess(helperArgs({"exit", "0", std::string(tooLong, 'x')}))),
              ElementsAre(failure(256, "execv [" + kHelper + "]", E2BIG)));
}

TEST_F(CommandStart, FailsForACommandWithoutArguments) {
  EXPECT_THAT(failuresOf(SubProcess(Strings())), ElementsAre(failure(256, "execv []", ENOENT)));
  EXPECT_EQ("7 (PID) [debug] proc/subprocess:247 launch command:", logged().front());
  EXPECT_EQ(2U, logged().size());
}

class Exec : public CommandStart {
protected:
  // Descriptors above 2 that are open now.
  static int otherDescriptors() {
    int count = 0;
    for (int fd = 3; fd < 1000; ++fd) {
      count += ::fcntl(fd, F_GETFD) != -1 ? 1 : 0;
    }
    return count;
  }
};

TEST_F(Exec, TurnsTheProcessIntoTheCommand) {
  const std::string pidFile = file("pid");
  EXPECT_EQ(5, runInChild([&] {
              std::ofstream(pidFile) << ::getpid() << std::flush;
              SubProcess command = SubProcess(helperArgs({"report", file("report"), "5"}));
              command.setStdOutput(file("out"), 0);
              command.setEnv("NAME", "value");
              (void)command.exec();
              return kBroken;
            }));
  const Report report = savedReport();
  EXPECT_EQ(readFile(pidFile), report.at("pid"));
  EXPECT_EQ("/", report.at("cwd"));
  EXPECT_EQ("value", report.at("env NAME"));
  EXPECT_THAT(descriptors(report),
              ElementsAre(Pair("0", kNull), Pair("1", file("out")), Pair("2", kNull)));
}

TEST_F(Exec, TouchesNoSignalAndForksNothing) {
  const Recording calls;
  EXPECT_EQ(0, runInChild([&] {
              (void)SubProcess(helperArgs({"exit", "0"})).exec();
              return kBroken;
            }));
  EXPECT_EQ(0, countCalls(calls.children(), "sigaction"));
  EXPECT_EQ(0, countCalls(calls.children(), "signal"));
  EXPECT_EQ(0, countCalls(calls.children(), "fork"));
}

TEST_F(Exec, GivesFalseAndLeavesTheProcessChangedWhenItFails) {
  EXPECT_EQ(0, runInChild([&] {
              ::setenv("KOVA_HOST_VARIABLE", "1", 1);
              SubProcess command("/none/such/program");
              command.setEnv("NAME", "value");
              if (command.exec()) {
                return 1;
              }
              char cwd[100] = "";
              return ::getcwd(cwd, sizeof cwd) == nullptr || std::string(cwd) != "/" ? 2
                     : ::getenv("KOVA_HOST_VARIABLE") != nullptr                     ? 3
                     : ::getenv("NAME") == nullptr                                   ? 4
                     : otherDescriptors() != 0                                       ? 5
                                                                                     : 0;
            }));
  EXPECT_THAT(failures(), ElementsAre(failure(256, "execv [/none/such/program]", ENOENT)));
}

TEST_F(Exec, LeavesNoDescriptorOfItsOwnWhereverItFails) {
  for (const char *function : {"open", "dup2", "fchmod", "opendir", "execv"}) {
    forEachChildFailure(function, EIO, [&](int, const ChildFault &fault) {
      EXPECT_EQ(0, runInChild([&] {
                  SubProcess command("/none/such/program");
                  command.setStdOutput(file("out"), 0640);
                  command.setStdError(file("err"), 0640);
                  const int before = otherDescriptors();
                  if (command.exec()) {
                    return 1;
                  }
                  const int after = otherDescriptors();
                  // Either the step before the sweep failed, or the sweep, or neither of them.
                  return after == before || after == 0 ? 0 : 2;
                }));
      (void)fault;
    });
  }
}

TEST_F(Exec, ClosesNullAgainWhereItLiesInPlaceOfAClosedStream) {
  EXPECT_EQ(
      0, runInChild([] {
        ::close(0);
        return SubProcess("/none/such/program").exec() ? 1 : ::fcntl(0, F_GETFD) != -1 ? 2 : 0;
      }));
}

// After the sweep the number of /dev/null may belong to another file: that of the system log, or
// one of a thread.
TEST_F(Exec, ClosesNoDescriptorTwice) {
  const Recording calls;
  EXPECT_EQ(0, runInChild([] { return SubProcess("/none/such/program").exec() ? 1 : 0; }));
  const Strings all = calls.children();
  const auto last = std::find(all.begin(), all.end(), "execv /none/such/program");
  EXPECT_THAT(Strings(last, all.end()), ElementsAre("execv /none/such/program", "_exit 0"));
}
