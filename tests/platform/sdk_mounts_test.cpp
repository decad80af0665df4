#include "platform/sdk/mounts.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <string>
#include <sys/sysmacros.h>

using namespace KovaPlatform;
using testing::IsEmpty;

namespace {

constexpr const char *kTable = "/tmp/mountinfo";

bool readText(const std::string &text, std::vector<Mount> &mounts) {
  std::ofstream(kTable) << text;
  const bool done = readMounts(kTable, mounts);
  std::filesystem::remove(kTable);
  return done;
}

} // namespace

TEST(Mounts, LineGivesAllFields) {
  std::vector<Mount> mounts;
  ASSERT_TRUE(readText("36 35 98:5 /sub /mnt/data rw,noatime shared:1 - ext4 /dev/sda5 rw\n"
                       "27 1 0:44 / / rw - btrfs /dev/root rw,subvol=/\n",
                       mounts));
  ASSERT_EQ(2U, mounts.size());
  EXPECT_EQ(36, mounts[0].id);
  EXPECT_EQ(makedev(98, 5), mounts[0].device);
  EXPECT_EQ("/sub", mounts[0].root);
  EXPECT_EQ("/mnt/data", mounts[0].target);
  EXPECT_EQ("ext4", mounts[0].fsType);
  EXPECT_EQ("/dev/sda5", mounts[0].source);
  EXPECT_EQ("/", mounts[1].target);
  EXPECT_EQ(makedev(0, 44), mounts[1].device);
}

TEST(Mounts, EscapedNamesAreUnescaped) {
  std::vector<Mount> mounts;
  ASSERT_TRUE(
      readText("36 35 8:1 /a\\011b /mnt/a\\040b\\134c\\012d rw - ext4 /dev/x\\040y rw\n", mounts));
  ASSERT_EQ(1U, mounts.size());
  EXPECT_EQ("/a\tb", mounts[0].root);
  EXPECT_EQ("/mnt/a b\\c\nd", mounts[0].target);
  EXPECT_EQ("/dev/x y", mounts[0].source);
}

TEST(Mounts, TargetsMayBeLong) {
  const std::string target = "/" + std::string(4000, 'x');
  std::vector<Mount> mounts;
  ASSERT_TRUE(readText("36 35 8:1 / " + target + " rw - ext4 /dev/a rw\n", mounts));
  ASSERT_EQ(1U, mounts.size());
  EXPECT_EQ(target, mounts[0].target);
}

TEST(Mounts, TableMayBeLong) {
  std::string text;
  for (int i = 0; i < 5000; ++i) {
    text += std::to_string(i + 1) + " 1 8:1 / /mnt/" + std::to_string(i) + " rw - ext4 /dev/a rw\n";
  }
  std::vector<Mount> mounts;
  ASSERT_TRUE(readText(text, mounts));
  ASSERT_EQ(5000U, mounts.size());
  EXPECT_EQ("/mnt/4999", mounts.back().target);
}

TEST(Mounts, EmptyTableIsRead) {
  std::vector<Mount> mounts(1);
  EXPECT_TRUE(readText("", mounts));
  EXPECT_THAT(mounts, IsEmpty());
}

TEST(Mounts, MissingTableIsAFailureAndChangesNothing) {
  std::vector<Mount> mounts(1);
  EXPECT_FALSE(readMounts("/tmp/not-there", mounts));
  EXPECT_EQ(1U, mounts.size());
}

TEST(Mounts, OwnTableHoldsTheRoot) {
  std::vector<Mount> mounts;
  ASSERT_TRUE(readMounts("/proc/self/mountinfo", mounts));
  EXPECT_THAT(mounts, testing::Contains(testing::Field(&Mount::target, "/")));
  EXPECT_THAT(mounts, testing::Contains(testing::Field(&Mount::target, "/tmp")));
}

TEST(Paths, WithinMeansTheSameOrBelow) {
  EXPECT_TRUE(isWithin("/a", "/a"));
  EXPECT_TRUE(isWithin("/a", "/a/b/c"));
  EXPECT_TRUE(isWithin("/", "/"));
  EXPECT_TRUE(isWithin("/", "/a"));
  EXPECT_FALSE(isWithin("/a", "/ab"));
  EXPECT_FALSE(isWithin("/a", "/"));
  EXPECT_FALSE(isWithin("/a/b", "/a"));
  EXPECT_FALSE(isWithin("/a", "/b/a"));
}

TEST(Paths, BelowAndJoinedAreEachOthersInverse) {
  EXPECT_EQ("", below("/a", "/a"));
  EXPECT_EQ("b", below("/a", "/a/b"));
  EXPECT_EQ("b/c", below("/a", "/a/b/c"));
  EXPECT_EQ("", below("/", "/"));
  EXPECT_EQ("a/b", below("/", "/a/b"));
  EXPECT_EQ("/a", joined("/a", ""));
  EXPECT_EQ("/a/b", joined("/a", "b"));
  EXPECT_EQ("/", joined("/", ""));
  EXPECT_EQ("/b", joined("/", "b"));
}
