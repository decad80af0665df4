// What is made of the texts of /proc, also of such as no present kernel writes.

#include "service/lock_table.h"
#include "service/mount_device.h"
#include "service/process_facts.h"
#include "service/session_mounts.h"

#include "tests/service/replaced_files.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"
#include "tests/support/interpose.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <string>
#include <sys/sysmacros.h>
#include <unistd.h>

using namespace KOVA::Backup::Service;
using namespace KovaTest;
using testing::IsEmpty;

namespace {

bool withoutMountIds = false;

class KernelText : public testing::Test {
protected:
  ~KernelText() override {
    replacedFiles().clear();
    withoutMountIds = false;
  }

  /// From here on, path opens a file with this text.
  void replace(const std::string &path, const std::string &text) {
    replacedFiles()[path] = writeFile(folder_ / std::to_string(replacedFiles().size()), text);
  }

  bool find(const std::string &stat) {
    replace("/proc/77/stat", stat);
    return findProcess(77, process_);
  }

  /// The device of a mount whose line names it so; 0 when none is found.
  dev_t deviceOf(const std::string &words) {
    replace("/proc/self/mountinfo", "1 0 0:1 / /x rw - tmpfs none rw\n" + words + "\n");
    dev_t device = 0;
    return findMountDevice(folder_.path(), device) ? device : 0;
  }

  std::string mountId() const {
    struct statx file = {};
    EXPECT_EQ(0, ::statx(AT_FDCWD, folder_.path().c_str(), 0, STATX_MNT_ID, &file));
    return std::to_string(file.stx_mnt_id);
  }

  /// How many users a file has whose locks are listed so.
  std::size_t usersIn(const std::string &locks) {
    replace("/proc/locks", locks);
    struct stat file = {};
    file.st_dev = makedev(0x2e, 0x77);
    file.st_ino = 4711;
    std::vector<LockUser> users;
    Error error;
    EXPECT_TRUE(findLockUsers(folder_.path(), file, users, error));
    return users.size();
  }

  const TestFolder folder_;
  ProcessFacts process_;
};

} // namespace

extern "C" int statx(int dir, const char *path, int flags, unsigned mask,
                     struct statx *out) noexcept {
  static auto *const real =
      realFunction<int(int, const char *, int, unsigned, struct statx *)>("statx");
  const int result = failsNow("statx") ? -1 : real(dir, path, flags, mask, out);
  out->stx_mask &= withoutMountIds ? ~STATX_MNT_ID : ~0U;
  return result;
}

TEST_F(KernelText, OfAProcessHasItsNameAndStart) {
  ASSERT_TRUE(find("77 (a) b) S 1 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 123456 21\n"));
  EXPECT_EQ("a) b", process_.command);
  EXPECT_EQ(123456U, process_.start);
}

TEST_F(KernelText, OfAProcessThatHasEndedIsNone) {
  EXPECT_FALSE(find("77 (a) Z 1 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 123456 21\n"));
  EXPECT_FALSE(find("77 (a) X 1 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 123456 21\n"));
}

TEST_F(KernelText, OfAProcessThatIsCutOffIsNone) {
  EXPECT_FALSE(find(""));
  EXPECT_FALSE(find("77 a"));
  EXPECT_FALSE(find("77 (a"));
  EXPECT_FALSE(find("77 a)"));
  EXPECT_FALSE(find("77 )a( S"));
  EXPECT_FALSE(find("77 (a) S 1"));
  EXPECT_FALSE(find("77 (a) S 1 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 late 21\n"));
  EXPECT_EQ("", process_.command);
}

TEST_F(KernelText, OfAMountNamesItsDevice) {
  EXPECT_EQ(makedev(8, 17), deviceOf(mountId() + " 1 8:17 / /tmp rw - ext4 /dev/sdb1 rw"));
}

TEST_F(KernelText, OfAMountWithoutADeviceIsNone) {
  for (const char *device : {"", "817", ":", "8:", ":17", "8:x", "x:17", "8:17:"}) {
    EXPECT_EQ(0U, deviceOf(mountId() + " 1 " + device)) << device;
  }
}

TEST_F(KernelText, OfOtherMountsIsNone) {
  EXPECT_EQ(0U, deviceOf("x 1 8:17 / /tmp rw"));
  EXPECT_EQ(0U, deviceOf(""));
}

TEST_F(KernelText, OfMountsIsNoneThatCannotBeRead) {
  replace("/proc/self/mountinfo", mountId() + " 1 8:17 / /tmp rw - ext4 /dev/sdb1 rw\n");
  dev_t device = 0;
  {
    const Fault fault("open", 1, EMFILE);
    EXPECT_FALSE(findMountDevice(folder_.path(), device));
    EXPECT_TRUE(fault.fired());
  }
  EXPECT_FALSE(findMountDevice(folder_ / "absent", device));
  withoutMountIds = true; // as before Linux 5.8
  EXPECT_FALSE(findMountDevice(folder_.path(), device));
  withoutMountIds = false;
  EXPECT_TRUE(findMountDevice(folder_.path(), device));
}

TEST_F(KernelText, OfLocksNamesThoseOnTheFile) {
  EXPECT_EQ(2U, usersIn("1: FLOCK  ADVISORY  WRITE 77 2e:77:4711 0 EOF\n"
                        "1: -> FLOCK  ADVISORY  WRITE 78 2e:77:4711 0 EOF\n"
                        "2: POSIX  ADVISORY  WRITE 79 2e:77:4711 0 EOF\n"
                        "3: FLOCK  ADVISORY  WRITE 80 2e:77:4712 0 EOF\n"));
}

TEST_F(KernelText, OfLocksIsPassedOverWhereItIsNotAsExpected) {
  for (const char *file : {"", "4711", "77:4711", "x:77:4711", "2e:x:4711", "2e:77:x",
                           "2e:77:", "2e::4711", ":77:4711", "2e:7 7:4711", "100000000:77:4711"}) {
    EXPECT_EQ(0U, usersIn("1: FLOCK  ADVISORY  WRITE 77 " + std::string(file) + " 0 EOF\n"))
        << file;
  }
  EXPECT_EQ(0U, usersIn("1: FLOCK  ADVISORY  WRITE x 2e:77:4711 0 EOF\n"));
  EXPECT_EQ(0U, usersIn("1: FLOCK\n\n->\n"));
}

TEST_F(KernelText, OfMountPointsIsUnescapedOnlyWhereItIsEscaped) {
  const auto mounts = findSessionMounts("2 1 0:2 /a/seln.abcdef /x\\040y\\9\\04 rw\n", "/");
  ASSERT_EQ(1U, mounts.size());
  EXPECT_EQ("/x y\\9\\04", mounts[0].point);
  EXPECT_EQ("/a/seln.abcdef", mounts[0].root);
}
