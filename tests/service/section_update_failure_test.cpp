// Each step of an update fails, memory runs out, and the process is killed on the way.

#include "kovabackup/service/section_update.h"

#include "tests/service/lock_support.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/kill_at_stop.h"
#include "tests/support/log_capture.h"

#include <cstdio>
#include <map>
#include <sys/mount.h>
#include <sys/stat.h>

using namespace KovaTest;
using testing::AnyOf;
using testing::ElementsAre;

namespace {

using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;

const std::string kOld = "[task1]\nruns=1\n";
const std::string kNew = "[task1]\nruns=2\n";

bool countRun(OptionMap &map) {
  return map.optSet("runs", map.optInt("runs", 0) + 1);
}

class SectionUpdateFailure : public testing::Test {
protected:
  Update update() {
    error_ = Error();
    return updateSection(path_, "task", 1, "run", countRun, Millis(-1), &error_);
  }

  // Fails the function at each of its calls. Returns: how often each result came of a failure.
  std::map<Update, int> failEach(const char *function, int code) {
    std::map<Update, int> results;
    forEachFailure(function, code, [&](Fault &fault) {
      LogCapture log;
      writeFile(path_, kOld);
      const Update result = update();
      EXPECT_TRUE(fault.fired() || result == Update::Saved);
      if (result == Update::Saved) {
        EXPECT_EQ(0, error_.code);
        EXPECT_EQ(kNew, readFile(path_));
      } else {
        EXPECT_NE(0, error_.code);
        EXPECT_NE("", error_.step);
        EXPECT_THAT(readFile(path_), AnyOf(kOld, result == Update::SaveFailed ? kNew : kOld));
      }
      if (fault.fired()) {
        ++results[result];
      }
    });
    EXPECT_TRUE(isFree("run"));
    EXPECT_EQ(Update::Saved, update());
    std::set<std::string> names = folder_.names();
    EXPECT_THAT(names, ElementsAre("task.conf"));
    return results;
  }

  const TestFolder folder_;
  const std::string path_ = folder_ / "task.conf";
  Error error_;
};

} // namespace

TEST_F(SectionUpdateFailure, ToLock) {
  for (const char *function : {"mkdir", "chmod"}) {
    const std::map<Update, int> results = failEach(function, EACCES);
    EXPECT_THAT(results, ElementsAre(std::pair(Update::LockFailed, 4))) << function;
  }
  const Fault fault("lstat", 1, EACCES);
  EXPECT_EQ(Update::LockFailed, update());
  expectError(error_, EACCES, "lstat", kLockFile);
}

// The second flock releases, which closing does as well.
TEST_F(SectionUpdateFailure, ToUnlockIsNone) {
  writeFile(path_, kOld);
  {
    const Fault fault("flock", 1, ENOLCK);
    EXPECT_EQ(Update::LockFailed, update());
    expectError(error_, ENOLCK, "flock", kLockFile);
  }
  const Fault fault("flock", 2, ENOLCK, true);
  EXPECT_EQ(Update::Saved, update());
  EXPECT_TRUE(fault.fired());
}

TEST_F(SectionUpdateFailure, ToOpen) {
  const std::map<Update, int> results = failEach("open", EMFILE);
  EXPECT_EQ(1U, results.count(Update::LockFailed));
  EXPECT_EQ(1U, results.count(Update::LoadFailed));
  EXPECT_EQ(1U, results.count(Update::SaveFailed));
  EXPECT_EQ(0U, results.count(Update::NoSection));
}

TEST_F(SectionUpdateFailure, ToLoad) {
  writeFile(path_, kOld);
  {
    const Fault fault("open", 2, EMFILE, true);
    EXPECT_EQ(Update::LoadFailed, update());
    expectError(error_, EMFILE, "open", path_);
  }
  {
    const Fault fault("open", 2, EMFILE); // gone when the reason is looked for
    EXPECT_EQ(Update::LoadFailed, update());
    expectError(error_, EIO, "optSectionLoad", path_);
  }
  {
    const Fault fault("open", 2, EINTR);
    EXPECT_EQ(Update::Saved, update());
  }
}

TEST_F(SectionUpdateFailure, ToSave) {
  for (const char *function : {"openat", "renameat", "fchmod", "fsync"}) {
    SCOPED_TRACE(function);
    const std::map<Update, int> results = failEach(function, EIO);
    EXPECT_EQ(1U, results.count(Update::SaveFailed));
    EXPECT_EQ(results.count(Update::Saved) + 1, results.size());
  }
  // The platform can do without links.
  EXPECT_EQ(0U, failEach("linkat", EIO).count(Update::SaveFailed));
}

TEST_F(SectionUpdateFailure, ToSaveHasTheErrnoOfTheCall) {
  for (const auto &[function, code] : {std::pair("renameat", EXDEV), {"fsync", EDQUOT}}) {
    LogCapture log;
    writeFile(path_, kOld);
    const Fault fault(function, 1, code, true);
    EXPECT_EQ(Update::SaveFailed, update());
    expectError(error_, code, "optSectionExport", path_);
    EXPECT_EQ(kOld, readFile(path_));
    EXPECT_EQ(1U, log.take().size());
  }
}

TEST_F(SectionUpdateFailure, OnAFullDiskLeavesTheFile) {
  const std::string disk = folder_ / "disk";
  ASSERT_EQ(0, ::mkdir(disk.c_str(), 0755));
  if (::mount("tmpfs", disk.c_str(), "tmpfs", 0, "size=32k") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted here";
  }
  LogCapture log;
  writeFile(disk + "/conf", kOld);
  EXPECT_EQ(Update::SaveFailed,
            updateSection(
                disk + "/conf", "task", 1, "run",
                [](OptionMap &map) { return map.optSet("long", std::string(40000, 'x')); },
                Millis(-1), &error_));
  expectError(error_, ENOSPC, "optSectionExport", disk + "/conf");
  EXPECT_EQ(kOld, readFile(disk + "/conf"));
  EXPECT_THAT(namesIn(disk), ElementsAre("conf"));
  EXPECT_EQ(Update::Saved, updateSection(disk + "/conf", "task", 1, "run", countRun));
  EXPECT_EQ(kNew, readFile(disk + "/conf"));
  EXPECT_EQ(0, ::umount(disk.c_str()));
}

TEST_F(SectionUpdateFailure, OfMemoryThrowsNothingButBadAlloc) {
  for (const std::string &text : {kOld, std::string("[other]\n")}) {
    writeFile(path_, text);
    LogCapture log;
    int saved = 0;
    Update result = Update::Declined;
    forEachAllocation([&] { result = update(); },
                      [&](bool threw) {
                        const std::string found = readFile(path_);
                        EXPECT_THAT(found, AnyOf(text, kNew));
                        // The platform reports a lack of memory as a failure.
                        saved += !threw && result == Update::Saved ? 1 : 0;
                        EXPECT_TRUE(threw || result != Update::Saved || found == kNew);
                        writeFile(path_, text);
                        EXPECT_TRUE(isFree("run"));
                        EXPECT_THAT(folder_.names(), ElementsAre("task.conf"));
                      });
    EXPECT_EQ(text == kOld ? 1 : 0, saved);
    log.take();
  }
}

TEST_F(SectionUpdateFailure, ByAKillLeavesTheOldOrTheNewFileAndNoLock) {
  const std::string why = whyNoStops();
  if (!why.empty()) {
    GTEST_SKIP() << why;
  }
  std::map<std::string, int> found;
  int nth = 1;
  for (bool killed = true; killed; ++nth) {
    writeFile(path_, kOld);
    killed = killAtStop(nth, [&] { EXPECT_EQ(Update::Saved, update()); });
    const std::string text = readFile(path_);
    ASSERT_THAT(text, AnyOf(kOld, kNew));
    ++found[text];
    ASSERT_TRUE(isFree("run"));
    ASSERT_EQ(Update::Saved, update());
    ASSERT_THAT(folder_.names(), ElementsAre("task.conf"));
  }
  std::printf("%d stops: %d left the old file\n", nth - 1, found[kOld]);
  EXPECT_LT(0, found[kOld]);
  EXPECT_LT(1, found[kNew]);
}

// One writer is killed while its function runs; the next one is not kept waiting.
TEST_F(SectionUpdateFailure, ByAKillInTheFunctionReleasesTheLock) {
  writeFile(path_, kOld);
  Pipe inside;
  const pid_t writer = ::fork();
  if (writer == 0) {
    (void)updateSection(path_, "task", 1, "run", [&](OptionMap &) {
      (void)inside.send();
      (void)::pause();
      return true;
    });
    ::_exit(1);
  }
  ASSERT_TRUE(inside.wait());
  EXPECT_EQ(Update::Locked, updateSection(path_, "task", 1, "run", countRun, Millis(0)));
  EXPECT_EQ(0, ::kill(writer, SIGKILL));
  EXPECT_EQ(Update::Saved, update());
  EXPECT_EQ(writer, ::waitpid(writer, nullptr, 0));
  EXPECT_EQ(kNew, readFile(path_));
}
