// From a volume rule to a session and back, on real file systems. Every step has its own process,
// because the library remembers the choice of a rule for the life of the process.

#include "kovaplatform/kovasdk.h"

#include "tests/platform/real_mounts.h"
#include "tests/support/platform_conf.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <string>
#include <vector>

using namespace KovaTest;
namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::StartsWith;

namespace {

class VolumesEndToEnd : public testing::Test {
protected:
  void SetUp() override {
    hideOwnVolumes();
    why = mounts.disk("ext4", "small", 16);
    if (why.empty()) {
      why = mounts.disk("btrfs", "large", 128);
    }
    if (!why.empty()) {
      GTEST_SKIP() << "skipped: " << why;
    }
  }

  // The machine's own volumes may be larger than any of the test's.
  void hideOwnVolumes() {
    std::string list;
    std::string found = "none";
    for (int rounds = 0; !found.empty() && rounds < 100; ++rounds) {
      conf.write("[volume unlogged]\npath=\"/mnt\"\n[mounts]\nexclude=[" + list + "]\n");
      found.clear();
      KOVAVOLInfo *head = KOVAMountVolAllEnum(0, -1, KOVA_VOL_ENUM_READ_ONLY);
      for (const KOVAVOLInfo *volume = head; volume != nullptr; volume = volume->next) {
        if (std::string(volume->mountPath) != "/mnt") {
          found = "\"" + std::string(volume->mountPath) + "\"";
          list += (list.empty() ? "" : ",") + found;
        }
      }
      KOVAMountVolInfoFree(head);
    }
    settings = "[mounts]\nexclude=[" + list + "]\n";
    conf.write(settings);
  }

  // What a step prints; a step that fails prints "failed" at the end.
  static std::string step(const std::string &arguments) {
    std::string output;
    const int status = runFor(std::string(KOVA_TEST_CHILD) + " " + arguments, output);
    return status == 0 ? output : output + "failed";
  }

  PlatformConf conf;
  RealMounts mounts;
  std::string settings;
  std::string why;
};

} // namespace

TEST_F(VolumesEndToEnd, RulesPickTheLargestVolumeOfTheirKinds) {
  EXPECT_EQ("/mnt/large/.kova_tmp\n", step("pick extbtrfs"));
  EXPECT_EQ("/mnt/small/.kova_tmp\n", step("pick ext"));
  EXPECT_EQ("/mnt/large/.kova_tmp\n", step("pick max"));
  fs::create_directory("/mnt/named");
  conf.write(settings + "[volume named]\npath=\"/mnt/named\"\nsize=1000000000000\n");
  EXPECT_EQ("/mnt/named/.kova_tmp\n", step("pick max"));
  EXPECT_EQ("/mnt/large/.kova_tmp\n", step("pick extbtrfs"));
}

TEST_F(VolumesEndToEnd, ReadOnlyVolumeIsPassedOver) {
  ASSERT_EQ("", mounts.remount("large", RealMounts::Access::ReadOnly));
  EXPECT_EQ("/mnt/small/.kova_tmp\n", step("pick extbtrfs"));
}

TEST_F(VolumesEndToEnd, UnmountedVolumeIsPassedOver) {
  mounts.unmount("large");
  EXPECT_EQ("/mnt/small/.kova_tmp\n", step("pick extbtrfs"));
  mounts.unmount("small");
  EXPECT_THAT(step("pick extbtrfs"), HasSubstr("failed"));
}

TEST_F(VolumesEndToEnd, LinkInPlaceOfTheDirectoryLeavesTheVolumeToTheNext) {
  fs::create_directory_symlink("/mnt/small", "/mnt/large/.kova_tmp");
  EXPECT_THAT(step("pick extbtrfs"),
              testing::MatchesRegex("log: 3 \\([0-9]+\\) \\[err\\] "
                                    "temp_manager/volume_path_manager:19 "
                                    "KOVAShareTmpPathGet\\(/mnt/large\\) fail, "
                                    "\\[0x3008 sdk/shares.cpp:[0-9]+\\]\n"
                                    "/mnt/small/.kova_tmp\n"));
}

TEST_F(VolumesEndToEnd, SameVolumeIsTheOneThatHoldsThePath) {
  fs::create_directories("/mnt/small/a/b");
  ASSERT_EQ("", mounts.bind("/mnt/small/a", "bind"));
  EXPECT_EQ("/mnt/small/.kova_tmp\n", step("same /mnt/small/a/b"));
  EXPECT_EQ("/mnt/small/.kova_tmp\n", step("same /mnt/bind/b"));
  EXPECT_THAT(step("same /mnt/none"), HasSubstr("KOVAMountVolInfoGet(/mnt/none) failed, [0x3004"));
}

TEST_F(VolumesEndToEnd, SessionTravelsBetweenProcesses) {
  std::string id = step("create hello");
  ASSERT_THAT(id, StartsWith("seln."));
  id.pop_back();
  const std::vector<fs::path> made(fs::directory_iterator("/mnt/large/.kova_tmp"), {});
  ASSERT_EQ(1U, made.size());
  EXPECT_EQ(made[0].string() + " hello\n", step("show " + id));
  EXPECT_TRUE(fs::equivalent(made[0], "/tmp/kovabackup/session/" + id));
  EXPECT_EQ("", step("destroy " + id));
  EXPECT_TRUE(fs::is_empty("/mnt/large/.kova_tmp"));
  EXPECT_FALSE(fs::exists(fs::symlink_status("/tmp/kovabackup/session/" + id)));
  EXPECT_THAT(step("show " + id), HasSubstr("failed"));
}

TEST_F(VolumesEndToEnd, ShareOfAPathIsNamed) {
  fs::create_directories("/mnt/small/music/rock");
  EXPECT_EQ("music\n", step("share /mnt/small/music/rock"));
  EXPECT_THAT(step("share /mnt/small"), HasSubstr("path/path_kova:35 Error: getting share path of "
                                                  "[/mnt/small] failed"));
}
