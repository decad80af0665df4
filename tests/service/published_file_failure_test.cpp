// Each step of publishing a file fails, the disk is full, memory runs out, the process is killed.

#include "tests/service/published_file_support.h"

#include "tests/support/alloc_failure.h"
#include "tests/support/interpose.h"
#include "tests/support/kill_at_stop.h"

#include <cstdio>
#include <fcntl.h>
#include <map>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

using namespace KovaTest;
using testing::AnyOf;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

struct statvfs *reported = nullptr; // what fstatvfs reports instead of the truth

} // namespace

extern "C" {
KOVA_INTERPOSE_NOTHROW(int, fstatat, -1, (int dir, const char *path, struct stat *out, int flags),
                       (dir, path, out, flags))

int fstatvfs(int fd, struct statvfs *out) noexcept {
  static auto *const real = realFunction<int(int, struct statvfs *)>("fstatvfs");
  if (failsNow("fstatvfs")) {
    return -1;
  }
  if (reported != nullptr) {
    *out = *reported;
    return 0;
  }
  return real(fd, out);
}
}

namespace {

// What one failing call of a function does to a file that replaces another.
struct Case {
  const char *function;
  const char *step;    // "" when the failure does no harm
  bool ofFolder;       // whether the error has the path of the folder
  bool creates = true; // whether create succeeds
};

// Creates and publishes. Returns: the error, if there was one.
Error publishOnce(const std::string &target, const std::string &content, bool &created) {
  Error error;
  PublishedFile file(target);
  created = file.create(error, content.size());
  if (created) {
    writeTo(file.fd(), content);
    (void)file.publish(error);
  }
  return error;
}

class PublishedFileFailure : public PublishedFileTest {
protected:
  void expectFailure(const Case &c, Files kind) {
    const Fault noUnnamed = files(kind);
    forEachFailure(c.function, EIO, [&](Fault &fault) {
      writeFile(target_, "old");
      bool created = false;
      const Error error = publishOnce(target_, "new", created);
      if (!fault.fired() || *c.step == '\0') {
        expectError(error, 0, "", "");
        EXPECT_EQ("new", readFile(target_));
        return;
      }
      EXPECT_EQ(c.creates, created);
      expectError(error, EIO, c.step, c.ofFolder ? folder_.path() : target_);
      EXPECT_EQ("old", readFile(target_));
      EXPECT_THAT(folder_.names(), ElementsAre("target"));
    });
  }
};

} // namespace

TEST_F(PublishedFileFailure, LeavesTheTargetAsItWas) {
  for (const Case &c : std::initializer_list<Case>{{"open", "open", true, false},
                                                   {"fstatvfs", "fstatvfs", true, false},
                                                   {"fchmod", "fchmod", false},
                                                   {"renameat", "renameat", false}}) {
    SCOPED_TRACE(c.function);
    expectFailure(c, Files::Unnamed);
    expectFailure(c, Files::Named);
  }
}

TEST_F(PublishedFileFailure, OfStepsThatOneKindOfFileHas) {
  expectFailure({"access", "", false}, Files::Unnamed); // a named file then takes its place
  expectFailure({"O_TMPFILE", "", false}, Files::Unnamed);
  expectFailure({"flock", "", false}, Files::Unnamed); // the lock protects leftovers only
  expectFailure({"flock", "", false}, Files::Named);
  expectFailure({"fstat", "", false}, Files::Named);
}

// The first failure is the examination of the target; later ones are met while leftovers are
// cleared, which then stay.
TEST_F(PublishedFileFailure, ToExamineTheTarget) {
  writeFile(target_, "old");
  const Fault fault("fstatat", 1, EIO);
  bool created = true;
  expectError(publishOnce(target_, "new", created), EIO, "fstatat", target_);
  EXPECT_FALSE(created);
  EXPECT_EQ("old", readFile(target_));
}

TEST_F(PublishedFileFailure, ToOpenAnyFile) {
  writeFile(target_, "old");
  bool created = true;
  {
    const Fault fault("openat", 1, EMFILE, true);
    expectError(publishOnce(target_, "new", created), EMFILE, "openat", folder_.path());
  }
  EXPECT_FALSE(created);
  EXPECT_EQ("old", readFile(target_));
  EXPECT_THAT(folder_.names(), ElementsAre("target"));
}

TEST_F(PublishedFileFailure, ToLinkMattersWhenItLasts) {
  int failed = 0;
  forEachFailure("linkat", EPERM, [&](Fault &fault) {
    writeFile(target_, "old");
    bool created = false;
    const Error error = publishOnce(target_, "new", created);
    EXPECT_TRUE(created);
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
    if (error.code != 0) {
      EXPECT_TRUE(fault.fired());
      expectError(error, EPERM, "linkat", target_);
    }
    EXPECT_EQ(error.code == 0 ? "new" : "old", readFile(target_));
    failed += error.code == 0 ? 0 : 1;
  });
  EXPECT_EQ(2, failed) << "from the first call on, and from the second on";
}

TEST_F(PublishedFileFailure, ToSyncLosesTheFileOrOnlyItsCertainty) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault noUnnamed = files(kind);
    int nth = 0;
    forEachFailure("fsync", EIO, [&](Fault &fault) {
      writeFile(target_, "old");
      bool created = false;
      const Error error = publishOnce(target_, "new", created);
      EXPECT_TRUE(created);
      EXPECT_THAT(folder_.names(), ElementsAre("target"));
      nth = nth % 3 + 1;
      if (nth == 1) {
        expectError(error, EIO, "fsync", target_);
        EXPECT_EQ(1, fault.calls()) << "never repeated";
      } else if (nth == 2) {
        expectError(error, EIO, "fsync", folder_.path());
      } else {
        expectError(error, 0, "", "");
      }
      EXPECT_EQ(nth == 1 ? "old" : "new", readFile(target_));
    });
  }
}

TEST_F(PublishedFileFailure, ToSyncFoldersAtAllIsNone) {
  const Fault fault("fsync", 2, EINVAL);
  bool created = false;
  expectError(publishOnce(target_, "new", created), 0, "", "");
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ("new", readFile(target_));
}

// A file system that grants no locks: leftovers stay, and nothing else is different.
TEST_F(PublishedFileFailure, ToLockIsNone) {
  const Fault noUnnamed = files(Files::Named);
  const Fault fault("flock", 1, ENOLCK, true);
  writeFile(folder_ / ".target.kova.0.tmp", "left");
  bool created = false;
  expectError(publishOnce(target_, "new", created), 0, "", "");
  EXPECT_EQ("new", readFile(target_));
  EXPECT_THAT(folder_.names(), ElementsAre(".target.kova.0.tmp", "target"));
}

TEST_F(PublishedFileFailure, OfInterruptedOpensIsNone) {
  for (const char *function : {"open", "openat"}) {
    const Fault fault(function, 1, EINTR);
    bool created = false;
    expectError(publishOnce(target_, "new", created), 0, "", "");
    EXPECT_TRUE(created);
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ("new", readFile(target_));
  }
}

TEST_F(PublishedFileFailure, WithoutRoomIsReportedAtOnce) {
  struct statvfs system = {};
  system.f_frsize = 4096;
  system.f_blocks = 1000;
  system.f_bfree = 20; // ten of them for root
  system.f_bavail = 10;
  system.f_namemax = 255;
  reported = &system;
  for (const auto &[room, fits] : std::initializer_list<std::pair<std::uint64_t, bool>>{
           {0, true}, {1, true}, {40960, true}, {40961, false}, {UINT64_MAX, false}}) {
    PublishedFile file(target_);
    EXPECT_EQ(fits, file.create(error_, room)) << room;
    EXPECT_EQ(fits, file.fd() >= 0);
  }
  expectError(error_, ENOSPC, "fstatvfs", folder_.path());
  EXPECT_THAT(folder_.names(), IsEmpty());
  system.f_bavail = 0;
  EXPECT_TRUE(PublishedFile(target_).create(error_)) << "a file that is empty";
  system.f_blocks = 0; // some file systems do not report their size
  EXPECT_TRUE(PublishedFile(target_).create(error_, UINT64_MAX));
  reported = nullptr;
}

TEST_F(PublishedFileFailure, KnowsTheLongestNameOfTheFileSystem) {
  const Fault noUnnamed = files(Files::Named);
  struct statvfs system = {};
  system.f_namemax = 20;
  reported = &system;
  PublishedFile file(folder_ / "12345678901234567890");
  EXPECT_TRUE(file.create(error_));
  EXPECT_THAT(folder_.names(), ElementsAre(".1234567.kova.0.tmp"));
  system.f_namemax = 3; // too short for any: the name is tried
  PublishedFile tiny(folder_ / "xyz");
  EXPECT_TRUE(tiny.create(error_));
  EXPECT_THAT(folder_.names(), ElementsAre(".1234567.kova.0.tmp", ".x.kova.0.tmp"));
  reported = nullptr;
}

TEST_F(PublishedFileFailure, OnAFullDiskLeavesTheTarget) {
  const std::string disk = folder_ / "disk";
  ASSERT_EQ(0, ::mkdir(disk.c_str(), 0755));
  if (::mount("tmpfs", disk.c_str(), "tmpfs", 0, "size=64k") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted here";
  }
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault noUnnamed = files(kind);
    writeFile(disk + "/target", "old");
    {
      PublishedFile file(disk + "/target");
      EXPECT_FALSE(file.create(error_, 65536));
      expectError(error_, ENOSPC, "fstatvfs", disk);
      ASSERT_TRUE(file.create(error_, 32768));
      const std::string large(100000, 'x');
      EXPECT_GT(100000, ::write(file.fd(), large.data(), large.size()));
      EXPECT_EQ(-1, ::write(file.fd(), large.data(), large.size()));
      EXPECT_EQ(ENOSPC, errno);
    }
    EXPECT_EQ("old", readFile(disk + "/target"));
    EXPECT_THAT(namesIn(disk), ElementsAre("target"));
    bool created = false;
    expectError(publishOnce(disk + "/target", std::string(50000, 'y'), created), 0, "", "");
  }
  EXPECT_EQ(0, ::umount(disk.c_str()));
}

TEST_F(PublishedFileFailure, ThrowsNothingButBadAllocWhenMemoryRunsOut) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault noUnnamed = files(kind);
    for (const std::string &name : {std::string("target"), std::string(200, 'n')}) {
      const std::string target = writeFile(folder_ / name, "old");
      bool done = false;
      forEachAllocation(
          [&] {
            Error error;
            PublishedFile file(target);
            done = file.create(error) && file.publish(error);
          },
          [&](bool threw) {
            EXPECT_EQ(!threw, done);
            EXPECT_EQ(threw ? "old" : "", readFile(target));
            EXPECT_THAT(folder_.names(), ElementsAre(name));
            done = false;
          });
      EXPECT_EQ(0, ::unlink(target.c_str()));
    }
  }
}

// Errors carry texts, so memory can run out while a failure is reported.
TEST_F(PublishedFileFailure, LeavesNothingWhenMemoryRunsOutForAnError) {
  const std::string name(200, 'n');
  const std::string target = writeFile(folder_ / name, "old");
  for (const char *function : {"fsync", "renameat", "fstatvfs"}) {
    forEachAllocation(
        [&] {
          const Fault fault(function, 1, EIO);
          Error error;
          PublishedFile file(target);
          EXPECT_FALSE(file.create(error) && file.publish(error));
        },
        [&](bool) {
          EXPECT_EQ("old", readFile(target));
          EXPECT_THAT(folder_.names(), ElementsAre(name));
        });
  }
}

TEST_F(PublishedFileFailure, ByAKillLeavesAtMostWhatTheNextOneClears) {
  const std::string why = whyNoStops();
  if (!why.empty()) {
    GTEST_SKIP() << why;
  }
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    for (const bool replaces : {false, true}) {
      const Fault noUnnamed = files(kind);
      std::map<std::string, int> found;
      int leftovers = 0;
      int nth = 1;
      for (bool killed = true; killed; ++nth) {
        (void)::unlink(target_.c_str());
        if (replaces) {
          writeFile(target_, "old");
        }
        killed = killAtStop(nth, [&] {
          bool created = false;
          EXPECT_EQ(0, publishOnce(target_, "new", created).code);
        });
        const std::string text = isThere(target_) ? readFile(target_) : "none";
        ASSERT_THAT(text, AnyOf(replaces ? "old" : "none", "new"));
        ++found[text];
        std::set<std::string> names = folder_.names();
        names.erase("target");
        ASSERT_THAT(names, AnyOf(IsEmpty(), ElementsAre(".target.kova.0.tmp")));
        leftovers += names.empty() ? 0 : 1;
        EXPECT_TRUE(PublishedFile(target_).create(error_));
        names = folder_.names();
        names.erase("target");
        ASSERT_THAT(names, IsEmpty());
      }
      std::printf("%d stops: %d left the new file, %d a leftover that was cleared\n", nth - 1,
                  found["new"], leftovers);
      EXPECT_LT(1, found["new"]);
      EXPECT_LT(found["new"], nth - 1);
      if (kind == Files::Unnamed) { // only between linkat and renameat
        EXPECT_EQ(replaces ? 2 : 0, leftovers);
      } else {
        EXPECT_LT(2, leftovers);
      }
    }
  }
}

TEST_F(PublishedFileFailure, OfAnotherProcessIsNotClearedWhileItLives) {
  const Fault noUnnamed = files(Files::Named);
  PublishedFile first(target_);
  ASSERT_TRUE(first.create(error_));
  writeTo(first.fd(), "first");
  writeFile(folder_ / ".target.kova.3.tmp", "left by a killed process");
  PublishedFile second(target_);
  ASSERT_TRUE(second.create(error_));
  EXPECT_THAT(folder_.names(), ElementsAre(".target.kova.0.tmp", ".target.kova.1.tmp"));
  ASSERT_TRUE(second.publish(error_));
  ASSERT_TRUE(first.publish(error_));
  EXPECT_EQ("first", readFile(target_));
}

// A folder that other users can write to: their links and FIFOs are neither followed nor waited
// for.
TEST_F(PublishedFileFailure, IsNotCausedByWhatOthersPlant) {
  const Fault noUnnamed = files(Files::Named);
  const std::string other = writeFile(folder_ / "other", "other");
  ASSERT_EQ(0, ::symlink(other.c_str(), (folder_ / ".target.kova.0.tmp").c_str()));
  ASSERT_EQ(0, ::mkfifo((folder_ / ".target.kova.1.tmp").c_str(), 0666));
  ASSERT_EQ(0, ::mkdir((folder_ / ".target.kova.2.tmp").c_str(), 0755));
  bool created = false;
  expectError(publishOnce(target_, "new", created), 0, "", "");
  EXPECT_EQ("new", readFile(target_));
  EXPECT_EQ("other", readFile(other));
  EXPECT_THAT(folder_.names(), ElementsAre(".target.kova.0.tmp", ".target.kova.1.tmp",
                                           ".target.kova.2.tmp", "other", "target"));
}
