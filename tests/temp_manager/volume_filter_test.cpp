#include "kovabackup/volume_path_manager.h"
#include "kovaplatform/kovasdk.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"

#include <cstring>
#include <gmock/gmock.h>
#include <type_traits>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr const char *kModule = "temp_manager/volume_path_manager";

KOVAVOLInfo record(std::int32_t fsType, std::uint64_t size) {
  KOVAVOLInfo info;
  std::memset(&info, 0, sizeof info); // filters do not depend on status word and mount path
  info.fsType = fsType;
  info.size = size;
  return info;
}

template <typename Filter>
class MaxFilter : public testing::Test {};

using MaxFilters = testing::Types<FilterMaxVolume, FilterMaxExtVolume, FilterMaxExtBtrfsVolume>;
TYPED_TEST_SUITE(MaxFilter, MaxFilters);

template <typename Filter>
std::string tag();
template <>
std::string tag<FilterMaxVolume>() {
  return "FilterMaxVolume:";
}
template <>
std::string tag<FilterMaxExtVolume>() {
  return "FilterMaxExtVolume:";
}
template <>
std::string tag<FilterMaxExtBtrfsVolume>() {
  return "FilterMaxExtBtrfsVolume:";
}

} // namespace

// --- the base ---

namespace {
class BareFilter : public FilterVolume {
public:
  bool isAccept(const KOVAVOLInfo & /*info*/) override { return false; }
  std::string getSignature() const override { return "BareFilter"; }
};
} // namespace

TEST(FilterVolume, EnumeratesWhatThePlatformSupports) {
  FakeVolumes platform;
  platform.supportedLocation = 3;
  int location = -7;
  int flags = -7;
  EXPECT_TRUE(BareFilter().getVolumeEnumParameter(location, flags));
  EXPECT_EQ(3, location);
  EXPECT_EQ(1, flags);
}

TEST(FilterVolume, LeavesTheArgumentsAloneWhenThePlatformSupportsNoLocation) {
  FakeVolumes platform;
  platform.supportedLocation = 0;
  int location = -7;
  int flags = -8;
  EXPECT_FALSE(BareFilter().getVolumeEnumParameter(location, flags));
  EXPECT_EQ(-7, location);
  EXPECT_EQ(-8, flags);
}

TEST(FilterVolume, PassesANegativeLocationMaskOn) {
  FakeVolumes platform;
  platform.supportedLocation = -1;
  int location = 0;
  int flags = 0;
  EXPECT_TRUE(BareFilter().getVolumeEnumParameter(location, flags));
  EXPECT_EQ(-1, location);
}

TEST(FilterVolume, HasNoFallback) {
  EXPECT_EQ("", BareFilter().defaultPath());
}

TEST(FilterVolume, HoldsNothingAndIsDestroyedThroughItself) {
  EXPECT_EQ(sizeof(FilterVolume), sizeof(void *));
  EXPECT_TRUE(std::is_abstract<FilterVolume>::value);
  EXPECT_TRUE(std::has_virtual_destructor<FilterVolume>::value);
}

TEST(FilterVolume, HasEveryFilterAsItsOwnChild) {
  EXPECT_TRUE((std::is_base_of<FilterVolume, FilterMaxVolume>::value));
  EXPECT_FALSE((std::is_base_of<FilterMaxVolume, FilterMaxExtVolume>::value));
  EXPECT_FALSE((std::is_base_of<FilterMaxVolume, FilterMaxExtBtrfsVolume>::value));
  EXPECT_FALSE((std::is_base_of<FilterMaxExtVolume, FilterMaxExtBtrfsVolume>::value));
}

#if defined(__x86_64__) || defined(__i386__)
namespace {
// The index of an operation in the virtual table: in this ABI a pointer to a virtual member
// function is its offset plus one. The destructor has the first two entries.
template <typename Member>
std::size_t slotOf(Member member) {
  std::uintptr_t pointer = 0;
  std::memcpy(&pointer, &member, sizeof pointer);
  return (pointer - 1) / sizeof(void *);
}
} // namespace

TEST(FilterVolume, KeepsTheOrderOfItsVirtualOperations) {
  EXPECT_EQ(2U, slotOf(&FilterVolume::getVolumeEnumParameter));
  EXPECT_EQ(3U, slotOf(&FilterVolume::isAccept));
  EXPECT_EQ(4U, slotOf(&FilterVolume::defaultPath));
  EXPECT_EQ(5U, slotOf(&FilterVolume::getSignature));
}
#endif

// --- the maximum filters ---

TYPED_TEST(MaxFilter, HoldsLocationFlagsFallbackAndLargestSizeInThisOrder) {
  TypeParam filter(5, 2, true);
  auto info = record(2, 0x1122334455667788ULL);
  ASSERT_TRUE(filter.isAccept(info));
  struct Fields {
    void *table;
    int location;
    int enumFlags;
    bool fallbackTmp;
    std::uint64_t maxSize;
  } fields;
  static_assert(sizeof(Fields) == sizeof(TypeParam), "no field more");
  std::memcpy(&fields, static_cast<void *>(&filter), sizeof fields);
  EXPECT_EQ(5, fields.location);
  EXPECT_EQ(2, fields.enumFlags);
  EXPECT_TRUE(fields.fallbackTmp);
  EXPECT_EQ(0x1122334455667788ULL, fields.maxSize);
}

TYPED_TEST(MaxFilter, IsMadeWithThePlatformsArgumentsByDefault) {
  FakeVolumes platform;
  platform.supportedLocation = 3;
  TypeParam filter;
  EXPECT_EQ(tag<TypeParam>() + "3:1:0", filter.getSignature());
  EXPECT_EQ("", filter.defaultPath());
}

TYPED_TEST(MaxFilter, IsMadeWithZerosWhereThePlatformSupportsNoLocation) {
  FakeVolumes platform;
  platform.supportedLocation = 0;
  TypeParam filter(true);
  EXPECT_EQ(tag<TypeParam>() + "0:0:1", filter.getSignature());
  int location = -7;
  int flags = -7;
  EXPECT_TRUE(filter.getVolumeEnumParameter(location, flags));
  EXPECT_EQ(0, location);
  EXPECT_EQ(0, flags);
}

TYPED_TEST(MaxFilter, AsksThePlatformOnlyWhenItIsMade) {
  FakeVolumes platform;
  platform.supportedLocation = 3;
  TypeParam filter;
  platform.supportedLocation = 8;
  int location = 0;
  int flags = 0;
  EXPECT_TRUE(filter.getVolumeEnumParameter(location, flags));
  EXPECT_EQ(3, location);
  EXPECT_EQ(1, flags);
}

TYPED_TEST(MaxFilter, GivesOutTheArgumentsThatItWasMadeWith) {
  TypeParam filter(-5, 77, false);
  int location = 0;
  int flags = 0;
  EXPECT_TRUE(filter.getVolumeEnumParameter(location, flags));
  EXPECT_EQ(-5, location);
  EXPECT_EQ(77, flags);
}

TYPED_TEST(MaxFilter, FallsBackToTmpOnlyWhenToldTo) {
  FakeVolumes platform;
  EXPECT_EQ("/tmp", TypeParam(true).defaultPath());
  EXPECT_EQ("", TypeParam(false).defaultPath());
  EXPECT_EQ("/tmp", TypeParam(1, 1, true).defaultPath());
  EXPECT_EQ("", TypeParam(1, 1, false).defaultPath());
}

TYPED_TEST(MaxFilter, SignsWithTagLocationFlagsAndFallback) {
  EXPECT_EQ(tag<TypeParam>() + "5:2:0", TypeParam(5, 2, false).getSignature());
  EXPECT_EQ(tag<TypeParam>() + "3:1:1", TypeParam(3, 1, true).getSignature());
  EXPECT_EQ(tag<TypeParam>() + "-1:2147483647:0", TypeParam(-1, 2147483647, false).getSignature());
}

TYPED_TEST(MaxFilter, AcceptsOnlyWhatIsLargerThanAllBefore) {
  TypeParam filter(1, 1, false);
  EXPECT_TRUE(filter.isAccept(record(1, 100)));
  EXPECT_FALSE(filter.isAccept(record(1, 100))) << "of equal ones the first stays";
  EXPECT_FALSE(filter.isAccept(record(1, 99)));
  EXPECT_TRUE(filter.isAccept(record(2, 101)));
  EXPECT_FALSE(filter.isAccept(record(2, 100)));
}

TYPED_TEST(MaxFilter, NeverAcceptsSizeZero) {
  TypeParam filter(1, 1, false);
  EXPECT_FALSE(filter.isAccept(record(1, 0)));
  EXPECT_TRUE(filter.isAccept(record(1, 1)));
}

TYPED_TEST(MaxFilter, ComparesSizesAsUnsigned64BitNumbers) {
  TypeParam filter(1, 1, false);
  EXPECT_TRUE(filter.isAccept(record(1, 0xffffffffULL)));
  EXPECT_TRUE(filter.isAccept(record(1, 0x100000000ULL)));
  EXPECT_TRUE(filter.isAccept(record(1, 0x8000000000000000ULL)));
  EXPECT_FALSE(filter.isAccept(record(1, 0x7fffffffffffffffULL)));
  EXPECT_TRUE(filter.isAccept(record(1, 0xffffffffffffffffULL)));
}

TEST(MaxFilterTypes, DecideWhichFileSystemsCount) {
  struct Case {
    std::int32_t code;
    bool any, ext, extBtrfs;
  };
  const Case cases[] = {{0, true, false, false},         {1, true, true, true},
                        {2, true, true, true},           {3, true, false, true},
                        {4, true, false, false},         {-1, true, false, false},
                        {INT32_MIN, true, false, false}, {INT32_MIN + 1, true, false, false},
                        {INT32_MAX, true, false, false}, {0x10001, true, false, false}};
  for (const Case &one : cases) {
    SCOPED_TRACE(one.code);
    const auto info = record(one.code, 10);
    EXPECT_EQ(one.any, FilterMaxVolume(1, 1, false).isAccept(info));
    EXPECT_EQ(one.ext, FilterMaxExtVolume(1, 1, false).isAccept(info));
    EXPECT_EQ(one.extBtrfs, FilterMaxExtBtrfsVolume(1, 1, false).isAccept(info));
  }
}

TEST(MaxFilterTypes, ARejectedTypeDoesNotRaiseTheMark) {
  FilterMaxExtVolume ext(1, 1, false);
  EXPECT_FALSE(ext.isAccept(record(3, 1000)));
  EXPECT_TRUE(ext.isAccept(record(1, 10)));
  FilterMaxExtBtrfsVolume extBtrfs(1, 1, false);
  EXPECT_FALSE(extBtrfs.isAccept(record(4, 1000)));
  EXPECT_TRUE(extBtrfs.isAccept(record(3, 10)));
}

// --- the volume of a path ---

TEST(FilterSameVolume, HoldsTheMountPathOfThePathsVolume) {
  FakeVolumes platform;
  platform.mountOf["/volume1/share/file"] = "/volume1";
  const FilterSameVolume filter("/volume1/share/file");
  EXPECT_EQ("FilterSameVolume:/volume1", filter.getSignature());
}

TEST(FilterSameVolume, HoldsAMountPathOfFullLength) {
  FakeVolumes platform;
  const std::string longest = "/" + std::string(34, 'v');
  platform.mountOf["p"] = longest;
  EXPECT_EQ("FilterSameVolume:" + longest, FilterSameVolume("p").getSignature());
}

TEST(FilterSameVolume, LogsAPathWhoseVolumeIsUnknownAndStaysUsable) {
  FakeVolumes platform;
  LogCapture log;
  FilterSameVolume filter("/nowhere");
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(
                  kModule, 30, "KOVAMountVolInfoGet(/nowhere) failed, [0x2A00 sdk/volume.c:77]")));
  EXPECT_EQ("FilterSameVolume:", filter.getSignature());
  EXPECT_EQ("", filter.defaultPath());
  EXPECT_THAT(platform.tmpPathsAsked, IsEmpty());
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST(FilterSameVolume, NeitherEnumeratesNorAccepts) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  FilterSameVolume filter("p");
  int location = -7;
  int flags = -8;
  EXPECT_FALSE(filter.getVolumeEnumParameter(location, flags));
  EXPECT_EQ(-7, location);
  EXPECT_EQ(-8, flags);
  EXPECT_FALSE(filter.isAccept(record(1, 1000)));
}

TEST(FilterSameVolume, FallsBackToTheShareTemporaryDirectory) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  platform.tmpPaths["/volume1"] = "/volume1/@tmp";
  EXPECT_EQ("/volume1/@tmp", FilterSameVolume("p").defaultPath());
}

TEST(FilterSameVolume, TakesAShareTemporaryDirectoryThatFillsTheBuffer) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  platform.tmpPaths["/volume1"] = std::string(4095, 'd');
  EXPECT_EQ(std::string(4095, 'd'), FilterSameVolume("p").defaultPath());
}

TEST(FilterSameVolume, LogsAShareTemporaryDirectoryThatThePlatformCannotName) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  const FilterSameVolume filter("p");
  LogCapture log;
  EXPECT_EQ("", filter.defaultPath());
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(
                  kModule, 19, "KOVAShareTmpPathGet(/volume1) fail, [0x000D sdk/share.c:1234]")));
}

TEST(FilterSameVolume, TakesEveryResultThatIsNotNegativeForSuccess) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  platform.tmpPaths["/volume1"] = "/volume1/@tmp";
  for (const int result : {0, 1, INT32_MAX}) {
    platform.success = result;
    const FilterSameVolume filter("p");
    EXPECT_EQ("FilterSameVolume:/volume1", filter.getSignature()) << result;
    EXPECT_EQ("/volume1/@tmp", filter.defaultPath()) << result;
  }
}

TEST(FilterSameVolume, TakesEveryNegativeResultForFailure) {
  FakeVolumes platform;
  platform.mountOf["p"] = "/volume1";
  for (const int result : {-1, -2, INT32_MIN}) {
    platform.failure = result;
    LogCapture log;
    EXPECT_EQ("FilterSameVolume:", FilterSameVolume("/nowhere").getSignature()) << result;
    EXPECT_EQ(1U, log.take().size());
    EXPECT_EQ("", FilterSameVolume("p").defaultPath()) << result;
    EXPECT_EQ(1U, log.take().size());
  }
}

TEST(FilterSameVolume, HoldsNothingButTheMountPath) {
  EXPECT_EQ(sizeof(void *) + sizeof(std::string), sizeof(FilterSameVolume));
}
