// Which modes of a folder are wrong, and that a mode is changed only on what was checked: something
// else may have its name by then.

#include "tools/kovabackup/facts/folder_health.h"

#include "tests/support/files.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Tool::checkFolder;
using KOVA::Backup::Tool::Findings;
using KOVA::Backup::Tool::modeFix;
using KOVA::Backup::Tool::Verdict;

class ToolModeFix : public testing::Test {
protected:
  TestFolder folder_;
  std::string path_ = folder_ / "path";
};

TEST(ToolFolderMode, IsWrongInEveryBit) {
  const TestFolder folder;
  constexpr mode_t kRight = 0750;
  for (mode_t bit = 04000; bit != 0; bit >>= 1) {
    ASSERT_EQ(0, ::chmod(folder.path().c_str(), kRight ^ bit));
    Findings findings;
    checkFolder(findings, "folder", folder.path(), kRight);
    ASSERT_EQ(1U, findings.size());
    EXPECT_EQ(Verdict::Wrong, findings[0].verdict) << std::oct << bit;
  }
  ASSERT_EQ(0, ::chmod(folder.path().c_str(), kRight));
  Findings findings;
  checkFolder(findings, "folder", folder.path(), kRight);
  EXPECT_EQ(Verdict::Good, findings.at(0).verdict);
}

TEST_F(ToolModeFix, SetsTheModeOfAFileOrFolder) {
  writeFile(path_, "");
  EXPECT_EQ("", modeFix(path_, 0640)());
  EXPECT_EQ(0640, modeOf(path_));
  EXPECT_EQ("", modeFix(folder_.path(), 0711)());
  EXPECT_EQ(0711, modeOf(folder_.path()));
}

TEST_F(ToolModeFix, FollowsNoLink) {
  writeFile(folder_ / "target", "");
  ASSERT_EQ(0, ::chmod((folder_ / "target").c_str(), 0600));
  std::filesystem::create_symlink("target", path_);
  EXPECT_NE("", modeFix(path_, 0666)());
  EXPECT_EQ(0600, modeOf(folder_ / "target"));
}

TEST_F(ToolModeFix, NeitherWaitsForAFifoNorChangesIt) {
  ASSERT_EQ(0, ::mkfifo(path_.c_str(), 0600));
  EXPECT_EQ("it was replaced", modeFix(path_, 0666)());
  EXPECT_EQ(0600, modeOf(path_));
}

TEST_F(ToolModeFix, ChangesNothingOfAnotherUser) {
  writeFile(path_, "");
  ASSERT_EQ(0, ::chmod(path_.c_str(), 0600));
  if (::chown(path_.c_str(), 65534, 65534) != 0) {
    GTEST_SKIP() << "skipped: owners cannot be changed here";
  }
  EXPECT_EQ("it was replaced", modeFix(path_, 0666)());
  EXPECT_EQ(0600, modeOf(path_));
}

} // namespace
