// Share names as reported by a replaced platform, and the attribute folders.

#include "kovabackup/path_kova.h"

#include "kovaplatform/kovasdk.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cstring>
#include <gmock/gmock.h>

namespace {

using KovaTest::errLine;
using KovaTest::LogCapture;
using testing::ElementsAre;
namespace Path = KOVA::Backup::Path;

// The arguments and results of the platform function below.
struct {
  int calls = 0;
  std::string path;
  int nameSize = 0;
  int sharePathSize = 0;
  bool buffersWereZero = false;
  int result = 0;
  std::string name;
} platform;

class GetShareName : public testing::Test {
protected:
  void SetUp() override { platform = {}; }
};

TEST_F(GetShareName, IsWhatThePlatformReports) {
  platform.name = "music";
  EXPECT_EQ("music", Path::getShareName("/volume1/music/a"));
  EXPECT_EQ(1, platform.calls);
  EXPECT_EQ("/volume1/music/a", platform.path);
}

TEST_F(GetShareName, OffersThePlatformZeroedBuffersOfItsSizes) {
  Path::getShareName("/volume1/music");
  EXPECT_EQ(492, platform.nameSize);
  EXPECT_EQ(4095, platform.sharePathSize);
  EXPECT_TRUE(platform.buffersWereZero);
}

TEST_F(GetShareName, TakesEveryResultThatIsNotNegativeForSuccess) {
  platform.name = "music";
  for (const int result : {0, 1, 2147483647}) {
    platform.result = result;
    EXPECT_EQ("music", Path::getShareName("/volume1/music")) << result;
  }
}

TEST_F(GetShareName, IsEmptyWhenThePlatformReportsNoName) {
  EXPECT_EQ("", Path::getShareName("/"));
}

TEST_F(GetShareName, KeepsANameThatFillsTheBuffer) {
  platform.name = std::string(492, 'n');
  EXPECT_EQ(platform.name, Path::getShareName("/volume1/n"));
}

TEST_F(GetShareName, LogsAFailureOnceAndIsEmpty) {
  platform.name = "music"; // written all the same, as a platform may
  for (const int result : {-1, -2147483647 - 1}) {
    LogCapture log;
    platform.result = result;
    EXPECT_EQ("", Path::getShareName("/no/share"));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine("path/path_kova", 35,
                                    "Error: getting share path of [/no/share] failed")));
  }
}

TEST(IsInKovaEaDir, FindsAComponentOfExactlyThatName) {
  for (const char *path : {"@eaDir", "/@eaDir", "@eaDir/", "@eaDir/x", "/v/@eaDir", "/v/@eaDir/f",
                           "/v/@eaDir/", "//@eaDir//", "/v/x@eaDir/@eaDir", "/@eaDirs/@eaDir/x",
                           "@eaDir@eaDir/@eaDir", "/@eaDir/x@eaDir"}) {
    EXPECT_TRUE(Path::isInKovaEaDir(path)) << path;
  }
}

TEST(IsInKovaEaDir, TellsOtherNamesFromIt) {
  for (const char *path :
       {"", "/", "/v/x@eaDir", "/v/@eaDirs", "/v/@eadir", "/v/eaDir", "/v/@eaDi", "@eaDir@eaDir",
        "/@eaDir@eaDir/", "/v/@eaDir.x", "@@eaDir", "/v/@ea/Dir", "x@eaDir/@eaDirs"}) {
    EXPECT_FALSE(Path::isInKovaEaDir(path)) << path;
  }
}

TEST(IsInKovaEaDir, LooksPastNulBytes) {
  EXPECT_TRUE(Path::isInKovaEaDir(std::string("a\0/@eaDir", 9)));
  EXPECT_FALSE(Path::isInKovaEaDir(std::string("@eaDir\0", 7)));
}

bool isZero(const char *bytes, int size) {
  return std::all_of(bytes, bytes + size, [](char byte) { return byte == '\0'; });
}

} // namespace

extern "C" int KOVAShareNamePathGet(const char *path, char *name, int nameSize, char *sharePath,
                                    int sharePathSize) {
  ++platform.calls;
  platform.path = path;
  platform.nameSize = nameSize;
  platform.sharePathSize = sharePathSize;
  platform.buffersWereZero = isZero(name, nameSize) && isZero(sharePath, sharePathSize);
  std::memcpy(name, platform.name.data(), platform.name.size());
  return platform.result;
}
