// Which of the locks that a process can have on a file make it a keeper of the lock token.

#include "tools/kovabackup/facts/lock_keepers.h"

#include "tests/service/lock_support.h"

#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>

using namespace KovaTest;
using KOVA::Backup::Tool::LockKeeper;
using KOVA::Backup::Tool::lockKeepersOf;

namespace {

class ToolLockKeepers : public testing::Test {
protected:
  ToolLockKeepers() { writeFile(file_, ""); }

  // The processes that keep the lock while another process has locked the file of this path.
  std::vector<LockKeeper> keepersWhile(const std::string &path,
                                       const std::function<bool(int fd)> &lock) {
    OtherProcess other([&] { return lock(::open(path.c_str(), O_RDWR | O_CLOEXEC)); });
    EXPECT_TRUE(other.begun());
    return lockKeepersOf(file_);
  }

  static bool lockBytes(int fd, int command) {
    struct flock bytes {};
    bytes.l_type = F_WRLCK;
    bytes.l_whence = SEEK_SET;
    return ::fcntl(fd, command, &bytes) == 0;
  }

  TestFolder folder_;
  const std::string file_ = folder_ / "tasks";
};

TEST_F(ToolLockKeepers, AreThoseWithALockByFlock) {
  EXPECT_EQ(1U, keepersWhile(file_, [](int fd) { return ::flock(fd, LOCK_EX) == 0; }).size());
  EXPECT_EQ(1U, keepersWhile(file_, [](int fd) { return ::flock(fd, LOCK_SH) == 0; }).size());
}

TEST_F(ToolLockKeepers, AreNoneWhoHaveTheFileOpenOnly) {
  EXPECT_EQ(0U, keepersWhile(file_, [](int fd) { return fd >= 0; }).size());
}

TEST_F(ToolLockKeepers, AreNoneWithALockOfBytesOfTheProcess) {
  EXPECT_EQ(0U, keepersWhile(file_, [](int fd) { return lockBytes(fd, F_SETLK); }).size());
}

TEST_F(ToolLockKeepers, AreNoneWithALockOfBytesOfTheOpenFile) {
  EXPECT_EQ(0U, keepersWhile(file_, [](int fd) { return lockBytes(fd, F_OFD_SETLK); }).size());
}

TEST_F(ToolLockKeepers, AreNoneWithALease) {
  EXPECT_EQ(
      0U, keepersWhile(file_, [](int fd) { return ::fcntl(fd, F_SETLEASE, F_WRLCK) == 0; }).size());
}

TEST_F(ToolLockKeepers, AreNoneOfAFileOfTheSameNameInAnotherFolder) {
  ASSERT_EQ(0, ::mkdir((folder_ / "other").c_str(), 0700));
  const std::string other = writeFile(folder_ / "other/tasks", "");
  EXPECT_EQ(0U, keepersWhile(other, [](int fd) { return ::flock(fd, LOCK_EX) == 0; }).size());
}

TEST_F(ToolLockKeepers, AreNoneOfAFileOfTheSameNameAndInodeNumberElsewhere) {
  // New file systems number their inodes alike.
  const std::string other = folder_ / "other";
  ASSERT_EQ(0, ::mkdir(other.c_str(), 0700));
  if (::mount("tmpfs", "/mnt", "tmpfs", 0, nullptr) != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted";
  }
  ASSERT_EQ(0, ::mount("tmpfs", other.c_str(), "tmpfs", 0, nullptr));
  writeFile("/mnt/tasks", "");
  writeFile(other + "/tasks", "");
  struct stat ours {};
  struct stat theirs {};
  ASSERT_EQ(0, ::stat("/mnt/tasks", &ours));
  ASSERT_EQ(0, ::stat((other + "/tasks").c_str(), &theirs));
  std::size_t keepers = 0;
  {
    OtherProcess process([&] {
      return ::flock(::open((other + "/tasks").c_str(), O_RDWR | O_CLOEXEC), LOCK_EX) == 0;
    });
    EXPECT_TRUE(process.begun());
    keepers = lockKeepersOf("/mnt/tasks").size();
  }
  ::umount(other.c_str());
  ::umount("/mnt");
  EXPECT_EQ(0U, keepers);
  if (ours.st_ino != theirs.st_ino) {
    GTEST_SKIP() << "skipped: this kernel numbers the inodes of all such file systems at once";
  }
}

} // namespace
