// The kernel's list of locks: odd lines, parts that do not agree, subvolumes, processes that cannot
// be examined.

#include "tests/platform/real_mounts.h"
#include "tests/service/lock_support.h"
#include "tests/support/counting_loop.h"
#include "tests/support/interpose.h"

#include <algorithm>
#include <cstring>
#include <dirent.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <vector>

using namespace KovaTest;
using testing::IsEmpty;

namespace {

std::vector<std::string> lockLists; // files that are read instead of /proc/locks, in turn
std::size_t listsRead = 0;
int readsAtOnce = 0; // 0: as many bytes as asked for

// The calls that find out what a process has open.
const char *const kLooks[] = {"opendir", "fstatat", "readdir"};

} // namespace

extern "C" {
KOVA_INTERPOSE_NOTHROW(int, stat, -1, (const char *path, struct stat *out), (path, out))
KOVA_INTERPOSE_NOTHROW(int, statx, -1,
                       (int dir, const char *path, int flags, unsigned int mask, struct statx *out),
                       (dir, path, flags, mask, out))
KOVA_INTERPOSE_NOTHROW(int, fstatat, -1, (int dir, const char *path, struct stat *out, int flags),
                       (dir, path, out, flags))
KOVA_INTERPOSE(DIR *, opendir, nullptr, (const char *path), (path))
KOVA_INTERPOSE(struct dirent *, readdir, nullptr, (DIR * folder), (folder))

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

class RunLockList : public testing::Test {
protected:
  void TearDown() override {
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

TEST_F(RunLockList, ReportsWhatCannotBeRead) {
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
TEST_F(RunLockList, HidesNoLockOfAProcessThatCannotBeExamined) {
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

TEST_F(RunLockList, DoesNotTakeUnknownDescriptorsForAnEndedTaker) {
  ASSERT_TRUE(lock_.take(error_));
  for (const char *function : kLooks) {
    SCOPED_TRACE(function);
    writeFile(kLockFile, "");
    const Fault fault(function, 1, EACCES, true);
    LockHolder holder;
    EXPECT_TRUE(RunLock::holder("run", holder));
    EXPECT_TRUE(holder.alive) << "it runs, and nothing says that its PID was used again";
    writeFile(kLockFile, std::to_string(::getpid()) + " 1 7\n");
    EXPECT_TRUE(RunLock::holder("run", holder));
    EXPECT_FALSE(holder.alive) << "the note says that the taker started at another time";
    EXPECT_EQ(7, holder.since);
  }
}

// A descriptor that was closed meanwhile, or a process that has just ended, is not a failure.
TEST_F(RunLockList, KnowsThatDescriptorsMayBeClosed) {
  ASSERT_TRUE(lock_.take(error_));
  for (const char *function : {"fstatat", "readdir"}) {
    for (const int code : {ENOENT, ESRCH}) {
      writeFile(kLockFile, "");
      const Fault fault(function, 1, code, true);
      LockHolder holder;
      EXPECT_TRUE(RunLock::holder("run", holder));
      EXPECT_FALSE(holder.alive) << function << " " << code;
    }
  }
}

TEST_F(RunLockList, MayComeInSmallParts) {
  ASSERT_TRUE(lock_.take(error_));
  readsAtOnce = 1;
  ASSERT_EQ(1U, users().size());
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_NE(0, holder.since);
}

TEST_F(RunLockList, MayHaveOtherLines) {
  ASSERT_TRUE(isFree("run"));
  const struct stat file = statOf(kLockFile);
  const std::string good = line(7, false, file.st_dev, file.st_ino);
  const std::string id = good.substr(good.find(" 7 ") + 3);
  const std::string inode = std::to_string(file.st_ino);
  const std::string high = id.substr(0, id.find(':'));
  const std::string low = id.substr(high.size() + 1, id.rfind(':') - high.size() - 1);
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
  odd += "1: FLOCK  ADVISORY  WRITE 7 " + high + "z:" + low + ":" + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 " + high + ":" + low + "z:" + inode + " 0 EOF\n";
  odd += "1: FLOCK  ADVISORY  WRITE 7 " + high + ":" + low + ":" + inode + "z 0 EOF\n";
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

// The kernel hands out the list in parts, and an entry can be skipped while others are released.
TEST_F(RunLockList, IsReadUntilTwoReadingsAgree) {
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

// In subvolumes and on some overlays the list has another device number than stat reports.
TEST_F(RunLockList, OfAnotherDeviceCountsForTheOpenFile) {
  ASSERT_TRUE(lock_.take(error_));
  listLocks({line(::getpid(), false, makedev(0xab, 0xcd), statOf(kLockFile).st_ino)});
  ASSERT_EQ(1U, users().size());
  EXPECT_EQ(::getpid(), users()[0].pid);
  {
    const Fault fault("opendir", 1, EACCES, true);
    EXPECT_THAT(users(), IsEmpty());
  }
  lock_.release();
  EXPECT_THAT(users(), IsEmpty()) << "a lock on a file of another device";
}

namespace {

// A lock folder in a subvolume, with a file of the same inode number in another one.
class RunLockSubvolume : public RunLockList {
protected:
  void SetUp() override {
    why_ = mounts_.disk("btrfs", "disk", 128);
    for (const char *name : {"/mnt/disk/ours", "/mnt/disk/other"}) {
      why_ = why_.empty() ? run(std::string("btrfs subvolume create ") + name) : why_;
    }
    if (!why_.empty()) {
      GTEST_SKIP() << "skipped: " << why_;
    }
    ASSERT_TRUE(isFree("first")); // makes the folder
    ASSERT_EQ(0, ::mount("/mnt/disk/ours", kLockFolder.c_str(), nullptr, MS_BIND, nullptr));
    writeFile(kLockFile, "");
    writeFile(kOther, "");
    ASSERT_EQ(statOf(kLockFile).st_ino, statOf(kOther).st_ino);
  }
  void TearDown() override {
    lock_.release();
    if (why_.empty()) {
      EXPECT_EQ(0, ::umount(kLockFolder.c_str()));
    }
    RunLockList::TearDown();
  }

  const std::string kOther = "/mnt/disk/other/file";
  RealMounts mounts_;
  std::string why_;
};

} // namespace

TEST_F(RunLockSubvolume, HidesNoHolder) {
  ASSERT_TRUE(lock_.take(error_));
  const struct stat file = statOf(kLockFile);
  const std::string stated = line(::getpid(), false, file.st_dev, file.st_ino).substr(3);
  EXPECT_EQ(std::string::npos, readFile("/proc/locks").find(stated)) << "the numbers differ";
  ASSERT_EQ(1U, users().size());
  EXPECT_EQ(::getpid(), users()[0].pid);
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_TRUE(holder.alive);
  for (const char *function : kLooks) {
    const Fault fault(function, 1, EACCES, true);
    EXPECT_EQ(1U, users().size()) << function;
  }
}

TEST_F(RunLockSubvolume, HidesNoTakerThatHasEnded) {
  const KOVA::Base::UniqueFd file(::open(kLockFile.c_str(), O_RDWR | O_CLOEXEC));
  EXPECT_EQ(0, runInChild([&] { return ::flock(file.get(), LOCK_EX); }));
  ASSERT_EQ(1U, users().size());
  EXPECT_EQ("", users()[0].command);
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("run", holder));
  EXPECT_EQ(users()[0].pid, holder.taker);
  EXPECT_FALSE(holder.alive);
  const Fault fault("statx", 1, EIO, true);
  EXPECT_THAT(users(), IsEmpty()) << "the device of the file system cannot be found out";
}

TEST_F(RunLockSubvolume, IsNotTakenForAnotherOne) {
  OtherProcess other([&] {
    const int fd = ::open(kOther.c_str(), O_RDWR | O_CLOEXEC);
    return ::flock(fd, LOCK_EX) == 0;
  });
  ASSERT_TRUE(other.begun());
  EXPECT_THAT(users(), IsEmpty());
  const Fault fault("opendir", 1, EACCES, true);
  EXPECT_EQ(1U, users().size()) << "what the process has open cannot be examined";
}
