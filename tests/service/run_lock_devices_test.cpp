// Files of the same inode number on two file systems, of which one is the lock file, and locks that
// are shared.

#include "tests/service/lock_support.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <vector>

using namespace KovaTest;

namespace {

// A file system of its own for each of two folders. New ones number their inodes alike.
class RunLockDevices : public testing::Test {
protected:
  void SetUp() override {
    ASSERT_TRUE(isFree("first")); // makes the folder
    for (const std::string &folder : {kLockFolder, kOther}) {
      if (::mount("tmpfs", folder.c_str(), "tmpfs", 0, "mode=0770") != 0) {
        GTEST_SKIP() << "skipped: no file system can be mounted";
      }
      mounted_.push_back(folder);
      writeFile(folder + "/run", "");
    }
    const struct stat ours = statOf(kLockFile);
    const struct stat theirs = statOf(kOther + "/run");
    ASSERT_NE(ours.st_dev, theirs.st_dev);
    if (ours.st_ino != theirs.st_ino) {
      GTEST_SKIP() << "skipped: this kernel numbers the inodes of all such file systems at once";
    }
  }
  void TearDown() override {
    for (const std::string &folder : mounted_) {
      EXPECT_EQ(0, ::umount(folder.c_str())) << folder;
    }
  }

  static struct stat statOf(const std::string &path) {
    struct stat info {};
    EXPECT_EQ(0, ::stat(path.c_str(), &info)) << path;
    return info;
  }

  std::vector<LockUser> users() {
    std::vector<LockUser> found;
    EXPECT_TRUE(RunLock::users("run", found, error_));
    return found;
  }

  const std::string kOther = "/mnt";
  std::vector<std::string> mounted_;
  Error error_;
};

} // namespace

TEST_F(RunLockDevices, ALockOnTheOtherFileIsNotItsLock) {
  OtherProcess other([this] {
    const int fd = ::open((kOther + "/run").c_str(), O_RDWR | O_CLOEXEC);
    return ::flock(fd, LOCK_EX) == 0;
  });
  ASSERT_TRUE(other.begun());
  EXPECT_EQ(0U, users().size());
  LockHolder holder;
  EXPECT_FALSE(RunLock::holder("run", holder));
}

TEST_F(RunLockDevices, ASharedLockOnTheFileIsItsLock) {
  OtherProcess other([] {
    const int fd = ::open(kLockFile.c_str(), O_RDONLY | O_CLOEXEC);
    return ::flock(fd, LOCK_SH) == 0;
  });
  ASSERT_TRUE(other.begun());
  ASSERT_EQ(1U, users().size());
  EXPECT_FALSE(users()[0].waits);
}
