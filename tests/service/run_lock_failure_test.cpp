// Each step of taking a run lock fails, and its file is replaced meanwhile.

#include "tests/service/lock_support.h"

#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/interpose.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <vector>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::function<void()> beforeFlock;
std::function<void()> beforeSleep;
std::vector<long> sleeps; // in nanoseconds
int otherDevices = 0;     // how often the lock file seems to be on another file system

} // namespace

extern "C" {
KOVA_INTERPOSE_NOTHROW(int, ftruncate, -1, (int fd, off_t size), (fd, size))
KOVA_INTERPOSE(ssize_t, pwrite, -1, (int fd, const void *data, size_t size, off_t at),
               (fd, data, size, at))
KOVA_INTERPOSE(ssize_t, read, -1, (int fd, void *buffer, size_t size), (fd, buffer, size))

int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (beforeFlock) {
    beforeFlock();
  }
  return failsNow("flock") ? -1 : real(fd, operation);
}

int lstat(const char *path, struct stat *out) noexcept {
  static auto *const real = realFunction<int(const char *, struct stat *)>("lstat");
  if (failsNow("lstat") || real(path, out) != 0) {
    return -1;
  }
  if (path == kLockFile && otherDevices > 0) {
    --otherDevices;
    ++out->st_dev;
  }
  return 0;
}

int nanosleep(const struct timespec *time, struct timespec *left) {
  static auto *const real =
      realFunction<int(const struct timespec *, struct timespec *)>("nanosleep");
  sleeps.push_back(time->tv_nsec);
  EXPECT_EQ(0, time->tv_sec);
  if (beforeSleep) {
    beforeSleep();
  }
  return failsNow("nanosleep") ? -1 : real(time, left);
}
}

namespace {

namespace fs = std::filesystem;

class RunLockFailure : public testing::Test {
protected:
  void TearDown() override {
    beforeFlock = {};
    beforeSleep = {};
    sleeps.clear();
  }

  Error error_;
  RunLock lock_{"run"};
};

ino_t inodeOf(const std::string &path) {
  struct stat info = {};
  EXPECT_EQ(0, ::stat(path.c_str(), &info));
  return info.st_ino;
}

} // namespace

TEST_F(RunLockFailure, OfAStepLeavesNothingLocked) {
  const std::string locks = "/tmp/kovabackup/lock";
  struct Case {
    const char *function;
    const char *step;
    std::string path;
    bool logs;
  };
  for (const Case &c : std::initializer_list<Case>{{"mkdir", "createIpcTempPath", locks, true},
                                                   {"chmod", "createIpcTempPath", locks, true},
                                                   {"flock", "flock", kLockFile, false},
                                                   {"lstat", "lstat", kLockFile, false}}) {
    SCOPED_TRACE(c.function);
    forEachFailure(c.function, EIO, [&](Fault &fault) {
      LogCapture log;
      error_ = Error();
      const bool taken = lock_.take(error_, Millis(-1));
      EXPECT_EQ(!fault.fired(), taken);
      EXPECT_EQ(taken, lock_.fd() >= 0);
      EXPECT_EQ(c.logs && fault.fired() ? 1U : 0U, log.take().size());
      if (fault.fired()) {
        expectError(error_, EIO, c.step, c.path);
      }
      lock_.release();
    });
    EXPECT_TRUE(isFree("run"));
  }
}

TEST_F(RunLockFailure, ToOpenOrExamineTheFile) {
  const Fault open("open", 1, EMFILE);
  EXPECT_FALSE(lock_.take(error_));
  expectError(error_, EMFILE, "open", kLockFile);
  const Fault fstat("fstat", 1, EIO);
  EXPECT_FALSE(lock_.take(error_));
  expectError(error_, EIO, "fstat", kLockFile);
  EXPECT_TRUE(lock_.take(error_));
}

// The lock is what counts. What its holder cannot write, holder does not report.
TEST_F(RunLockFailure, ToWriteTheNoteIsNone) {
  for (const char *function : {"pwrite", "ftruncate", "read"}) {
    SCOPED_TRACE(function);
    forEachFailure(function, ENOSPC, [&](Fault &fault) {
      EXPECT_TRUE(lock_.take(error_));
      const std::string note = readFile(kLockFile);
      const std::string begin = std::to_string(::getpid()) + " ";
      const bool written = note.compare(0, begin.size(), begin) == 0 && note.back() == '\n';
      EXPECT_TRUE(written || (fault.fired() && note.empty())) << note;
      lock_.release();
    });
  }
  expectError(error_, 0, "", "");
}

TEST_F(RunLockFailure, ToWriteTheNoteRemovesTheOldOne) {
  ASSERT_TRUE(isFree("run"));
  for (const char *function : {"pwrite", "open"}) {
    writeFile(kLockFile, std::to_string(::getpid()) + " 1 2\n");
    const Fault fault(function, std::strcmp(function, "open") == 0 ? 2 : 1, ENOSPC);
    ASSERT_TRUE(lock_.take(error_));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ("", readFile(kLockFile));
    LockHolder holder;
    EXPECT_TRUE(RunLock::holder("run", holder));
    EXPECT_EQ(::getpid(), holder.taker);
    EXPECT_TRUE(holder.alive);
    EXPECT_EQ(0, holder.since);
    lock_.release();
  }
}

TEST_F(RunLockFailure, OnAFullDiskIsNone) {
  ASSERT_TRUE(isFree("other"));
  if (::mount("tmpfs", kLockFolder.c_str(), "tmpfs", 0, "size=4k") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted here";
  }
  writeFile(kLockFolder + "/full", std::string(4096, 'x'));
  EXPECT_TRUE(lock_.take(error_));
  EXPECT_EQ("", readFile(kLockFile));
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_TRUE(holder.alive);
  EXPECT_EQ(0, holder.since);
  EXPECT_FALSE(isFree("run"));
  lock_.release();
  EXPECT_EQ(0, ::umount(kLockFolder.c_str()));
}

TEST_F(RunLockFailure, BySignalsIsNone) {
  ASSERT_TRUE(isFree("run"));
  writeFile(kLockFile, std::string(200, 'x')); // the note of another run, longer than this one's
  const Fault open("open", 1, EINTR);
  const Fault flock("flock", 1, EINTR);
  const Fault pwrite("pwrite", 1, EINTR);
  const Fault ftruncate("ftruncate", 1, EINTR);
  const Fault read("read", 1, EINTR);
  EXPECT_TRUE(lock_.take(error_, Millis(-1)));
  EXPECT_TRUE(open.fired() && flock.fired() && pwrite.fired() && read.fired());
  EXPECT_TRUE(ftruncate.fired());
  EXPECT_EQ(std::string::npos, readFile(kLockFile).find('x'));
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_NE(0, holder.since);
}

TEST_F(RunLockFailure, OfAFileThatIsRemovedOrReplacedLocksTheNewOne) {
  for (const bool replaces : {false, true}) {
    int replaced = 0;
    beforeFlock = [&] {
      if (++replaced <= 3) {
        EXPECT_TRUE(fs::remove(kLockFile));
        if (replaces) {
          writeFile(kLockFile, "");
        }
      }
    };
    ASSERT_TRUE(lock_.take(error_));
    EXPECT_EQ(4, replaced);
    beforeFlock = {};
    EXPECT_FALSE(isFree("run"));
    EXPECT_EQ(inodeOf(kLockFile), inodeOf("/proc/self/fd/" + std::to_string(lock_.fd())));
    lock_.release();
  }
}

// A lock file that was moved away keeps its inode, and even its link.
TEST_F(RunLockFailure, OfAFileThatIsMovedLocksTheNewOne) {
  bool moved = false;
  beforeFlock = [&] {
    if (!moved) {
      fs::rename(kLockFile, kLockFolder + "/moved");
      moved = true;
    }
  };
  ASSERT_TRUE(lock_.take(error_));
  EXPECT_TRUE(isThere(kLockFile));
  beforeFlock = {};
  EXPECT_FALSE(isFree("run"));
}

// Inode numbers are unique on one file system only.
TEST_F(RunLockFailure, OfAFileOfTheSameInodeNumberOnAnotherFileSystemLocksAgain) {
  int locked = 0;
  beforeFlock = [&] { ++locked; };
  otherDevices = 1;
  EXPECT_TRUE(lock_.take(error_, Millis(-1)));
  EXPECT_EQ(2, locked);
  EXPECT_EQ(0, otherDevices);
}

TEST_F(RunLockFailure, OfAFolderThatIsRemovedMakesItAgain) {
  bool removed = false;
  beforeFlock = [&] {
    if (!removed) {
      EXPECT_LT(0U, fs::remove_all("/tmp/kovabackup"));
      removed = true;
    }
  };
  ASSERT_TRUE(lock_.take(error_));
  beforeFlock = {};
  EXPECT_FALSE(isFree("run"));
}

TEST_F(RunLockFailure, OfAFileThatIsReplacedAgainAndAgainIsReported) {
  int replaced = 0;
  beforeFlock = [&] {
    ++replaced;
    EXPECT_TRUE(fs::remove(kLockFile));
  };
  EXPECT_FALSE(lock_.take(error_, Millis(-1)));
  expectError(error_, ESTALE, "flock", kLockFile);
  EXPECT_EQ(100, replaced);
  EXPECT_EQ(-1, lock_.fd());
}

TEST_F(RunLockFailure, WithoutALimitOfTimeSleepsNever) {
  ASSERT_TRUE(lock_.take(error_));
  RunLock second("run");
  EXPECT_FALSE(second.take(error_));
  EXPECT_FALSE(second.take(error_, Millis(0)));
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  EXPECT_THAT(sleeps, IsEmpty());
}

TEST_F(RunLockFailure, AfterALimitComesNeitherEarlyNorMuchLate) {
  ASSERT_TRUE(lock_.take(error_));
  RunLock second("run");
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_FALSE(second.take(error_, Millis(35)));
  EXPECT_LE(Millis(35), std::chrono::steady_clock::now() - begin);
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  long sum = 0;
  for (const long sleep : sleeps) {
    EXPECT_GE(10000000, sleep);
    EXPECT_LT(0, sleep);
    sum += sleep;
  }
  EXPECT_GE(35000000, sum) << "no longer than the limit";
  EXPECT_LT(0, sum);
}

TEST_F(RunLockFailure, IsNoneOnceTheLockIsReleasedWithinTheLimit) {
  ASSERT_TRUE(lock_.take(error_));
  RunLock second("run");
  beforeSleep = [&] {
    if (sleeps.size() == 3) {
      lock_.release();
    }
  };
  EXPECT_TRUE(second.take(error_, Millis::max()));
  EXPECT_THAT(sleeps, ElementsAre(10000000, 10000000, 10000000));
}

TEST_F(RunLockFailure, BySignalsDuringASleepIsNone) {
  ASSERT_TRUE(lock_.take(error_));
  RunLock second("run");
  const Fault fault("nanosleep", 1, EINTR, true);
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_FALSE(second.take(error_, Millis(5)));
  EXPECT_EQ(EWOULDBLOCK, error_.code);
  EXPECT_LE(Millis(5), std::chrono::steady_clock::now() - begin);
}

namespace {

void ignoreSignal(int) {}

} // namespace

TEST_F(RunLockFailure, BySignalsDuringAWaitIsNone) {
  ASSERT_TRUE(lock_.take(error_));
  const pid_t waiter = ::fork();
  if (waiter == 0) {
    lock_.release();
    struct sigaction action = {};
    action.sa_handler = ignoreSignal; // without SA_RESTART
    (void)::sigaction(SIGUSR1, &action, nullptr);
    ::_exit(lock_.take(error_, Millis(-1)) ? 0 : 1);
  }
  for (int i = 0; i < 3; ++i) {
    awaitWaiting(waiter);
    EXPECT_EQ(0, ::kill(waiter, SIGUSR1));
  }
  awaitWaiting(waiter);
  lock_.release();
  int status = -1;
  EXPECT_EQ(waiter, ::waitpid(waiter, &status, 0));
  EXPECT_EQ(0, status);
}

TEST_F(RunLockFailure, OfMemoryThrowsNothingButBadAlloc) {
  const std::string name(100, 'n');
  ASSERT_TRUE(isFree(name));
  bool taken = false;
  forEachAllocation(
      [&] {
        RunLock lock(name);
        taken = lock.take(error_);
      },
      [&](bool threw) {
        EXPECT_EQ(!threw, taken);
        taken = false;
        EXPECT_TRUE(isFree(name));
      });
  RunLock held(name);
  ASSERT_TRUE(held.take(error_));
  LockHolder holder;
  bool found = false;
  forEachAllocation([&] { found = RunLock::holder(name, holder); },
                    [&](bool threw) {
                      EXPECT_EQ(!threw, found);
                      found = false;
                    });
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_TRUE(holder.alive);
  forEachAllocation(
      [&] {
        RunLock second(name);
        EXPECT_FALSE(second.take(error_));
      },
      [&](bool) { EXPECT_FALSE(isFree(name)); });
}
