#include "kovabackup/temp_manager.h"
#include "tests/temp_manager/fake_volumes.h"

#include <gtest/gtest.h>

using namespace KOVA::Backup;
using namespace KovaTest;

namespace {

using Filter = boost::shared_ptr<FilterVolume>;

template <typename Class>
bool is(const Filter &filter) {
  return dynamic_cast<Class *>(filter.get()) != nullptr;
}

class TempManagerFilters : public testing::Test {
protected:
  TempManagerFilters() { platform.supportedLocation = 3; }

  FakeVolumes platform;
};

} // namespace

TEST_F(TempManagerFilters, AreOfTheClassAndArgumentsNamed) {
  platform.mountOf["/p"] = "/volume1";
  struct Case {
    Filter filter;
    const char *signature;
  };
  const Case cases[] = {
      {TempManager::maxVolume(), "FilterMaxVolume:3:1:0"},
      {TempManager::maxVolume(true), "FilterMaxVolume:3:1:1"},
      {TempManager::maxVolume(false), "FilterMaxVolume:3:1:0"},
      {TempManager::maxVolume(5, 2, true), "FilterMaxVolume:5:2:1"},
      {TempManager::maxExtVolume(), "FilterMaxExtVolume:3:1:0"},
      {TempManager::maxExtVolume(true), "FilterMaxExtVolume:3:1:1"},
      {TempManager::maxExtVolume(5, 2, false), "FilterMaxExtVolume:5:2:0"},
      {TempManager::maxExtBtrfsVolume(), "FilterMaxExtBtrfsVolume:3:1:0"},
      {TempManager::maxExtBtrfsVolume(true), "FilterMaxExtBtrfsVolume:3:1:1"},
      {TempManager::maxExtBtrfsVolume(5, 2, true), "FilterMaxExtBtrfsVolume:5:2:1"},
      {TempManager::sameVolume("/p"), "FilterSameVolume:/volume1"},
  };
  for (const Case &one : cases) {
    ASSERT_TRUE(one.filter);
    EXPECT_EQ(one.signature, one.filter->getSignature());
  }
  EXPECT_TRUE(is<FilterMaxVolume>(TempManager::maxVolume()));
  EXPECT_TRUE(is<FilterMaxExtVolume>(TempManager::maxExtVolume()));
  EXPECT_TRUE(is<FilterMaxExtBtrfsVolume>(TempManager::maxExtBtrfsVolume()));
  EXPECT_TRUE(is<FilterSameVolume>(TempManager::sameVolume("/p")));
}

TEST_F(TempManagerFilters, AreNewOnEveryCall) {
  platform.mountOf["/p"] = "/volume1";
  EXPECT_NE(TempManager::maxVolume(), TempManager::maxVolume());
  EXPECT_NE(TempManager::maxVolume(true), TempManager::maxVolume(true));
  EXPECT_NE(TempManager::maxVolume(1, 1, true), TempManager::maxVolume(1, 1, true));
  EXPECT_NE(TempManager::maxExtVolume(), TempManager::maxExtVolume());
  EXPECT_NE(TempManager::maxExtVolume(true), TempManager::maxExtVolume(true));
  EXPECT_NE(TempManager::maxExtVolume(1, 1, true), TempManager::maxExtVolume(1, 1, true));
  EXPECT_NE(TempManager::maxExtBtrfsVolume(), TempManager::maxExtBtrfsVolume());
  EXPECT_NE(TempManager::maxExtBtrfsVolume(true), TempManager::maxExtBtrfsVolume(true));
  EXPECT_NE(TempManager::maxExtBtrfsVolume(1, 1, true), TempManager::maxExtBtrfsVolume(1, 1, true));
  EXPECT_NE(TempManager::sameVolume("/p"), TempManager::sameVolume("/p"));
}

TEST_F(TempManagerFilters, AreOwnedByThePointerReturned) {
  const Filter filter = TempManager::maxVolume();
  EXPECT_EQ(1, filter.use_count());
}
