// Section files on a disk of which only root may use the rest.
#include "tests/support/child_process.h"
#include "tests/tools/option_edit_support.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;
using testing::Not;

class ToolOptionReserve : public ToolOptionEdit {
protected:
  void SetUp() override {
    ToolOptionEdit::SetUp();
    std::filesystem::create_directory(mount_);
    const ShellResult made = runShell("exec 2>&1; PATH=$PATH:/usr/sbin:/sbin; truncate -s 8M " +
                                      file("image") + " && mkfs.ext4 -q -m 50 " + file("image") +
                                      " && mount -o loop " + file("image") + " " + mount_);
    if (made.exitCode != 0) {
      GTEST_SKIP() << "skipped: no disk can be mounted: " << made.output;
    }
    writeFile(mounted_, "[s]\na=1\n");
    fillForOrdinaryUsers();
  }
  void TearDown() override { ::umount2(mount_.c_str(), MNT_DETACH); }

  void fillForOrdinaryUsers() const {
    const int fd = ::open((mount_ + "/filler").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    struct statvfs info = {};
    while (::statvfs(mount_.c_str(), &info) == 0 && info.f_bavail > 0) {
      const auto size = static_cast<off_t>(info.f_bavail * info.f_frsize);
      ASSERT_EQ(0, ::posix_fallocate(fd, ::lseek(fd, 0, SEEK_END), size));
    }
    ::close(fd);
    ASSERT_GT(info.f_bfree, 0U);
  }

  std::string mount_ = folder_ / "mount";
  std::string mounted_ = mount_ + "/task.conf";
};

TEST_F(ToolOptionReserve, RootEditsWhereOnlyRootHasSpace) {
  const ToolResult result =
      runTool(words({mounted_, "s"}), with(script("sed -i s/a=1/a=2/ \"$1\"")));
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("[s]\na=2\n", readFile(mounted_));
}

// Files can be made in such a folder, but not replaced.
TEST_F(ToolOptionReserve, AnotherFailureIsNotTakenForAFullDisk) {
  if (runShell("chattr +a " + mount_).exitCode != 0) {
    GTEST_SKIP() << "skipped: chattr fails";
  }
  const ToolResult result = option({"set", mounted_, "s", "a", "2"});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("cannot write section 's' of " + mounted_ + ": "));
  EXPECT_THAT(result.messages, Not(HasSubstr("No space left")));
}

} // namespace
