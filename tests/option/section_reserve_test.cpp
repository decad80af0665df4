// Reserving sections: which ID is next, which ones are taken, and the content of the file
// afterwards.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <fstream>
#include <functional>
#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class SectionReserve : public PlatformTest {
protected:
  int nextId() { return OptionMap::optSectionGetUniqueId(path_, "task"); }
  bool createId(int id) { return OptionMap::optSectionCreateUniqueId(path_, "task", id); }
  bool createName(const std::string &name) {
    return OptionMap::optSectionCreateUniqueName(path_, name);
  }

  bool exists() const { return ::access(path_.c_str(), F_OK) == 0; }

  TestFolder dir_;
  std::string path_ = dir_ / "conf";
  LogCapture log_;
};
class UniqueId : public SectionReserve {};
class CreateUniqueId : public SectionReserve {};
class CreateUniqueName : public SectionReserve {};
class SectionHeader : public SectionReserve {};

LogLine writeFailed(const std::string &why) {
  return errLine("option_map", 740, "fprintf: " + why);
}

// Limits the size of files written by this process; the kernel cuts longer writes off.
class FileSizeLimit {
public:
  explicit FileSizeLimit(rlim_t size) {
    ::getrlimit(RLIMIT_FSIZE, &before_);
    const rlimit limit = {size, before_.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &limit);
    struct sigaction ignored {};
    ignored.sa_handler = SIG_IGN;
    ::sigaction(SIGXFSZ, &ignored, &action_);
  }
  ~FileSizeLimit() {
    ::sigaction(SIGXFSZ, &action_, nullptr);
    ::setrlimit(RLIMIT_FSIZE, &before_);
  }

private:
  rlimit before_{};
  struct sigaction action_ {};
};

std::function<void()> beforeFlushing;

} // namespace

extern "C" int fflush(FILE *file) {
  static auto *const real = realFunction<int(FILE *)>("fflush");
  if (beforeFlushing) {
    std::exchange(beforeFlushing, nullptr)();
  }
  return failsNow("fflush") ? EOF : real(file);
}

TEST_F(UniqueId, OfAMissingFileIsOneAndMakesTheFile) {
  platform.code = 0x4321;
  platform.enumResult = -1;
  platform.enumCode = 0x0900;
  EXPECT_EQ(1, nextId());
  EXPECT_EQ("[task1]\n", readFile(path_));
  EXPECT_EQ(0x4321, platform.code);
  EXPECT_THAT(platform.errSets, ElementsAre(ErrSet{0x4321, "option_map", 767}));
  EXPECT_THAT(platform.capacities, ElementsAre(1024));
  EXPECT_THAT(platform.enumPaths, ElementsAre(path_));
}

TEST_F(UniqueId, IsTheHighestPlusOne) {
  platform.sections = {"task1", "task5", "job9", "task3"};
  EXPECT_EQ(6, nextId());
  EXPECT_EQ("[task6]\n", readFile(path_));
}

TEST_F(UniqueId, TakesEverySectionThatBeginsWithThePrefix) {
  platform.sections = {"task1", "task12abc"};
  EXPECT_EQ(13, nextId());
  platform.sections = {"task", "taskx", "tasks3", "task-9", "xtask8"};
  EXPECT_EQ(1, nextId());
  platform.sections = {};
  EXPECT_EQ(1, nextId());
}

TEST_F(UniqueId, SkipsANameThatIsNotGiven) {
  platform.sections = {"task4", std::nullopt};
  EXPECT_EQ(5, nextId());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(UniqueId, ThereIsNoneAfterTheLargest) {
  platform.sections = {"task2147483646"};
  EXPECT_EQ(INT_MAX, nextId());
  EXPECT_EQ("[task2147483647]\n", readFile(path_));
  platform.sections = {"task2147483647"};
  EXPECT_EQ(-1, nextId());
  EXPECT_EQ("[task2147483647]\n", readFile(path_));
  EXPECT_THAT(log_.take(), ElementsAre(writeFailed("Value too large for defined data type")));
}

TEST_F(UniqueId, FailsWithoutAList) {
  platform.listAllocFails = true;
  EXPECT_EQ(-1, nextId());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 761, "KLIBCSzListAlloc: " + kTriple)));
  EXPECT_FALSE(exists());
}

TEST_F(UniqueId, FailsWhenTheFileCannotBeListed) {
  platform.enumResult = -1;
  platform.enumCode = 0x1234;
  EXPECT_EQ(-1, nextId());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 771,
                                               "KLIBCFileEnumSection[" + path_ + "]: " + kTriple)));
  EXPECT_FALSE(exists());
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(UniqueId, FailsWhenTheFileCannotBeOpened) {
  path_ = dir_ / "absent/conf";
  EXPECT_EQ(-1, nextId());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 735, "fopen: No such file or directory")));
}

// The fixture counts the lists.
TEST_F(UniqueId, FreesItsListWhenMemoryRunsOut) {
  platform.sections = {"task1"};
  path_ = "/nowhere/a path too long to be kept without memory of its own";
  forEachAllocation(
      [&] { EXPECT_EQ(-1, OptionMap::optSectionGetUniqueId(path_, "a prefix that is long too")); },
      [&](bool) {
        EXPECT_EQ(0, platform.alive);
        log_.take();
      });
}

TEST_F(CreateUniqueId, ReservesAFreeId) {
  platform.sections = {"task1"};
  EXPECT_TRUE(createId(5));
  EXPECT_EQ("[task5]\n", readFile(path_));
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(CreateUniqueId, RefusesATakenIdSilently) {
  platform.sections = {"task1", "task5"};
  EXPECT_FALSE(createId(5));
  platform.sections = {"task5abc"};
  EXPECT_FALSE(createId(5)) << "counts as 5";
  EXPECT_FALSE(exists());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(CreateUniqueId, TakesAnyInt) {
  EXPECT_TRUE(createId(0));
  EXPECT_TRUE(createId(-3));
  EXPECT_EQ("[task0]\n[task-3]\n", readFile(path_));
}

TEST_F(CreateUniqueId, OfAMissingFileMakesIt) {
  platform.code = 0x4321;
  platform.enumResult = -1;
  platform.enumCode = 0x0900;
  EXPECT_TRUE(createId(5));
  EXPECT_EQ("[task5]\n", readFile(path_));
  EXPECT_EQ(0x4321, platform.code);
  EXPECT_THAT(platform.errSets, ElementsAre(ErrSet{0x4321, "option_map", 856}));
}

TEST_F(CreateUniqueId, FailsAsTheListOfIdsFails) {
  platform.enumResult = -1;
  platform.enumCode = 0x1234;
  EXPECT_FALSE(createId(5));
  platform.listAllocFails = true;
  EXPECT_FALSE(createId(5));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 860,
                                               "KLIBCFileEnumSection[" + path_ + "]: " + kTriple),
                                       errLine("option_map", 848, "KLIBCSzListAlloc: " + kTriple)));
  EXPECT_FALSE(exists());
}

TEST_F(CreateUniqueName, ReservesAFreeNameOnce) {
  EXPECT_TRUE(createName("nightly"));
  EXPECT_EQ("[nightly]\n", readFile(path_));
  platform.sections = {"nightly"};
  EXPECT_FALSE(createName("nightly"));
  EXPECT_EQ("[nightly]\n", readFile(path_));
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(CreateUniqueName, ComparesExactly) {
  platform.sections = {"nightly1", "Nightly", "night"};
  EXPECT_TRUE(createName("nightly"));
  EXPECT_EQ("[nightly]\n", readFile(path_));
}

TEST_F(CreateUniqueName, OfAMissingFileMakesIt) {
  platform.code = 0x4321;
  platform.enumResult = -1;
  platform.enumCode = 0x0900;
  EXPECT_TRUE(createName("nightly"));
  EXPECT_EQ("[nightly]\n", readFile(path_));
  EXPECT_THAT(platform.errSets, ElementsAre(ErrSet{0x4321, "option_map", 895}));
}

TEST_F(CreateUniqueName, FailsAsTheListOfNamesFails) {
  platform.enumResult = -1;
  platform.enumCode = 0x1234;
  EXPECT_FALSE(createName("nightly"));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 899,
                                  "KLIBCFileEnumSection[" + path_ + "] failed: " + kTriple)));
  EXPECT_FALSE(exists());
}

TEST_F(SectionHeader, IsAddedAtTheEnd) {
  writeFile(dir_ / "conf", "# text\n[a]\nx=1\n");
  EXPECT_TRUE(createName("b"));
  EXPECT_EQ("# text\n[a]\nx=1\n[b]\n", readFile(path_));
}

// Appended to the last line, the header would spoil the last option and not be found.
TEST_F(SectionHeader, StandsAloneAfterALastLineWithoutEnd) {
  writeFile(dir_ / "conf", "[a]\nx=1");
  EXPECT_TRUE(createName("b"));
  EXPECT_EQ("[a]\nx=1\n[b]\n", readFile(path_));
}

TEST_F(SectionHeader, NeedsNoLineEndAfterOne) {
  writeFile(dir_ / "conf", "[a]\r\n\n");
  EXPECT_TRUE(createName("b"));
  EXPECT_EQ("[a]\r\n\n[b]\n", readFile(path_));
  writeFile(dir_ / "conf", "");
  EXPECT_TRUE(createName("b"));
  EXPECT_EQ("[b]\n", readFile(path_));
}

TEST_F(SectionHeader, GoesThroughALink) {
  writeFile(dir_ / "target", "[a]\n");
  ASSERT_EQ(0, ::symlink((dir_ / "target").c_str(), path_.c_str()));
  EXPECT_TRUE(createName("b"));
  EXPECT_EQ("[a]\n[b]\n", readFile(dir_ / "target"));
}

TEST_F(SectionHeader, RefusesALineEndBeforeTheFileIsTouched) {
  for (const std::string &name :
       {std::string("a]\nx=1\n[b"), std::string("a\n"), std::string("\na"), std::string("a\rb"),
        std::string("a\0b", 3)}) {
    errno = 0;
    EXPECT_FALSE(createName(name));
    EXPECT_EQ(EINVAL, errno);
    EXPECT_THAT(log_.take(), ElementsAre(writeFailed("Invalid argument")));
    EXPECT_FALSE(exists());
  }
  EXPECT_EQ(-1, OptionMap::optSectionGetUniqueId(path_, "a\n"));
  EXPECT_FALSE(OptionMap::optSectionCreateUniqueId(path_, "a\n", 1));
  EXPECT_THAT(log_.take(),
              ElementsAre(writeFailed("Invalid argument"), writeFailed("Invalid argument")));
  EXPECT_FALSE(exists());
}

TEST_F(SectionHeader, OfADirectoryCannotBeOpened) {
  path_ = "/tmp";
  EXPECT_FALSE(createName("b"));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 735, "fopen: Is a directory")));
}

TEST_F(SectionHeader, AFullDiskIsAFailedWrite) {
  path_ = "/dev/full";
  EXPECT_FALSE(createName("b"));
  EXPECT_THAT(log_.take(), ElementsAre(writeFailed("No space left on device")));
}

TEST_F(SectionHeader, HalfAHeaderIsTakenBack) {
  writeFile(dir_ / "conf", "[a]\nx=1");
  {
    const FileSizeLimit limit(10);
    EXPECT_FALSE(createName("nightly"));
  }
  EXPECT_EQ("[a]\nx=1", readFile(path_));
  EXPECT_THAT(log_.take(), ElementsAre(writeFailed("File too large")));
}

TEST_F(SectionHeader, IsNotTakenBackTogetherWithAnothersText) {
  writeFile(dir_ / "conf", "[a]\nx=1\n");
  const std::string others = "[another]\ny=\"" + std::string(100, 'y') + "\"\n";
  beforeFlushing = [&] { std::ofstream(path_, std::ios::app) << others; };
  const Fault fault("fflush", 1, EIO);
  EXPECT_FALSE(createName("b"));
  EXPECT_EQ("[a]\nx=1\n" + others, readFile(path_).substr(0, 8 + others.size()));
  EXPECT_THAT(log_.take(), ElementsAre(writeFailed("Input/output error")));
}

TEST_F(SectionHeader, EveryFailingCallLeavesTheFileAsItWas) {
  for (const char *call : {"fopen", "fseeko", "ftello", "fgetc", "fprintf", "fflush", "fclose"}) {
    forEachFailure(call, EIO, [&](Fault &fault) {
      writeFile(dir_ / "conf", "[a]\nx=1");
      const bool created = createName("b");
      EXPECT_EQ(!fault.fired(), created) << call;
      const auto lines = log_.take();
      if (created) {
        EXPECT_EQ("[a]\nx=1\n[b]\n", readFile(path_));
        EXPECT_THAT(lines, IsEmpty());
      } else {
        EXPECT_EQ("[a]\nx=1", readFile(path_)) << call;
        EXPECT_THAT(lines, ElementsAre(std::string(call) == "fopen"
                                           ? errLine("option_map", 735, "fopen: Input/output error")
                                           : writeFailed("Input/output error")));
      }
    });
  }
}
