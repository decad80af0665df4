// Listing sections: which names count, which last error is restored, and every failing call.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/log_capture.h"

#include <climits>
#include <gmock/gmock.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class SectionList : public PlatformTest {
protected:
  bool listIds(const std::string &prefix) {
    return OptionMap::optSectionListId("/conf", prefix, ids_);
  }
  bool listNames() { return OptionMap::optSectionListName("/conf", names_); }

  LogCapture log_;
  std::list<int> ids_ = {99};
  std::list<std::string> names_ = {"before"};
};

} // namespace

TEST_F(SectionList, GivesIdsInFileOrder) {
  platform.sections = {"task3", "task10", "other", "task"};
  EXPECT_TRUE(listIds("task"));
  EXPECT_THAT(ids_, ElementsAre(3, 10, 0));
  EXPECT_THAT(platform.enumPaths, ElementsAre("/conf"));
  EXPECT_THAT(platform.capacities, ElementsAre(1024));
}

TEST_F(SectionList, DoesNotExamineWhatFollowsTheNumber) {
  platform.sections = {"task12abc", "taskx",    "tasks3", "task-7", "task 8", "task+9",
                       "task007",   "task0x10", "Task5",  "tas",    ""};
  EXPECT_TRUE(listIds("task"));
  EXPECT_THAT(ids_, ElementsAre(12, 0, 0, -7, 8, 9, 7, 0));
}

TEST_F(SectionList, KeepsTheLowBitsOfANumberPastInt) {
  platform.sections = {"task2147483647", "task-2147483648"};
  if (sizeof(long) > sizeof(int)) {
    platform.sections.emplace_back("task4294967298");
  }
  EXPECT_TRUE(listIds("task"));
  ids_.resize(2);
  EXPECT_THAT(ids_, ElementsAre(INT_MAX, INT_MIN));
  if (sizeof(long) > sizeof(int)) {
    EXPECT_TRUE(listIds("task"));
    EXPECT_EQ(2, ids_.back());
  }
}

TEST_F(SectionList, TakesEveryNameForAnEmptyPrefix) {
  platform.sections = {"task3", "7"};
  EXPECT_TRUE(listIds(""));
  EXPECT_THAT(ids_, ElementsAre(0, 7));
}

TEST_F(SectionList, APrefixWithANulByteMatchesNothing) {
  platform.sections = {"ta", "task1"};
  EXPECT_TRUE(listIds(std::string("ta\0", 3)));
  EXPECT_THAT(ids_, IsEmpty());
}

TEST_F(SectionList, GivesNamesInFileOrder) {
  platform.sections = {"task3", "", "a b", "task3"};
  EXPECT_TRUE(listNames());
  EXPECT_THAT(names_, ElementsAre("task3", "", "a b", "task3"));
  EXPECT_THAT(platform.capacities, ElementsAre(1024));
}

TEST_F(SectionList, ANonNegativeResultIsSuccess) {
  platform.sections = {"task1"};
  platform.enumResult = 7;
  EXPECT_TRUE(listIds("task"));
  EXPECT_THAT(ids_, ElementsAre(1));
  EXPECT_TRUE(listNames());
  EXPECT_THAT(names_, ElementsAre("task1"));
}

TEST_F(SectionList, OfAMissingFileIsEmptyAndLeavesTheLastErrorCode) {
  platform.code = 0x4321;
  platform.sections = {"rubbish"};
  platform.enumResult = -1;
  platform.enumCode = 0x0900;
  EXPECT_TRUE(listIds("task"));
  EXPECT_THAT(ids_, IsEmpty());
  EXPECT_EQ(0x4321, platform.code);
  EXPECT_TRUE(listNames());
  EXPECT_THAT(names_, IsEmpty());
  EXPECT_THAT(platform.errSets,
              ElementsAre(ErrSet{0x4321, "option_map", 856}, ErrSet{0x4321, "option_map", 895}));
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionList, AFailedEnumerationEmptiesTheOutput) {
  platform.enumResult = -1;
  platform.enumCode = 0x1234;
  EXPECT_FALSE(listIds("task"));
  EXPECT_THAT(ids_, IsEmpty());
  EXPECT_FALSE(listNames());
  EXPECT_THAT(names_, IsEmpty());
  EXPECT_THAT(
      log_.take(),
      ElementsAre(errLine("option_map", 860, "KLIBCFileEnumSection[/conf]: " + kTriple),
                  errLine("option_map", 899, "KLIBCFileEnumSection[/conf] failed: " + kTriple)));
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(SectionList, WithoutAListLeavesTheOutputAlone) {
  platform.listAllocFails = true;
  EXPECT_FALSE(listIds("task"));
  EXPECT_THAT(ids_, ElementsAre(99));
  EXPECT_FALSE(listNames());
  EXPECT_THAT(names_, ElementsAre("before"));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 848, "KLIBCSzListAlloc: " + kTriple),
                                       errLine("option_map", 887, "KLIBCSzListAlloc: " + kTriple)));
  EXPECT_THAT(platform.enumPaths, IsEmpty());
}

TEST_F(SectionList, ANameThatIsNotGivenIsSkippedAndSaid) {
  platform.sections = {"a1", std::nullopt, "a2"};
  EXPECT_TRUE(listNames());
  EXPECT_THAT(names_, ElementsAre("a1", "a2"));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 906, "KLIBCSzListGet[/conf] index[1] failed")));
  EXPECT_TRUE(listIds("a"));
  EXPECT_THAT(ids_, ElementsAre(1, 2));
  EXPECT_THAT(log_.take(), IsEmpty());
}

// The fixture counts the lists.
TEST_F(SectionList, IsFreedWhenMemoryRunsOut) {
  platform.sections = {"task1", "a name too long to be kept without memory of its own"};
  forEachAllocation(
      [&] {
        (void)listIds("task");
        (void)listNames();
      },
      [](bool) { EXPECT_EQ(0, platform.alive); });
}
