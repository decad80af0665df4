#include "kovabackup/volume_path_manager.h"
#include "kovaplatform/kovasdk.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"

#include <boost/make_shared.hpp>
#include <filesystem>
#include <gmock/gmock.h>
#include <new>
#include <stdexcept>
#include <sys/stat.h>
#include <type_traits>
#include <unistd.h>
#include <utility>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr const char *kModule = "temp_manager/volume_path_manager";

using Filter = boost::shared_ptr<FilterVolume>;

// The last mode that access was called with; for root, access succeeds whatever the mode.
int accessAskedFor = -1;

// A rule that no earlier test has used, since results are cached.
template <typename Max = FilterMaxVolume>
Filter freshFilter(bool fallbackTmp = false) {
  return boost::make_shared<Max>(freshLocation(), 1, fallbackTmp);
}

std::pair<bool, std::string> resolve(const Filter &filter) {
  std::string path = "what was there before";
  const bool found = VolumePathManager::getInstance().getVolumePath(filter, path);
  return {found, path};
}

using Answer = std::pair<bool, std::string>;

// Volumes with real directories in /tmp, which are removed again.
class VolumePath : public testing::Test {
protected:
  ~VolumePath() override { std::filesystem::remove_all(root_); }

  void addVolume(FakeVolume volume) {
    const std::string dir = dirOf(volume.mountPath);
    std::filesystem::create_directories(dir);
    platform.tmpPaths[volume.mountPath] = dir;
    platform.volumes.push_back(std::move(volume));
  }

  std::string dirOf(const std::string &mountPath) const { return root_ + mountPath; }

  FakeVolumes platform;

private:
  const std::string root_ = "/tmp/volumes";
};

// A rule of the tests; every step may throw.
class OwnFilter : public FilterVolume {
public:
  bool getVolumeEnumParameter(int &location, int &enumFlags) const override {
    EXPECT_EQ(0, std::exchange(location, 4));
    EXPECT_EQ(0, std::exchange(enumFlags, 9));
    return enumerates;
  }
  bool isAccept(const KOVAVOLInfo &info) override {
    if (throws) {
      throw std::runtime_error("isAccept");
    }
    offered.emplace_back(info.mountPath);
    if (!signatureAfterwards.empty()) {
      signature = signatureAfterwards;
    }
    return accepts;
  }
  std::string defaultPath() const override { return fallback; }
  std::string getSignature() const override {
    ++signatures;
    return signature;
  }

  bool enumerates = true;
  bool throws = false;
  bool accepts = true;
  std::string fallback;
  std::string signature = "OwnFilter:" + std::to_string(freshLocation());
  std::string signatureAfterwards;
  std::vector<std::string> offered;
  mutable int signatures = 0;
};

} // namespace

extern "C" int access(const char *path, int mode) noexcept {
  static auto *const real = realFunction<int(const char *, int)>("access");
  accessAskedFor = mode;
  return failsNow("access") ? -1 : real(path, mode);
}

TEST(VolumePathManager, IsOneObjectThatNobodyElseMakesOrCopies) {
  EXPECT_EQ(&VolumePathManager::getInstance(), &VolumePathManager::getInstance());
  EXPECT_FALSE(std::is_default_constructible<VolumePathManager>::value);
  EXPECT_FALSE(std::is_copy_constructible<VolumePathManager>::value);
  EXPECT_FALSE(std::is_copy_assignable<VolumePathManager>::value);
  EXPECT_FALSE(std::is_destructible<VolumePathManager>::value);
}

TEST_F(VolumePath, OfNoFilterLeavesThePathUntouched) {
  EXPECT_EQ(Answer(false, "what was there before"), resolve(Filter()));
  EXPECT_EQ(0, platform.enumerations);
}

TEST_F(VolumePath, IsTheShareTemporaryDirectoryOfTheLargestVolume) {
  addVolume({"/volume1", 100});
  addVolume({"/volume2", 300});
  addVolume({"/volume3", 200});
  EXPECT_EQ(Answer(true, dirOf("/volume2")), resolve(freshFilter()));
  EXPECT_THAT(platform.tmpPathsAsked, ElementsAre("/volume1", "/volume2", "/volume3"));
}

TEST_F(VolumePath, IsTheFirstOfEquallyLargeVolumes) {
  addVolume({"/volume1", 100});
  addVolume({"/volume2", 100});
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(freshFilter()));
}

TEST_F(VolumePath, EnumeratesWithTheFiltersArguments) {
  addVolume({"/volume1", 100});
  const int location = freshLocation();
  resolve(boost::make_shared<FilterMaxVolume>(location, 7, false));
  EXPECT_EQ(0, platform.reserved);
  EXPECT_EQ(location, platform.location);
  EXPECT_EQ(7, platform.enumFlags);
}

TEST_F(VolumePath, CountsOnlyFileSystemsThatTheFilterTakes) {
  addVolume({"/btrfs", 300, 3});
  addVolume({"/ext", 200, 1});
  addVolume({"/other", 400, 17});
  EXPECT_EQ(Answer(true, dirOf("/ext")), resolve(freshFilter<FilterMaxExtVolume>()));
  EXPECT_EQ(Answer(true, dirOf("/btrfs")), resolve(freshFilter<FilterMaxExtBtrfsVolume>()));
  EXPECT_EQ(Answer(true, dirOf("/other")), resolve(freshFilter<FilterMaxVolume>()));
}

TEST_F(VolumePath, SkipsVolumesThatAreNotUsable) {
  addVolume({"/unmounted", 900, 2, 0, 1});
  addVolume({"/forbidden", 800, 2, 1, 0});
  addVolume({"/usable", 100, 2, 0x80000000U, 2});
  platform.volumes.push_back({"", 700});
  EXPECT_EQ(Answer(true, dirOf("/usable")), resolve(freshFilter()));
  EXPECT_THAT(platform.tmpPathsAsked, ElementsAre("/usable"))
      << "the others are not even asked for";
}

TEST_F(VolumePath, SkipsAVolumeWhoseDirectoryMayNotBeWritten) {
  addVolume({"/large", 900});
  addVolume({"/small", 100});
  const Fault fault("access", 1, EACCES);
  EXPECT_EQ(Answer(true, dirOf("/small")), resolve(freshFilter()));
  EXPECT_EQ(2, fault.calls());
}

TEST_F(VolumePath, AsksWhetherTheDirectoryMayBeWritten) {
  addVolume({"/volume1", 100});
  EXPECT_TRUE(resolve(freshFilter()).first);
  EXPECT_EQ(W_OK, accessAskedFor);
}

TEST_F(VolumePath, SkipsAVolumeWhoseDirectoryIsMissing) {
  addVolume({"/large", 900});
  addVolume({"/small", 100});
  std::filesystem::remove(dirOf("/large"));
  EXPECT_EQ(Answer(true, dirOf("/small")), resolve(freshFilter()));
}

TEST_F(VolumePath, SkipsAVolumeWithAnEmptyDirectoryName) {
  addVolume({"/large", 900});
  addVolume({"/small", 100});
  platform.tmpPaths["/large"] = "";
  const Fault fault("access", 99, EACCES);
  EXPECT_EQ(Answer(true, dirOf("/small")), resolve(freshFilter()));
  EXPECT_EQ(1, fault.calls()) << "an empty name is not tried";
}

TEST_F(VolumePath, LogsEveryVolumeWithoutADirectoryAndGoesOn) {
  addVolume({"/large", 900});
  addVolume({"/small", 100});
  addVolume({"/other", 50});
  platform.tmpPaths.erase("/large");
  platform.tmpPaths.erase("/other");
  LogCapture log;
  EXPECT_EQ(Answer(true, dirOf("/small")), resolve(freshFilter()));
  EXPECT_THAT(
      log.take(),
      ElementsAre(
          errLine(kModule, 19, "KOVAShareTmpPathGet(/large) fail, [0x000D sdk/share.c:1234]"),
          errLine(kModule, 19, "KOVAShareTmpPathGet(/other) fail, [0x000D sdk/share.c:1234]")));
}

TEST_F(VolumePath, DoesNotShowTheFilterWhatIsNotUsable) {
  addVolume({"/unmounted", 900, 2, 0, 1});
  addVolume({"/first", 1});
  addVolume({"/gone", 900});
  addVolume({"/last", 0});
  std::filesystem::remove(dirOf("/gone"));
  const auto filter = boost::make_shared<OwnFilter>();
  EXPECT_EQ(Answer(true, dirOf("/last")), resolve(filter)) << "a later acceptance wins";
  EXPECT_THAT(filter->offered, ElementsAre("/first", "/last"));
  EXPECT_EQ(4, platform.location);
  EXPECT_EQ(9, platform.enumFlags);
}

TEST_F(VolumePath, ReadsAMountPathOfFullLength) {
  const std::string longest = "/" + std::string(34, 'v');
  addVolume({longest, 100});
  EXPECT_EQ(Answer(true, dirOf(longest)), resolve(freshFilter()));
}

// --- fallback ---

TEST_F(VolumePath, OfUnsuitableVolumesIsTheFallback) {
  addVolume({"/volume1", 100, 17});
  EXPECT_EQ(Answer(false, ""), resolve(freshFilter<FilterMaxExtVolume>(false)));
  EXPECT_EQ(Answer(true, "/tmp"), resolve(freshFilter<FilterMaxExtVolume>(true)));
}

TEST_F(VolumePath, OfNoVolumesIsTheFallback) {
  EXPECT_EQ(Answer(false, ""), resolve(freshFilter(false)));
  EXPECT_EQ(Answer(true, "/tmp"), resolve(freshFilter(true)));
  EXPECT_EQ(0, platform.freed) << "there is no list to free";
}

TEST_F(VolumePath, OfAFilterThatDoesNotEnumerateIsTheFallback) {
  addVolume({"/volume1", 100});
  const auto filter = boost::make_shared<OwnFilter>();
  filter->enumerates = false;
  filter->fallback = "/fallback";
  EXPECT_EQ(Answer(true, "/fallback"), resolve(filter));
  EXPECT_EQ(0, platform.enumerations);
}

TEST_F(VolumePath, OfThePathsOwnVolumeNeedsNoEnumeration) {
  const std::string mountPath = "/same" + std::to_string(freshLocation());
  addVolume({mountPath, 100});
  platform.mountOf["/a/path"] = mountPath;
  EXPECT_EQ(Answer(true, dirOf(mountPath)),
            resolve(boost::make_shared<FilterSameVolume>("/a/path")));
  EXPECT_EQ(0, platform.enumerations);
}

TEST_F(VolumePath, OfAPathWithoutVolumeIsNone) {
  LogCapture log;
  const Filter filter = boost::make_shared<FilterSameVolume>("/nowhere");
  log.take();
  EXPECT_EQ(Answer(false, ""), resolve(filter));
  EXPECT_THAT(log.take(), IsEmpty());
}

// --- memory of results ---

TEST_F(VolumePath, IsRememberedForEveryFilterOfTheSameSignature) {
  addVolume({"/volume1", 100});
  const int location = freshLocation();
  const Answer first = resolve(boost::make_shared<FilterMaxVolume>(location, 1, false));
  addVolume({"/volume2", 900});
  EXPECT_EQ(first, resolve(boost::make_shared<FilterMaxVolume>(location, 1, false)));
  EXPECT_EQ(1, platform.enumerations);
  EXPECT_THAT(platform.tmpPathsAsked, ElementsAre("/volume1"));
}

TEST_F(VolumePath, IsRememberedUnderTheWholeSignature) {
  addVolume({"/volume1", 100});
  const int location = freshLocation();
  resolve(boost::make_shared<FilterMaxVolume>(location, 1, false));
  resolve(boost::make_shared<FilterMaxVolume>(location, 1, true));
  resolve(boost::make_shared<FilterMaxVolume>(location, 2, false));
  resolve(boost::make_shared<FilterMaxExtVolume>(location, 1, false));
  EXPECT_EQ(4, platform.enumerations);
}

TEST_F(VolumePath, OnceRememberedLooksAtNothingElse) {
  const auto filter = boost::make_shared<OwnFilter>();
  filter->enumerates = false;
  filter->fallback = "/first";
  resolve(filter);
  filter->fallback = "/second";
  filter->signatures = 0;
  EXPECT_EQ(Answer(true, "/first"), resolve(filter));
  EXPECT_EQ(1, filter->signatures);
}

TEST_F(VolumePath, KeepsAFallbackEvenWhenAVolumeAppears) {
  const int location = freshLocation();
  EXPECT_EQ(Answer(true, "/tmp"), resolve(boost::make_shared<FilterMaxVolume>(location, 1, true)));
  addVolume({"/volume1", 100});
  EXPECT_EQ(Answer(true, "/tmp"), resolve(boost::make_shared<FilterMaxVolume>(location, 1, true)));
}

TEST_F(VolumePath, LooksAgainAfterAFailure) {
  addVolume({"/volume1", 100});
  platform.volumes[0].status = 0;
  const Filter filter = freshFilter();
  EXPECT_EQ(Answer(false, ""), resolve(filter));
  platform.volumes[0].status = 1;
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(filter));
  EXPECT_EQ(2, platform.enumerations);
}

TEST_F(VolumePath, AFilterThatHasRankedOnceRejectsWhatIsNoLarger) {
  addVolume({"/volume1", 100});
  const Filter filter = freshFilter();
  ASSERT_TRUE(filter->isAccept([] {
    KOVAVOLInfo info{};
    info.size = 100;
    return info;
  }()));
  EXPECT_EQ(Answer(false, ""), resolve(filter));
}

TEST_F(VolumePath, IsRememberedUnderTheSignatureThatTheFilterHasAfterwards) {
  addVolume({"/volume1", 100});
  const auto filter = boost::make_shared<OwnFilter>();
  const std::string before = filter->signature;
  filter->signatureAfterwards = before + ":ranked";
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(filter));

  const auto unranked = boost::make_shared<OwnFilter>();
  unranked->enumerates = false;
  unranked->signature = before;
  EXPECT_EQ(Answer(false, ""), resolve(unranked)) << "nothing stands under the former signature";
  unranked->signature = before + ":ranked";
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(unranked));
}

TEST_F(VolumePath, OfTheFallbackIsRememberedUnderTheLaterSignatureToo) {
  addVolume({"/volume1", 100});
  const auto filter = boost::make_shared<OwnFilter>();
  const std::string before = filter->signature;
  filter->signatureAfterwards = before + ":ranked";
  filter->accepts = false;
  filter->fallback = "/fallback";
  EXPECT_EQ(Answer(true, "/fallback"), resolve(filter));

  const auto unranked = boost::make_shared<OwnFilter>();
  unranked->enumerates = false;
  unranked->signature = before;
  EXPECT_EQ(Answer(false, ""), resolve(unranked)) << "nothing stands under the former signature";
  unranked->signature = before + ":ranked";
  EXPECT_EQ(Answer(true, "/fallback"), resolve(unranked));
}

TEST_F(VolumePath, OverwritesWhatStoodUnderTheLaterSignature) {
  addVolume({"/volume1", 100});
  const auto first = boost::make_shared<OwnFilter>();
  first->enumerates = false;
  first->fallback = "/old";
  resolve(first);
  const auto second = boost::make_shared<OwnFilter>();
  second->signatureAfterwards = first->signature;
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(second));
  EXPECT_EQ(Answer(true, dirOf("/volume1")), resolve(first));
}

// --- the enumeration is freed whatever happens ---
// (the destructor of FakeVolumes compares)

TEST_F(VolumePath, FreesTheEnumerationWhenTheFilterThrows) {
  addVolume({"/volume1", 100});
  addVolume({"/volume2", 200});
  const auto filter = boost::make_shared<OwnFilter>();
  filter->throws = true;
  std::string path = "what was there before";
  EXPECT_THROW(VolumePathManager::getInstance().getVolumePath(filter, path), std::runtime_error);
  EXPECT_EQ("", path);
  EXPECT_EQ(1, platform.lists);
  EXPECT_EQ(1, platform.freed);
}

TEST_F(VolumePath, FreesTheEnumerationWhenMemoryRunsOut) {
  addVolume({"/" + std::string(30, 'v'), 100}); // too long for the inline buffer of a string
  addVolume({"/volume2", 200});
  const std::string expected = dirOf("/volume2");
  int during = 0;
  forEachAllocation(
      [&] {
        platform.lists = 0;
        platform.freed = 0;
        const Filter filter = freshFilter();
        std::string path;
        EXPECT_TRUE(VolumePathManager::getInstance().getVolumePath(filter, path));
        EXPECT_EQ(expected, path);
      },
      [&](bool threw) {
        during += threw ? platform.lists : 0;
        EXPECT_EQ(platform.lists, platform.freed);
      });
  EXPECT_GT(during, 2) << "allocations fail while a list is held";
}

TEST_F(VolumePath, RemembersNothingWhenMemoryRunsOut) {
  addVolume({"/" + std::string(30, 'v'), 100}); // too long for the inline buffer of a string
  const std::string expected = dirOf(platform.volumes[0].mountPath);
  int location = 0;
  forEachAllocation(
      [&] {
        location = freshLocation();
        std::string path;
        const Filter filter = boost::make_shared<FilterMaxVolume>(location, 1, false);
        EXPECT_TRUE(VolumePathManager::getInstance().getVolumePath(filter, path));
      },
      [&](bool) {
        EXPECT_EQ(Answer(true, expected),
                  resolve(boost::make_shared<FilterMaxVolume>(location, 1, false)));
      });
}

// --- every failing call ---

TEST_F(VolumePath, IsThatOfTheVolumesWhoseDirectoriesMayBeWritten) {
  addVolume({"/volume1", 100});
  addVolume({"/volume2", 200});
  std::vector<std::string> paths;
  forEachFailure("access", EROFS, [&](Fault &) { paths.push_back(resolve(freshFilter()).second); });
  EXPECT_THAT(paths, ElementsAre(dirOf("/volume2"), dirOf("/volume1"), dirOf("/volume2"), // once
                                 "", dirOf("/volume1"), dirOf("/volume2")));              // lasting
}
