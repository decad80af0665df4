// What an update changes, what it leaves, and whom it excludes.

#include "kovabackup/service/section_update.h"

#include "tests/service/lock_support.h"
#include "tests/support/census.h"
#include "tests/support/log_capture.h"

#include <filesystem>
#include <sys/file.h>
#include <sys/stat.h>
#include <thread>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;
using Change = std::function<bool(OptionMap &)>;

const std::string kText = "# top\n[task1]\n# the name\nname=\"a\"\nruns=1\n[task2]\nruns=7\n";

class SectionUpdate : public testing::Test {
protected:
  SectionUpdate() { writeFile(path_, kText); }

  Update update(const Change &change, Millis limit = Millis(-1)) {
    error_ = Error();
    return updateSection(path_, "task", 1, "run", change, limit, &error_);
  }
  void expectUnchanged() const { EXPECT_EQ(kText, readFile(path_)); }

  const TestFolder folder_;
  const std::string path_ = folder_ / "task.conf";
  Error error_;
};

bool countRun(OptionMap &map) {
  return map.optSet("runs", map.optInt("runs", 0) + 1);
}

bool leaveAsItIs(OptionMap &) {
  return true;
}

} // namespace

TEST_F(SectionUpdate, SavesWhatTheFunctionChanges) {
  EXPECT_EQ(Update::Saved, update([](OptionMap &map) {
              EXPECT_EQ("a", map.optString("name", ""));
              EXPECT_TRUE(map.optIsLoaded());
              EXPECT_EQ(1, map.optSectionGetId());
              return map.optSet("name", "b") && countRun(map);
            }));
  EXPECT_EQ("# top\n[task1]\n# the name\nname=\"b\"\nruns=2\n[task2]\nruns=7\n", readFile(path_));
  expectError(error_, 0, "", "");
  EXPECT_TRUE(isFree("run"));
}

TEST_F(SectionUpdate, RemovesAndAddsOptions) {
  EXPECT_EQ(Update::Saved, update([](OptionMap &map) {
              return map.optRemove("name") && map.optSet("new", true);
            }));
  OptionMap map;
  ASSERT_TRUE(map.optSectionLoad(path_, "task", 1));
  EXPECT_EQ("{\"new\":true,\"runs\":1}", map.optToJsonString());
}

TEST_F(SectionUpdate, WithoutAnIdChangesTheSectionOfThatName) {
  EXPECT_EQ(Update::Saved, updateSection(path_, "task2", -1, "run", countRun));
  OptionMap map;
  ASSERT_TRUE(map.optSectionLoad(path_, "task", 2));
  EXPECT_EQ(8, map.optInt("runs", 0));
}

TEST_F(SectionUpdate, LeavesTheFileWhenTheFunctionDeclines) {
  EXPECT_EQ(Update::Declined, update([](OptionMap &map) { return !countRun(map); }));
  expectError(error_, 0, "", "");
  expectUnchanged();
  EXPECT_TRUE(isFree("run"));
}

TEST_F(SectionUpdate, LeavesTheFileWhenTheFunctionThrows) {
  EXPECT_THROW((void)update([](OptionMap &map) -> bool {
                 (void)countRun(map);
                 throw std::runtime_error("no");
               }),
               std::runtime_error);
  expectUnchanged();
  EXPECT_TRUE(isFree("run"));
  EXPECT_THROW((void)update(Change()), std::bad_function_call);
  EXPECT_TRUE(isFree("run"));
}

TEST_F(SectionUpdate, ReportsAMissingSection) {
  for (const auto &[prefix, id] : {std::pair("task", 3), {"task", -1}, {"Task", 1}, {"tas", 1}}) {
    error_ = Error();
    EXPECT_EQ(Update::NoSection,
              updateSection(path_, prefix, id, "run", leaveAsItIs, Millis(-1), &error_));
    expectError(error_, ENOENT, "optSectionLoad", path_);
  }
  expectUnchanged();
}

TEST_F(SectionUpdate, ReportsAMissingFileAndMakesNone) {
  EXPECT_EQ(0, ::unlink(path_.c_str()));
  EXPECT_EQ(Update::NoSection, update(leaveAsItIs));
  expectError(error_, ENOENT, "open", path_);
  EXPECT_THAT(folder_.names(), IsEmpty());
  writeFile(path_, kText);
  EXPECT_EQ(Update::NoSection,
            updateSection(path_ + "/x", "task", 1, "run", leaveAsItIs, Millis(-1), &error_));
  expectError(error_, ENOTDIR, "open", path_ + "/x");
}

TEST_F(SectionUpdate, ReportsWhatCannotBeLoaded) {
  LogCapture log;
  EXPECT_EQ(Update::LoadFailed,
            updateSection("", "task", 1, "run", leaveAsItIs, Millis(-1), &error_));
  expectError(error_, EINVAL, "optSectionLoad", "");
  EXPECT_EQ(Update::LoadFailed,
            updateSection(path_, "", -1, "run", leaveAsItIs, Millis(-1), &error_));
  expectError(error_, EINVAL, "optSectionLoad", path_);
  EXPECT_THAT(log.take(), ElementsAre(errLine("option_map", 625, "invalid sec [][task]"),
                                      errLine("option_map", 625, "invalid sec [" + path_ + "][]")));
  EXPECT_EQ(Update::LoadFailed,
            updateSection(folder_.path(), "task", 1, "run", leaveAsItIs, Millis(-1), &error_));
  expectError(error_, EISDIR, "read", folder_.path());
  EXPECT_THAT(log.take(), ElementsAre(errLine("option_map", 476,
                                              "getline [" + folder_.path() + "]: Is a directory")));
  EXPECT_TRUE(isFree("run"));
}

// A device may have no end. An update that read it would keep the lock for ever.
TEST_F(SectionUpdate, ReportsADevice) {
  const auto killer = ::alarm(10);
  EXPECT_EQ(Update::LoadFailed,
            updateSection("/dev/zero", "task", 1, "run", leaveAsItIs, Millis(-1), &error_));
  (void)::alarm(killer);
  expectError(error_, EINVAL, "optSectionLoad", "/dev/zero");
  EXPECT_TRUE(isFree("run"));
}

TEST_F(SectionUpdate, ReportsWhatCannotBeSaved) {
  LogCapture log;
  EXPECT_EQ(Update::SaveFailed,
            update([](OptionMap &map) { return map.optLoadJsonString("{\"real\":1.5}"); }));
  expectError(error_, EIO, "optSectionExport", path_);
  EXPECT_THAT(log.take(), ElementsAre(errLine("option_map", 687, "unknown type key")));
  expectUnchanged();
  EXPECT_TRUE(isFree("run"));
}

// The section vanishes while the function runs, by a writer that takes no lock.
TEST_F(SectionUpdate, DoesNotMakeASectionThatVanishes) {
  LogCapture log;
  EXPECT_EQ(Update::SaveFailed, update([&](OptionMap &) {
              writeFile(path_, "[other]\n");
              return true;
            }));
  EXPECT_EQ("optSectionExport", error_.step);
  EXPECT_EQ(1U, log.take().size());
  EXPECT_EQ("[other]\n", readFile(path_));
}

// Loading skips such a line, and saving replaces all options. The header says so.
TEST_F(SectionUpdate, LosesLinesThatAreNotJson) {
  writeFile(path_, "[task1]\nname=a\nruns=1\n");
  LogCapture log;
  EXPECT_EQ(Update::Saved, update(countRun));
  EXPECT_EQ("[task1]\nruns=2\n", readFile(path_));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 508,
                                  "json load failed key(name) value(a) out(null) form " + path_)));
}

TEST_F(SectionUpdate, SavesWhereItLoadedWhateverTheFunctionBinds) {
  EXPECT_EQ(Update::Saved, update([&](OptionMap &map) {
              return map.optSectionLoad(path_, "task", 2) && countRun(map);
            }));
  EXPECT_EQ("# top\n[task1]\n# the name\nruns=8\n[task2]\nruns=7\n", readFile(path_));
}

TEST_F(SectionUpdate, NeedsNoPlaceForAnError) {
  EXPECT_EQ(Update::NoSection, updateSection(path_, "task", 9, "run", leaveAsItIs));
  EXPECT_EQ(Update::LockFailed, updateSection(path_, "task", 1, "", leaveAsItIs));
}

TEST_F(SectionUpdate, RefusesTokensThatLeadElsewhere) {
  for (const std::string &token : {std::string(), std::string(".."), std::string("../x"),
                                   std::string("a/"), std::string("a\0b", 3)}) {
    EXPECT_EQ(Update::LockFailed,
              updateSection(path_, "task", 1, token, countRun, Millis(-1), &error_));
    expectError(error_, EINVAL, "open", token);
  }
  expectUnchanged();
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

TEST_F(SectionUpdate, ReportsALockThatCannotBeTaken) {
  ASSERT_TRUE(isFree("other"));
  fs::create_directory(kLockFile);
  EXPECT_EQ(Update::LockFailed, update(countRun));
  expectError(error_, EISDIR, "open", kLockFile);
  fs::remove(kLockFile);
  fs::create_symlink(path_, kLockFile);
  EXPECT_EQ(Update::LockFailed, update(countRun));
  expectError(error_, ELOOP, "open", kLockFile);
  expectUnchanged();
}

TEST_F(SectionUpdate, LocksTheFileOfTheToken) {
  const ScopedUmask umask(0027);
  const Census before = takeCensus();
  EXPECT_EQ(Update::Saved, update([&](OptionMap &map) {
              EXPECT_FALSE(isFree("run"));
              EXPECT_TRUE(map.lock()) << "the map has no token";
              EXPECT_TRUE(map.unlock());
              EXPECT_FALSE(isFree("run"));
              for (const auto &[name, file] : takeCensus()) {
                if (name.rfind("fd ", 0) == 0 && before.count(name) == 0) {
                  EXPECT_EQ(kLockFile, file);
                  EXPECT_EQ(FD_CLOEXEC, ::fcntl(std::stoi(name.substr(3)), F_GETFD));
                }
              }
              return true;
            }));
  EXPECT_EQ(0770, modeOf(kLockFolder));
  EXPECT_EQ(0640, modeOf(kLockFile));
  EXPECT_EQ("", readFile(kLockFile));
}

TEST_F(SectionUpdate, ExcludesMapsWithTheSameToken) {
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("run") && map.lock());
  EXPECT_EQ(Update::Locked, update(countRun, Millis(0)));
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  expectUnchanged();
  ASSERT_TRUE(map.unlock());
  pid_t writer = -1;
  EXPECT_EQ(Update::Saved, update([&](OptionMap &options) {
              writer = ::fork();
              if (writer == 0) { // has a copy of our lock, so that only LOCK_UN releases it
                OptionMap other;
                const bool loaded = other.optSectionLoad(path_, "task", 1);
                const bool fine = other.setLockToken("run") && other.lock() && loaded &&
                                  other.optSectionLoad(path_, "task", 1) &&
                                  other.optInt("runs", 0) == 2 && other.unlock();
                ::_exit(fine ? 0 : 1);
              }
              awaitWaiting(writer);
              return countRun(options);
            }));
  int status = -1;
  EXPECT_EQ(writer, ::waitpid(writer, &status, 0));
  EXPECT_EQ(0, status) << "it waits for the save and then reads it";
}

TEST_F(SectionUpdate, ExcludesRunLocksAndWaitsForThem) {
  OtherProcess other([] {
    auto *lock = new RunLock("run"); // held until the process ends
    Error error;
    return lock->take(error);
  });
  ASSERT_TRUE(other.begun());
  EXPECT_EQ(Update::Locked, update(countRun, Millis(0)));
  expectUnchanged();
  const pid_t self = ::getpid();
  std::thread ender([&] {
    while (!waitsForFlock(self)) {
      ::sched_yield();
    }
    other.kill();
  });
  EXPECT_EQ(Update::Saved, update(countRun));
  ender.join();
}

TEST_F(SectionUpdate, ChangesWhatTheHolderSavedWhileItWaited) {
  RunLock lock("run");
  ASSERT_TRUE(lock.take(error_));
  const pid_t self = ::getpid();
  std::thread holder([&] {
    while (!waitsForFlock(self)) {
      ::sched_yield();
    }
    writeFile(path_, "[task1]\nruns=5\nmore=true\n");
    lock.release();
  });
  EXPECT_EQ(Update::Saved, update(countRun));
  holder.join();
  EXPECT_EQ("[task1]\nmore=true\nruns=6\n", readFile(path_));
}

TEST_F(SectionUpdate, GivesUpAfterItsLimit) {
  RunLock lock("run");
  ASSERT_TRUE(lock.take(error_));
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(Update::Locked, update(countRun, Millis(25)));
  EXPECT_LE(Millis(25), std::chrono::steady_clock::now() - begin);
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
}

// A child that is forked meanwhile has a copy of the descriptor and must not keep the lock.
TEST_F(SectionUpdate, ReleasesTheLockForAChildToo) {
  std::unique_ptr<OtherProcess> child;
  EXPECT_EQ(Update::Saved, update([&](OptionMap &map) {
              child = std::make_unique<OtherProcess>([] { return true; });
              return countRun(map);
            }));
  EXPECT_TRUE(isFree("run"));
}

TEST_F(SectionUpdate, WithOtherTokensMayBeNested) {
  EXPECT_EQ(Update::Saved, update([&](OptionMap &map) {
              const std::string other = writeFile(folder_ / "other", "[task1]\nruns=3\n");
              EXPECT_EQ(Update::Saved, updateSection(other, "task", 1, "other", countRun));
              return countRun(map);
            }));
}
