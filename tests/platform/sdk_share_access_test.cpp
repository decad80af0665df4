// What a user who is not root must be allowed to do on a volume.

#include "kovaplatform/kovasdk.h"

#include "tests/support/child_process.h"
#include "tests/support/platform_conf.h"

#include <array>
#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;

namespace {

bool hasTmpPath() {
  std::array<char, 64> path{};
  return KOVAShareTmpPathGet("/mnt/vol", path.data(), static_cast<int>(path.size())) == 0;
}

} // namespace

TEST(ShareAccess, TakesNoPermissionToReadTheVolume) {
  constexpr uid_t kUser = 12345;
  const PlatformConf conf;
  std::filesystem::create_directories("/mnt/vol");
  conf.write("[volume vol]\npath=\"/mnt/vol\"\n");
  ASSERT_TRUE(hasTmpPath());
  ASSERT_EQ(0, ::chmod("/mnt/vol", 0711));
  const int result = runInChild([] { return ::setuid(kUser) != 0 ? 2 : hasTmpPath() ? 0 : 1; });
  ASSERT_EQ(0, ::chmod("/mnt/vol", 0755));
  if (result == 2) {
    GTEST_SKIP() << "skipped: needs root to become another user";
  }
  EXPECT_EQ(0, result);
}
