// The support of the tests itself: a guard that sees nothing, or a loop that injects nothing, would
// make every test weaker without a sign.

#include "kovabackup/string_util.h"

#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"
#include "tests/support/child_process.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <dlfcn.h>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest-spi.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>
#include <vector>

using namespace KovaTest;
using testing::Each;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

// The failures that a statement would add to its test.
std::vector<std::string> failuresOf(const std::function<void()> &statement) {
  testing::TestPartResultArray results;
  {
    const testing::ScopedFakeTestPartResultReporter reporter(
        testing::ScopedFakeTestPartResultReporter::INTERCEPT_ONLY_CURRENT_THREAD, &results);
    statement();
  }
  std::vector<std::string> messages;
  for (int i = 0; i < results.size(); ++i) {
    messages.emplace_back(results.GetTestPartResult(i).message());
  }
  return messages;
}

// Calls of calloc that no compiler removes. Each returns whether it got memory.
bool callocWorks() {
  static void *(*const volatile allocate)(std::size_t, std::size_t) = &std::calloc;
  void *const memory = allocate(3, 5);
  std::free(memory);
  return memory != nullptr;
}

bool newWorks(void *(*allocate)(std::size_t)) {
  try {
    ::operator delete(allocate(8));
    return true;
  } catch (const std::bad_alloc &) {
    return false;
  }
}

} // namespace

TEST(Census, SeesDescriptorsSignalsEnvironmentAndFiles) {
  const Census before = takeCensus();
  const int fd = ::open("/dev/null", O_RDONLY);
  EXPECT_NE(before, takeCensus());
  ::close(fd);
  struct sigaction old {};
  struct sigaction ignored {};
  ignored.sa_handler = SIG_IGN;
  ::sigaction(SIGUSR1, &ignored, &old);
  EXPECT_NE(before, takeCensus());
  ::sigaction(SIGUSR1, &old, nullptr);
  ::setenv("KOVA_TEST_CENSUS", "1", 1);
  EXPECT_NE(before, takeCensus());
  ::unsetenv("KOVA_TEST_CENSUS");
  ::mkdir("/tmp/census", 0700);
  EXPECT_NE(before, takeCensus());
  ::rmdir("/tmp/census");
  EXPECT_EQ(before, takeCensus());
}

// Also run with these signals ignored.
TEST(Signals, AreNotIgnoredWhateverTheCallerIgnores) {
  for (const int sig : {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGPIPE, SIGCHLD}) {
    struct sigaction action {};
    ASSERT_EQ(0, ::sigaction(sig, nullptr, &action));
    EXPECT_EQ(SIG_DFL, action.sa_handler) << sig;
  }
}

TEST(PrivateTmp, IsAFileSystemOfItsOwn) {
  struct stat tmp {};
  struct stat root {};
  ASSERT_EQ(0, ::stat("/tmp", &tmp));
  ASSERT_EQ(0, ::stat("/", &root));
  EXPECT_NE(tmp.st_dev, root.st_dev);
}

TEST(LogCapture, ListsLinesInOrderAndForgetsThemWhenTaken) {
  LogCapture log;
  ::syslog(LOG_INFO, "first %d", 1);
  ::syslog(LOG_ERR, "second");
  EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_INFO, "first 1"}, LogLine{LOG_ERR, "second"}));
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST(Fault, FailsTheCallWithTheGivenNumberOnly) {
  const Fault fault("access", 2, ENOSPC);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_FALSE(fault.fired());
  errno = 0;
  EXPECT_EQ(-1, ::access("/", F_OK));
  EXPECT_EQ(ENOSPC, errno);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_EQ(3, fault.calls());
}

TEST(Fault, LastsWhenAsked) {
  const Fault fault("access", 2, EIO, true);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_EQ(-1, ::access("/", F_OK));
  EXPECT_EQ(-1, ::access("/", F_OK));
}

TEST(ChildFault, FailsTheCallsOfForkedChildrenOnly) {
  const ChildFault fault("calloc", 2, ENOSPC);
  EXPECT_TRUE(callocWorks() && callocWorks());
  EXPECT_EQ(0, fault.calls());
  EXPECT_EQ(0,
            runInChild([] { return callocWorks() && !callocWorks() && errno == ENOSPC ? 0 : 1; }));
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ(0, runInChild([] { return callocWorks() ? 0 : 1; })) << "the third call";
  EXPECT_EQ(3, fault.calls());
}

TEST(ChildFault, LastsWhenAsked) {
  const ChildFault fault("calloc", 2, EIO, true);
  EXPECT_EQ(0,
            runInChild([] { return callocWorks() && !callocWorks() && !callocWorks() ? 0 : 1; }));
}

TEST(CountingLoop, FailsEachCallOnceAndThenLasting) {
  std::vector<std::string> runs;
  forEachFailure("access", EIO, [&](Fault &) {
    std::string run;
    for (int call = 0; call < 2; ++call) {
      run += ::access("/", F_OK) == 0 ? "+" : "-";
    }
    runs.push_back(run);
  });
  EXPECT_THAT(runs, ElementsAre("-+", "+-", "++", "--", "+-", "++"));
}

TEST(CountingLoop, FailsTheCallsOfChildrenOnceAndThenLasting) {
  std::vector<int> runs;
  forEachChildFailure("calloc", ENOMEM, [&](int nth, const ChildFault &) {
    runs.push_back(10 * nth + runInChild([] { return callocWorks() ? 1 : 0; }));
  });
  EXPECT_THAT(runs, ElementsAre(10, 21, 10, 21));
}

TEST(CountingLoop, FailsEachAllocationOnce) {
  std::vector<bool> runs;
  forEachAllocation(
      [] {
        ::operator delete(::operator new(8));
        ::operator delete[](::operator new[](8));
        (void)KOVA::Backup::stringf("%200d", 1); // one of the shared library's
      },
      [&](bool threw) { runs.push_back(threw); });
  ASSERT_GE(runs.size(), 4U);
  EXPECT_FALSE(runs.back());
  runs.pop_back();
  EXPECT_THAT(runs, Each(true));
}

TEST(CountingLoop, FailsEachMallocOnce) {
  std::vector<bool> runs;
  forEachMalloc(
      [] {
        ::operator delete(::operator new(8)); // calls malloc
        void *(*const volatile allocate)(std::size_t) = &std::malloc;
        void *const memory = allocate(8);
        if (memory == nullptr) {
          throw std::bad_alloc();
        }
        std::free(memory);
      },
      [&](bool threw) { runs.push_back(threw); });
  EXPECT_THAT(runs, ElementsAre(true, true, false));
}

TEST(CountingLoop, FailsTheTestWhenItInjectsNothing) {
  EXPECT_THAT(failuresOf([] { forEachFailure("access", EIO, [](Fault &) {}); }),
              AllOf(SizeIs(2), Each(HasSubstr("access is not called at all"))));
  EXPECT_THAT(failuresOf([] {
                forEachChildFailure("calloc", ENOMEM, [](int, const ChildFault &) {
                  EXPECT_EQ(0, runInChild([] { return 0; }));
                });
              }),
              AllOf(SizeIs(2), Each(HasSubstr("the child's calloc is not called at all"))));
  EXPECT_THAT(failuresOf([] { forEachAllocation([] {}, [](bool) {}); }),
              ElementsAre(HasSubstr("operator new is not called at all")));
}

TEST(CountingLoop, FailsTheTestWhenItDoesNotEnd) {
  EXPECT_THAT(
      failuresOf([] { countFailures("access", Failing::Once, [](int, bool) { return true; }); }),
      ElementsAre(HasSubstr("access is called without end")));
}

TEST(AllocFailure, ThrowsAtTheGivenCallOnly) {
  for (void *(*const allocate)(std::size_t) :
       {static_cast<void *(*)(std::size_t)>(&::operator new),
        static_cast<void *(*)(std::size_t)>(&::operator new[])}) {
    std::vector<bool> worked(3);
    const AllocFailure failure(2);
    for (int call = 0; call < 3; ++call) {
      worked[static_cast<std::size_t>(call)] = newWorks(allocate);
    }
    const int calls = failure.calls();
    EXPECT_TRUE(failure.fired());
    EXPECT_EQ(3, calls);
    EXPECT_THAT(worked, ElementsAre(true, false, true));
  }
}

TEST(AllocFailure, KnowsTheSizeThatCallocWasAskedFor) {
  EXPECT_TRUE(callocWorks());
  EXPECT_EQ(15U, takeCallocSize());
  EXPECT_EQ(0U, takeCallocSize());
}

TEST(Files, AreReadAndWrittenPastEveryFault) {
  const TestFolder folder;
  const Fault opening("open", 1, EIO, true);
  const Fault openingAt("openat", 1, EIO, true);
  const Fault reading("read", 1, EIO, true);
  const Fault writing("write", 1, EIO, true);
  const std::string path = writeFile(folder / "file", "long enough");
  EXPECT_EQ(folder / "file", path);
  EXPECT_EQ("long enough", readFile(path));
  EXPECT_EQ("short", readFile(writeFile(path, "short")));
  EXPECT_EQ(0, opening.calls() + openingAt.calls() + reading.calls() + writing.calls());
}

TEST(Files, FailTheTestWhenTheyCannotBeReadOrWritten) {
  EXPECT_THAT(failuresOf([] { readFile("/tmp/absent"); }), ElementsAre(HasSubstr("/tmp/absent")));
  EXPECT_THAT(failuresOf([] { writeFile("/tmp/absent/file", ""); }),
              ElementsAre(HasSubstr("/tmp/absent/file")));
  EXPECT_THAT(failuresOf([] { readFile("/tmp"); }), ElementsAre(HasSubstr("Is a directory")));
}

TEST(Files, HaveTheirModesAndNames) {
  const TestFolder folder;
  const ScopedUmask umask(027);
  EXPECT_EQ(0640, modeOf(writeFile(folder / "b", "")));
  ASSERT_EQ(0, ::chmod((folder / "b").c_str(), 06751));
  EXPECT_EQ(06751, modeOf(folder / "b"));
  EXPECT_EQ(-1, modeOf(folder / "absent"));
  ASSERT_EQ(0, ::symlink("absent", (folder / "a").c_str()));
  EXPECT_TRUE(isThere(folder / "a")) << "a dangling link";
  EXPECT_FALSE(isThere(folder / "absent"));
  EXPECT_THAT(folder.names(), ElementsAre("a", "b"));
  EXPECT_THAT(namesIn(folder / "absent"), IsEmpty());
}

TEST(TestFolder, IsEmptyAndGoneAfterwards) {
  {
    const TestFolder first;
    const TestFolder second;
    EXPECT_EQ("/tmp/scratch", first.path());
    EXPECT_EQ("/tmp/scratch2", second.path());
    EXPECT_THAT(first.names(), IsEmpty());
    ASSERT_EQ(0, ::mkdir((second / "inner").c_str(), 0700));
    writeFile(second / "inner/file", "");
  }
  EXPECT_FALSE(isThere("/tmp/scratch"));
  EXPECT_FALSE(isThere("/tmp/scratch2"));
}

TEST(ChildProcess, ReportsItsExitCode) {
  EXPECT_EQ(7, runInChild([] { return 7; }));
  EXPECT_EQ(-1, runInChild([] { return ::raise(SIGKILL); }));
}

TEST(ChildProcess, RunsWithItsNumberBesideOthers) {
  const SharedCounter sum;
  runInChildren(4, [&](int number) {
    *sum += 1 << (4 * number);
    return true;
  });
  EXPECT_EQ(0x1111, *sum);
  EXPECT_THAT(failuresOf([] { runInChildren(3, [](int number) { return number != 1; }); }),
              SizeIs(1));
}

TEST(Shell, GivesExitCodeAndOutput) {
  const ShellResult result = runShell("echo a; echo b; exit 3");
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("a\nb\n", result.output);
  EXPECT_EQ(-1, runShell("kill -9 $$").exitCode);
}

TEST(Interposers, AreWhatSharedLibrariesCall) {
  for (const char *name : {"syslog", "vsyslog", "open", "openat", "mkdir", "fchmod", "calloc"}) {
    Dl_info found{};
    ASSERT_NE(0, ::dladdr(definitionOf(name, RTLD_DEFAULT), &found)) << name;
    Dl_info own{};
    ASSERT_NE(0, ::dladdr(reinterpret_cast<void *>(&countOpenDescriptors), &own));
    EXPECT_EQ(own.dli_fbase, found.dli_fbase) << name << " is found in " << found.dli_fname;
  }
}
