// Saving, creating and removing a bound section: the checks before it, the lock during it and the
// binding after it.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

namespace {

bool isLocked() {
  const int fd = ::open("/tmp/kovabackup/lock/token", O_RDWR | O_CLOEXEC);
  const bool locked = fd >= 0 && ::flock(fd, LOCK_EX | LOCK_NB) != 0;
  ::close(fd);
  return locked;
}

class BoundMap : public PlatformTest {
protected:
  BoundMap() {
    EXPECT_TRUE(map_.setLockToken("token"));
    platform.duringWrite = [this] { lockedDuringWrite_ = isLocked(); };
  }

  void bind() {
    ASSERT_FALSE(map_.optSectionLoad(path_, "task", 12)); // binds although the file does not exist
    map_.optSet("a", 1);
  }

  void expectBound(const std::string &name, int id) {
    EXPECT_EQ(name, map_.optSectionGetName());
    EXPECT_EQ(id, map_.optSectionGetId());
  }

  bool isReleased() { return !isLocked() && map_.lock() && map_.unlock(); }

  TestFolder dir_;
  std::string path_ = dir_ / "conf";
  LogCapture log_;
  OptionMap map_;
  bool lockedDuringWrite_ = false;
};
class SectionSave : public BoundMap {};
class SectionRemove : public BoundMap {};
class SectionCreateId : public BoundMap {};
class SectionCreateNew : public BoundMap {};

const auto kReleaseFailed = [] {
  return errLine("option_map", 980, "unlock: flock(LOCK_UN) failed. Input/output error");
};
const auto kLockFailed = [] {
  return errLine("option_map", 956, "lock: flock(LOCK_EX) failed. Input/output error");
};

} // namespace

TEST_F(SectionSave, WritesUnderTheLockIntoTheExistingSection) {
  bind();
  EXPECT_TRUE(map_.optSectionSave());
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_EQ(path_, platform.setCalls[0].path);
  EXPECT_EQ("task12", platform.setCalls[0].name);
  EXPECT_THAT(platform.setCalls[0].pairs, ElementsAre(Pair("a", "1")));
  EXPECT_TRUE(lockedDuringWrite_);
  EXPECT_TRUE(isReleased());
  EXPECT_THAT(log_.take(), IsEmpty());
  expectBound("task12", 12);
}

TEST_F(SectionSave, WorksWithoutALockToken) {
  bind();
  OptionMap unlocked;
  ASSERT_FALSE(unlocked.optSectionLoad(path_, "task", 12));
  EXPECT_TRUE(unlocked.optSectionSave());
  EXPECT_FALSE(lockedDuringWrite_);
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs, IsEmpty());
}

TEST_F(SectionSave, NeedsABinding) {
  EXPECT_FALSE(map_.optSectionSave());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 644, "not bind before save")));
  EXPECT_FALSE(map_.optSectionLoad(path_, "", -1)); // a path, but no name
  log_.take();
  EXPECT_FALSE(map_.optSectionSave());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 644, "not bind before save")));
  EXPECT_THAT(platform.setCalls, IsEmpty());
}

TEST_F(SectionSave, FailsWithoutTheLock) {
  bind();
  const Fault fault("flock", 1, EIO);
  EXPECT_FALSE(map_.optSectionSave());
  EXPECT_THAT(log_.take(), ElementsAre(kLockFailed()));
  EXPECT_THAT(platform.setCalls, IsEmpty());
}

TEST_F(SectionSave, FailsWhileTheMapHoldsItsLock) {
  bind();
  ASSERT_TRUE(map_.lock());
  EXPECT_FALSE(map_.optSectionSave());
  const std::string begin = errLine("option_map", 944, "lock: file locked already. fd: [").text;
  EXPECT_THAT(log_.take(), ElementsAre(testing::Field(&LogLine::text, testing::StartsWith(begin))));
  EXPECT_TRUE(isLocked()) << "the caller's lock stays";
  EXPECT_TRUE(map_.unlock());
  EXPECT_THAT(platform.setCalls, IsEmpty());
}

TEST_F(SectionSave, UnlocksAfterAFailure) {
  bind();
  platform.setResult = -1;
  platform.setCode = 0x1234;
  EXPECT_FALSE(map_.optSectionSave());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 379, "KLIBFileSetSection failed.: " + kTriple)));
  EXPECT_TRUE(isReleased());
  expectBound("task12", 12);
}

TEST_F(SectionSave, UnlocksAfterAnUnexportableOption) {
  bind();
  ASSERT_TRUE(map_.optLoadJsonString(R"({"r":1.5})"));
  EXPECT_FALSE(map_.optSectionSave());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 687, "unknown type key")));
  EXPECT_TRUE(isReleased());
}

TEST_F(SectionSave, IsFalseWhenOnlyUnlockingFails) {
  bind();
  {
    const Fault fault("flock", 2, EIO);
    platform.duringWrite = nullptr; // its flock would be counted
    EXPECT_FALSE(map_.optSectionSave());
  }
  EXPECT_THAT(log_.take(), ElementsAre(kReleaseFailed()));
  EXPECT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_TRUE(map_.unlock()) << "still held";
}

TEST_F(SectionSave, UnlocksWhenMemoryRunsOut) {
  bind();
  map_.optSet("a key too long to be kept without memory", "and a text of that kind as well");
  forEachAllocation([&] { (void)map_.optSectionSave(); },
                    [](bool) {
                      EXPECT_EQ(0, platform.alive);
                      EXPECT_FALSE(isLocked());
                    });
}

TEST_F(SectionRemove, RemovesUnderTheLockAndKeepsValuesAndBinding) {
  bind();
  EXPECT_TRUE(map_.optSectionRemove());
  EXPECT_THAT(platform.removeCalls, ElementsAre(Pair(path_, "task12")));
  EXPECT_TRUE(lockedDuringWrite_);
  EXPECT_TRUE(isReleased());
  expectBound("task12", 12);
  EXPECT_EQ(R"({"a":1})", map_.optToJsonString());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionRemove, NeedsABinding) {
  EXPECT_FALSE(map_.optSectionRemove());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 709, "not bind before remove")));
  EXPECT_THAT(platform.removeCalls, IsEmpty());
}

TEST_F(SectionRemove, AnyOtherResultThanOneIsAFailure) {
  bind();
  for (const int result : {0, -1, 2}) {
    platform.removeResult = result;
    platform.removeCode = 0x1234;
    EXPECT_FALSE(map_.optSectionRemove());
    EXPECT_THAT(log_.take(),
                ElementsAre(errLine("option_map", 719, "rm [" + path_ + "][task12]: " + kTriple)));
    EXPECT_TRUE(isReleased());
  }
  expectBound("task12", 12);
}

TEST_F(SectionRemove, FailsWithoutTheLock) {
  bind();
  const Fault fault("flock", 1, EIO);
  EXPECT_FALSE(map_.optSectionRemove());
  EXPECT_THAT(log_.take(), ElementsAre(kLockFailed()));
  EXPECT_THAT(platform.removeCalls, IsEmpty());
}

TEST_F(SectionRemove, IsFalseWhenOnlyUnlockingFails) {
  bind();
  {
    const Fault fault("flock", 2, EIO);
    platform.duringWrite = nullptr;
    EXPECT_FALSE(map_.optSectionRemove());
  }
  EXPECT_THAT(log_.take(), ElementsAre(kReleaseFailed()));
  EXPECT_TRUE(map_.unlock());
}

// The platform's strings end at the first NUL, so it would remove "task".
TEST_F(SectionRemove, NeverTakesAnotherSectionForOneWithANulByte) {
  EXPECT_FALSE(map_.optSectionLoad(path_, std::string("task\0x", 6), -1));
  EXPECT_FALSE(map_.optSectionRemove());
  EXPECT_THAT(platform.removeCalls, IsEmpty());
  EXPECT_THAT(
      log_.take(),
      ElementsAre(errLine("option_map", 719, "rm [" + path_ + "][task]: [0xF203 option_map:719]")));
}

TEST_F(SectionCreateId, ReservesTheSectionAndBinds) {
  map_.optSet("a", 1);
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", 5));
  EXPECT_EQ("[task5]\n", readFile(path_));
  expectBound("task5", 5);
  EXPECT_FALSE(map_.optIsLoaded());
  EXPECT_EQ(R"({"a":1})", map_.optToJsonString());
  EXPECT_TRUE(isReleased());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateId, RefusesIdsBelowOneSilently) {
  for (const int id : {0, -1, -7}) {
    EXPECT_FALSE(map_.optSectionCreate(path_, "task", id));
  }
  EXPECT_NE(0, ::access(path_.c_str(), F_OK));
  EXPECT_THAT(platform.enumPaths, IsEmpty());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateId, RefusesAnEmptyPathOrPrefixSilently) {
  EXPECT_FALSE(map_.optSectionCreate("", "task", 5));
  EXPECT_FALSE(map_.optSectionCreate(path_, "", 5));
  EXPECT_THAT(platform.enumPaths, IsEmpty());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateId, RefusesALoadedMapSilently) {
  ASSERT_TRUE(map_.optSectionLoad(writeFile(dir_ / "other", "[task1]\n"), "task", 1));
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", 5));
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", true));
  expectBound("task1", 1);
  EXPECT_THAT(platform.enumPaths, IsEmpty());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateId, ATakenIdLeavesTheBindingAlone) {
  bind();
  platform.sections = {"task5"};
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", 5));
  expectBound("task12", 12);
  EXPECT_TRUE(isReleased());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateId, ABoundMapCanBeBoundAnew) {
  bind();
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", 5));
  expectBound("task5", 5);
}

TEST_F(SectionCreateId, FailsWithoutTheLock) {
  const Fault fault("flock", 1, EIO);
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", 5));
  EXPECT_THAT(log_.take(), ElementsAre(kLockFailed()));
  EXPECT_THAT(platform.enumPaths, IsEmpty());
  expectBound("", -1);
}

TEST_F(SectionCreateId, IsNotBoundWhenUnlockingFails) {
  {
    const Fault fault("flock", 2, EIO);
    EXPECT_FALSE(map_.optSectionCreate(path_, "task", 5));
  }
  EXPECT_THAT(log_.take(), ElementsAre(kReleaseFailed()));
  EXPECT_EQ("[task5]\n", readFile(path_)) << "the change stays on disk";
  expectBound("", -1);
  EXPECT_TRUE(map_.unlock());
}

// With the path of one section and the name of the other, the next save would replace a third one.
TEST_F(SectionCreateId, IsBoundWhollyOrAsBeforeWhenMemoryRunsOut) {
  const std::string before = dir_ / "a file whose path is too long to be kept without memory";
  const std::string after = dir_ / "another file whose path is even longer, without memory";
  const std::string prefix = "a prefix too long to be kept without memory";
  int thrown = 0;
  map_ = OptionMap(); // without a token, so that only the section allocates
  forEachAllocation(
      [&] {
        (void)map_.optSectionLoad(before, prefix, 1);
        (void)map_.optSectionCreate(after, prefix, 22);
      },
      [&](bool threw) {
        thrown += threw ? 1 : 0;
        platform.setCalls.clear();
        platform.sections.clear();
        const bool bound = map_.optSectionSave();
        log_.take();
        if (bound) {
          ASSERT_THAT(platform.setCalls, SizeIs(1));
          const bool isNew = platform.setCalls[0].path == after;
          EXPECT_EQ(isNew ? after : before, platform.setCalls[0].path);
          EXPECT_EQ(prefix + (isNew ? "22" : "1"), platform.setCalls[0].name);
          EXPECT_EQ(isNew ? 22 : 1, map_.optSectionGetId());
          EXPECT_TRUE(!threw || !isNew);
        }
      });
  EXPECT_GT(thrown, 3);
}

TEST_F(SectionCreateId, UnlocksWhenTheHeaderCannotBeWritten) {
  path_ = "/dev/full";
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", 5));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 740, "fprintf: No space left on device")));
  EXPECT_TRUE(isReleased());
  expectBound("", -1);
}

TEST_F(SectionCreateNew, TakesANewId) {
  platform.sections = {"task7"};
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", true));
  EXPECT_EQ("[task8]\n", readFile(path_));
  expectBound("task8", 8);
  EXPECT_FALSE(map_.optIsLoaded());
  EXPECT_TRUE(isReleased());
}

TEST_F(SectionCreateNew, TakesTheBareNameWithoutId) {
  EXPECT_TRUE(map_.optSectionCreate(path_, "nightly", false));
  EXPECT_EQ("[nightly]\n", readFile(path_));
  expectBound("nightly", -1);
  EXPECT_TRUE(isReleased());
}

TEST_F(SectionCreateNew, IntAndBoolAreTwoCalls) {
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", 0)) << "an id";
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", false)) << "no id";
  expectBound("task", -1);
  platform.sections = {"task", "task3"};
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", true)) << "a new id";
  expectBound("task4", 4);
  EXPECT_TRUE(map_.optSectionCreate(path_, "task", 1)) << "this id";
  expectBound("task1", 1);
}

TEST_F(SectionCreateNew, ATakenNameIsRefusedSilently) {
  platform.sections = {"nightly"};
  EXPECT_FALSE(map_.optSectionCreate(path_, "nightly", false));
  expectBound("", -1);
  EXPECT_TRUE(isReleased());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateNew, RefusesAnEmptyPathOrPrefixSilently) {
  for (const bool withId : {true, false}) {
    EXPECT_FALSE(map_.optSectionCreate("", "task", withId));
    EXPECT_FALSE(map_.optSectionCreate(path_, "", withId));
  }
  EXPECT_THAT(platform.enumPaths, IsEmpty());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionCreateNew, UnlocksWhenTheSectionsCannotBeListed) {
  platform.enumResult = -1;
  platform.enumCode = 0x1234;
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", true));
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", false));
  EXPECT_THAT(
      log_.take(),
      ElementsAre(
          errLine("option_map", 771, "KLIBCFileEnumSection[" + path_ + "]: " + kTriple),
          errLine("option_map", 899, "KLIBCFileEnumSection[" + path_ + "] failed: " + kTriple)));
  expectBound("", -1);
  EXPECT_TRUE(isReleased());
}

TEST_F(SectionCreateNew, FailsWithoutTheLock) {
  const Fault fault("flock", 1, EIO);
  EXPECT_FALSE(map_.optSectionCreate(path_, "task", true));
  EXPECT_THAT(log_.take(), ElementsAre(kLockFailed()));
  EXPECT_THAT(platform.enumPaths, IsEmpty());
}

TEST_F(SectionCreateNew, IsNotBoundWhenUnlockingFails) {
  {
    const Fault fault("flock", 2, EIO);
    EXPECT_FALSE(map_.optSectionCreate(path_, "task", true));
  }
  EXPECT_THAT(log_.take(), ElementsAre(kReleaseFailed()));
  EXPECT_EQ("[task1]\n", readFile(path_));
  expectBound("", -1);
  EXPECT_TRUE(map_.unlock());
}
