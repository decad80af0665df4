// Each step of a run lock fails, its file is replaced meanwhile, and the kernel's list is odd.

#include "tests/service/lock_support.h"

#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/interpose.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cstring>
#include <dirent.h>
#include <filesystem>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <vector>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::function<void()> beforeFlock;
std::function<void()> beforeSleep;
std::vector<long> sleeps;           // in nanoseconds
std::vector<std::string> lockLists; // files that are read instead of /proc/locks, in turn
std::size_t listsRead = 0;
int readsAtOnce = 0; // 0: as many bytes as asked for

} // namespace

extern "C" {
KOVA_INTERPOSE_NOTHROW(int, ftruncate, -1, (int fd, off_t size), (fd, size))
KOVA_INTERPOSE(ssize_t, pwrite, -1, (int fd, const void *data, size_t size, off_t at),
               (fd, data, size, at))
KOVA_INTERPOSE_NOTHROW(int, stat, -1, (const char *path, struct stat *out), (path, out))
KOVA_INTERPOSE(DIR *, opendir, nullptr, (const char *path), (path))

int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (beforeFlock) {
    beforeFlock();
  }
  return failsNow("flock") ? -1 : real(fd, operation);
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

ssize_t read(int fd, void *buffer, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  const size_t most = readsAtOnce == 0 ? size : static_cast<size_t>(readsAtOnce);
  return failsNow("read") ? -1 : real(fd, buffer, std::min(size, most));
}

int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  if (failsNow("open")) {
    return -1;
  }
  if (std::strcmp(path, "/proc/locks") == 0) {
    const std::size_t next = listsRead++;
    if (!lockLists.empty()) {
      path = lockLists[std::min(next, lockLists.size() - 1)].c_str();
    }
  }
  return real(path, flags, mode);
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
    lockLists.clear();
    listsRead = 0;
    readsAtOnce = 0;
  }

  // Lists that are read one after the other, the last one again and again.
  void listLocks(const std::vector<std::string> &lists) {
    lockLists.clear();
    listsRead = 0;
    for (const std::string &list : lists) {
      lockLists.push_back(writeFile(folder_ / std::to_string(lockLists.size()), list));
    }
  }

  std::vector<LockUser> users() {
    std::vector<LockUser> found;
    EXPECT_TRUE(RunLock::users("run", found, error_));
    return found;
  }

  const TestFolder folder_;
  Error error_;
  RunLock lock_{"run"};
};

// A line about a lock on the lock file as the kernel writes it.
std::string line(pid_t pid, bool waits, dev_t device, ino_t inode) {
  char text[128];
  (void)std::snprintf(text, sizeof text, "1: %sFLOCK  ADVISORY  WRITE %d %02x:%02x:%lu 0 EOF\n",
                      waits ? "-> " : "", pid, major(device), minor(device),
                      static_cast<unsigned long>(inode));
  return text;
}

struct stat statOf(const std::string &path) {
  struct stat info = {};
  EXPECT_EQ(0, ::stat(path.c_str(), &info));
  return info;
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
  const Fault open("open", 1, EINTR);
  const Fault flock("flock", 1, EINTR);
  const Fault pwrite("pwrite", 1, EINTR);
  const Fault read("read", 1, EINTR);
  EXPECT_TRUE(lock_.take(error_, Millis(-1)));
  EXPECT_TRUE(open.fired() && flock.fired() && pwrite.fired() && read.fired());
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
    EXPECT_EQ(statOf(kLockFile).st_ino,
              statOf("/proc/self/fd/" + std::to_string(lock_.fd())).st_ino);
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

TEST_F(RunLockFailure, ToReadTheListIsReported) {
  ASSERT_TRUE(lock_.take(error_));
  for (const char *function : {"stat", "open", "read"}) {
    const Fault fault(function, 1, EACCES);
    std::vector<LockUser> found;
    EXPECT_FALSE(RunLock::users("run", found, error_));
    const bool ofFile = std::strcmp(function, "stat") == 0;
    expectError(error_, EACCES, function, ofFile ? kLockFile : "/proc/locks");
    LockHolder holder;
    EXPECT_TRUE(RunLock::holder("run", holder));
    EXPECT_EQ(::getpid(), holder.taker);
  }
}

// Whatever cannot be read about a process, its lock is listed.
TEST_F(RunLockFailure, ToExamineAProcessHidesNoLock) {
  ASSERT_TRUE(lock_.take(error_));
  for (const char *function : {"open", "read", "stat"}) {
    forEachFailure(function, EACCES, [&](Fault &fault) {
      LockHolder holder;
      const bool found = RunLock::holder("run", holder);
      EXPECT_TRUE(found || fault.fired());
      EXPECT_EQ(found ? ::getpid() : -1, holder.taker);
    });
  }
}

TEST_F(RunLockFailure, ToExamineDescriptorsIsNotTakenForAnEndedTaker) {
  ASSERT_TRUE(lock_.take(error_));
  writeFile(kLockFile, "");
  const Fault fault("opendir", 1, EACCES, true);
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_TRUE(holder.alive) << "it runs, and nothing says that its PID was used again";
  writeFile(kLockFile, std::to_string(::getpid()) + " 1 7\n");
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_FALSE(holder.alive) << "the note says that the taker started at another time";
  EXPECT_EQ(7, holder.since);
}

TEST_F(RunLockFailure, ToReadTheListAtOnceIsNone) {
  ASSERT_TRUE(lock_.take(error_));
  readsAtOnce = 1;
  ASSERT_EQ(1U, users().size());
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_NE(0, holder.since);
}

TEST_F(RunLockFailure, ToUnderstandALineSkipsIt) {
  ASSERT_TRUE(isFree("run"));
  const struct stat file = statOf(kLockFile);
  const std::string good = line(7, false, file.st_dev, file.st_ino);
  const std::string id = good.substr(good.find(" 7 ") + 3);
  const std::string inode = std::to_string(file.st_ino);
  std::string odd = "\n \n1:\n1: FLOCK\n1: FLOCK  ADVISORY  WRITE 7\n";
  odd += "1: POSIX  ADVISORY  WRITE 7 " + id;
  odd += "1: OFDLCK ADVISORY  WRITE -1 " + id;
  odd += "1: LEASE  ACTIVE    READ 7 " + id;
  odd += "1: FLOCK  ADVISORY  WRITE x " + id;
  odd += "1: FLOCK  ADVISORY  WRITE 99999999999 " + id;
  odd += "1: FLOCK  ADVISORY  WRITE 7 " + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 :" + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 ::" + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 zz:00:" + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 <none>:0 0 EOF\n";
  odd += line(8, false, file.st_dev, file.st_ino + 1);
  listLocks({odd});
  EXPECT_THAT(users(), IsEmpty());
  listLocks({odd + good + line(9, true, file.st_dev, file.st_ino)});
  const std::vector<LockUser> found = users();
  ASSERT_EQ(2U, found.size());
  EXPECT_EQ(7, found[0].pid);
  EXPECT_FALSE(found[0].waits);
  EXPECT_EQ(9, found[1].pid);
  EXPECT_TRUE(found[1].waits);
  listLocks({good.substr(0, good.size() - 1)}); // without a line end
  EXPECT_EQ(1U, users().size());
  listLocks({""});
  EXPECT_THAT(users(), IsEmpty());
}

// On overlays and subvolumes the list has another device number than stat reports.
TEST_F(RunLockFailure, ToCompareDevicesLooksForTheOpenFile) {
  const pid_t self = ::getpid();
  ASSERT_TRUE(lock_.take(error_));
  const ino_t inode = statOf(kLockFile).st_ino;
  listLocks({line(self, false, makedev(0xab, 0xcd), inode)});
  ASSERT_EQ(1U, users().size());
  EXPECT_EQ(self, users()[0].pid);
  {
    const Fault fault("opendir", 1, EACCES, true);
    EXPECT_THAT(users(), IsEmpty());
  }
  lock_.release();
  EXPECT_THAT(users(), IsEmpty()) << "a lock on a file of another device";
}

// The kernel hands out the list in parts, and an entry can be skipped while others are released.
TEST_F(RunLockFailure, OfOneReadingOfTheListIsMended) {
  ASSERT_TRUE(isFree("run"));
  const struct stat file = statOf(kLockFile);
  const std::string entry = line(7, false, file.st_dev, file.st_ino);
  listLocks({"", entry});
  EXPECT_EQ(1U, users().size());
  EXPECT_EQ(3U, listsRead);
  listLocks({entry + entry, entry});
  EXPECT_EQ(1U, users().size());
  listLocks({"", entry, "", entry, "", entry});
  EXPECT_THAT(users(), IsEmpty()) << "the last of five";
  EXPECT_EQ(5U, listsRead);
  listLocks({entry});
  EXPECT_EQ(1U, users().size());
  EXPECT_EQ(2U, listsRead);
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
