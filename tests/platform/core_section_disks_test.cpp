// Section files and the key on real file systems: those without unnamed files, owners or
// attributes, full ones, read-only ones, and what a power cut would leave.

#include "tests/platform/core_support.h"
#include "tests/platform/real_mounts.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;

namespace {

const std::string kOld = "# top\n[s]\nk=0\n[t]\nz=1\n";
const std::string kNew = "# top\n[s]\nk=1\n[t]\nz=1\n";

// All but what mkfs makes.
std::set<std::string> entriesOf(const std::string &folder) {
  std::set<std::string> names = namesIn(folder);
  names.erase("lost+found");
  return names;
}

bool hasUnnamedFiles(const std::string &folder) {
  const int fd = ::open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
  ::close(fd);
  return fd >= 0;
}

struct Disk {
  const char *kind;
  int mebibytes;
  bool unnamedFiles;
  bool modes;
};

void changeOn(const Disk &disk) {
  RealMounts mounts;
  const std::string why = mounts.disk(disk.kind, "disk", disk.mebibytes);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  EXPECT_EQ(disk.unnamedFiles, hasUnnamedFiles("/mnt/disk"));
  const std::string path = "/mnt/disk/conf";
  writeFile(path, kOld);
  if (disk.modes) {
    ASSERT_EQ(0, ::chmod(path.c_str(), 0664));
    ASSERT_EQ(0, ::chown(path.c_str(), 1234, 2345));
  }
  clearError();
  EXPECT_EQ(1, setSection(path, "s", {{"k", "1"}})) << std::strerror(errno);
  EXPECT_EQ(kNew, readFile(path));
  EXPECT_LE(0, addSection(path, "u", {}));
  EXPECT_EQ(kNew + "[u]\n", readFile(path));
  EXPECT_EQ(1, removeSection(path, "u"));
  EXPECT_EQ(kNew, readFile(path));
  EXPECT_EQ(0, errorCode());
  struct stat status {};
  ASSERT_EQ(0, ::stat(path.c_str(), &status));
  if (disk.modes) {
    EXPECT_EQ(0664U, status.st_mode & 07777);
    EXPECT_EQ(1234U, status.st_uid);
    EXPECT_EQ(2345U, status.st_gid);
  }
  EXPECT_THAT(entriesOf("/mnt/disk"), ElementsAre("conf"));
}

// What the disk would hold if the power were cut now: a copy of it, mounted at /mnt/copy.
std::string mountCopy(RealMounts &mounts) {
  const std::string copied =
      run("cp " + RealMounts::image("disk") + " " + RealMounts::image("copy"));
  return copied.empty() ? mounts.mount("mount -n -o loop " + RealMounts::image("copy"), "copy")
                        : copied;
}

// The text of a file as a power cut would leave it now.
std::string afterPowerCut(RealMounts &mounts, const std::string &name) {
  const std::string why = mountCopy(mounts);
  if (!why.empty()) {
    return why;
  }
  const std::string text = readFile("/mnt/copy/" + name);
  mounts.unmount("copy");
  return text;
}

} // namespace

TEST(SectionDisk, MayBeExt4) {
  changeOn({"ext4", 16, true, true});
}

TEST(SectionDisk, MayBeBtrfs) {
  changeOn({"btrfs", 128, true, true});
}

TEST(SectionDisk, MayBeXfs) {
  changeOn({"xfs", 320, true, true});
}

TEST(SectionDisk, MayBeWithoutUnnamedFilesAndOwners) {
  changeOn({"vfat", 16, false, false});
}

TEST(SectionDisk, MayBeFull) {
  RealMounts mounts;
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  writeFile("/mnt/disk/conf", kOld);
  struct statvfs space {};
  ASSERT_EQ(0, ::statvfs("/mnt/disk", &space));
  const std::string value(static_cast<std::size_t>(space.f_bfree * space.f_frsize) + 1, 'v');
  clearError();
  EXPECT_GT(0, setSection("/mnt/disk/conf", "s", {{"k", value}}));
  EXPECT_EQ(ENOSPC, errno);
  EXPECT_EQ(KLIBC_ERR_WRITE, errorCode());
  EXPECT_EQ(kOld, readFile("/mnt/disk/conf"));
  EXPECT_THAT(entriesOf("/mnt/disk"), ElementsAre("conf"));
  EXPECT_EQ(1, setSection("/mnt/disk/conf", "s", {{"k", "1"}})) << "the space was not given back";
}

TEST(SectionDisk, MayBeReadOnly) {
  RealMounts mounts;
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  writeFile("/mnt/disk/conf", kOld);
  ASSERT_EQ("", mounts.remount("disk", RealMounts::Access::ReadOnly));
  clearError();
  EXPECT_GT(0, setSection("/mnt/disk/conf", "s", {}));
  EXPECT_EQ(EROFS, errno);
  EXPECT_EQ(KLIBC_ERR_OPEN, errorCode());
  EXPECT_THAT(sectionNames("/mnt/disk/conf"), ElementsAre("s", "t"));
}

// A file that is itself a mount point cannot be replaced by a rename.
TEST(SectionDisk, MayBeBoundToTheFileAlone) {
  RealMounts mounts;
  const std::string why = mounts.tmpfs("disk");
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  writeFile("/mnt/disk/conf", kOld);
  writeFile("/mnt/disk/bound", "");
  ASSERT_EQ("", run("mount -n --bind /mnt/disk/conf /mnt/disk/bound"));
  clearError();
  EXPECT_GT(0, setSection("/mnt/disk/bound", "s", {}));
  EXPECT_EQ(EBUSY, errno);
  EXPECT_EQ(KLIBC_ERR_RENAME, errorCode());
  ASSERT_EQ("", run("umount -n /mnt/disk/bound"));
  EXPECT_EQ(kOld, readFile("/mnt/disk/conf"));
  EXPECT_EQ(2U, entriesOf("/mnt/disk").size());
}

TEST(SectionDisk, HasEveryChangeAfterAPowerCut) {
  RealMounts mounts;
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  writeFile("/mnt/disk/conf", kOld);
  ASSERT_EQ(1, setSection("/mnt/disk/conf", "s", {{"k", "1"}}));
  EXPECT_EQ(kNew, afterPowerCut(mounts, "conf"));
  ASSERT_LE(0, addSection("/mnt/disk/conf", "u", {{"k", "2"}}));
  EXPECT_EQ(kNew + "[u]\nk=2\n", afterPowerCut(mounts, "conf"));
  ASSERT_EQ(1, removeSection("/mnt/disk/conf", "u"));
  EXPECT_EQ(kNew, afterPowerCut(mounts, "conf"));
}

TEST(SectionDisk, HasTheKeyAfterAPowerCut) {
  RealMounts mounts;
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  const TestFolder dir;
  writeFile(dir / "conf", "[secret]\nkeyFile=\"/mnt/disk/folder/key\"\n");
  ::setenv("KOVA_PLATFORM_CONF", (dir / "conf").c_str(), 1);
  char form[64] = "";
  EXPECT_NE(0, KLIBCCryptSzEncrypt("text", form, sizeof form));
  ::unsetenv("KOVA_PLATFORM_CONF");
  const std::string key = readFile("/mnt/disk/folder/key");
  EXPECT_EQ(32U, key.size());
  EXPECT_EQ(key, afterPowerCut(mounts, "folder/key"));
}
