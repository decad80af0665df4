// The IPC root that processes share: its directories, their modes and the lock files.

#include "kovabackup/path_util.h"

#include "base/unique_fd.h"
#include "tests/support/child_process.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using KOVA::Base::UniqueFd;
using KovaTest::errLine;
using KovaTest::Fault;
using KovaTest::isThere;
using KovaTest::LogCapture;
using KovaTest::modeOf;
using KovaTest::runInChildren;
using KovaTest::ScopedUmask;
using testing::ElementsAre;
namespace Path = KOVA::Backup::Path;

constexpr char kModule[] = "path/path_util";
constexpr char kRoot[] = "/tmp/kovabackup";
constexpr char kLockDir[] = "/tmp/kovabackup/lock";

std::string withErrno(const std::string &text, int error) {
  return text + std::strerror(error);
}

TEST(GetIpcTempPath, IsFixedAndMakesNothing) {
  EXPECT_EQ(kRoot, Path::getIpcTempPath());
  EXPECT_FALSE(isThere(kRoot));
}

TEST(CreateIpcTempPath, MakesRootAndDirectory) {
  EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", 0700));
  EXPECT_EQ(0755, modeOf(kRoot));
  EXPECT_EQ(0700, modeOf("/tmp/kovabackup/x"));
}

TEST(CreateIpcTempPath, SetsTheModesWhateverTheUmask) {
  const ScopedUmask mask(0777);
  EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", 0770));
  EXPECT_EQ(0755, modeOf(kRoot));
  EXPECT_EQ(0770, modeOf("/tmp/kovabackup/x"));
}

TEST(CreateIpcTempPath, PassesSetIdAndStickyBits) {
  for (const int mode : {01777, 02775, 04711, 07000, 0}) {
    EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", static_cast<unsigned int>(mode)));
    EXPECT_EQ(mode, modeOf("/tmp/kovabackup/x"));
  }
}

TEST(CreateIpcTempPath, ResetsTheModesOfWhatIsThere) {
  ASSERT_EQ(0, ::mkdir(kRoot, 0700));
  ASSERT_EQ(0, ::chmod(kRoot, 01777));
  ASSERT_EQ(0, ::mkdir("/tmp/kovabackup/x", 0755));
  EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", 0700));
  EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", 0700));
  EXPECT_EQ(0755, modeOf(kRoot));
  EXPECT_EQ(0700, modeOf("/tmp/kovabackup/x"));
}

TEST(CreateIpcTempPath, RefusesANameThatIsNoComponent) {
  for (const char *name : {"", "a/b", "/a", "a/", "/"}) {
    LogCapture log;
    EXPECT_EQ("", Path::createIpcTempPath(name, 0700));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, 387, std::string("bad ") + name + " name.")));
  }
  EXPECT_FALSE(isThere(kRoot));
}

TEST(CreateIpcTempPath, SetsTheModeOfTheRootForALoneDot) {
  EXPECT_EQ(kRoot, Path::createIpcTempPath(".", 0700));
  EXPECT_EQ(0700, modeOf(kRoot));
}

TEST(CreateIpcTempPath, TakesAFileInTheDirectorysPlaceForTheDirectory) {
  ASSERT_EQ(0, ::mkdir(kRoot, 0755));
  std::ofstream("/tmp/kovabackup/x") << "text";
  EXPECT_EQ("/tmp/kovabackup/x", Path::createIpcTempPath("x", 0600));
  EXPECT_EQ(0600, modeOf("/tmp/kovabackup/x"));
}

TEST(CreateIpcTempPath, MayBeRacedBySeveralProcesses) {
  runInChildren(8, [](int) {
    bool made = true;
    for (int round = 0; round < 200; ++round) {
      const std::string name = "x" + std::to_string(round);
      made = made && Path::createIpcTempPath(name, 0700) == std::string(kRoot) + "/" + name;
    }
    return made;
  });
  EXPECT_EQ(0755, modeOf(kRoot));
  EXPECT_EQ(0700, modeOf("/tmp/kovabackup/x199"));
}

struct Failure {
  const char *function;
  int nth;
  int number;
  const char *text;
  bool directoryStays;
};

TEST(CreateIpcTempPath, LogsTheStepThatFailsAndKeepsWhatWasMade) {
  const Failure failures[] = {
      {"mkdir", 1, 395, "mkdir /tmp/kovabackup path failed. ", false},
      {"chmod", 1, 402, "chmod /tmp/kovabackup path failed. ", false},
      {"mkdir", 2, 409, "mkdir /tmp/kovabackup/x path failed. ", false},
      {"chmod", 2, 414, "chmod /tmp/kovabackup/x path failed. ", true},
  };
  for (const Failure &one : failures) {
    SCOPED_TRACE(one.number);
    LogCapture log;
    Fault fault(one.function, one.nth, EACCES);
    EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
    EXPECT_EQ(EACCES, errno);
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, one.number, withErrno(one.text, EACCES))));
    EXPECT_EQ(one.number != 395, isThere(kRoot));
    EXPECT_EQ(one.directoryStays, isThere("/tmp/kovabackup/x"));
  }
}

TEST(CreateIpcTempPath, AcceptsNoFailureButAnExistingDirectory) {
  for (const int error : {ENOENT, ENOTDIR, EISDIR, EACCES, EPERM, EROFS, ENOSPC, EDQUOT, EMLINK,
                          ELOOP, ENAMETOOLONG, EINTR, EIO, ENOMEM, EINVAL}) {
    SCOPED_TRACE(std::strerror(error));
    LogCapture log;
    Fault fault("mkdir", 2, error);
    EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, 409,
                                    withErrno("mkdir /tmp/kovabackup/x path failed. ", error))));
  }
  for (const int error : {EEXIST, ENOENT, EPERM}) {
    SCOPED_TRACE(std::strerror(error));
    LogCapture log;
    Fault fault("chmod", 2, error);
    EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, 414,
                                    withErrno("chmod /tmp/kovabackup/x path failed. ", error))));
  }
}

// A later chmod that fails must not leave a directory with more permissions than intended.
TEST(CreateIpcTempPath, MakesBothDirectoriesWithTheirModesFromTheFirst) {
  const ScopedUmask mask(0);
  LogCapture log;
  {
    Fault fault("chmod", 1, EPERM);
    EXPECT_EQ("", Path::createIpcTempPath("x", 01730));
    EXPECT_EQ(0755, modeOf(kRoot));
  }
  Fault fault("chmod", 2, EPERM);
  EXPECT_EQ("", Path::createIpcTempPath("x", 01730));
  EXPECT_EQ(01730, modeOf("/tmp/kovabackup/x"));
}

TEST(CreateIpcTempPath, NamesTheReasonWhenTheRootIsAFile) {
  std::ofstream(kRoot) << "text";
  LogCapture log;
  EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 409,
                                  withErrno("mkdir /tmp/kovabackup/x path failed. ", ENOTDIR))));
}

TEST(CreateIpcLockFile, MakesTheFileInALockDirectory) {
  const ScopedUmask mask(0);
  const UniqueFd fd(Path::createIpcLockFile("x"));
  ASSERT_TRUE(fd);
  EXPECT_EQ(0770, modeOf(kLockDir));
  EXPECT_EQ(0666, modeOf("/tmp/kovabackup/lock/x"));
  constexpr int kLargeFile =
      0100000; // the kernel's value; libc defines O_LARGEFILE as 0 on 64-bit systems
  EXPECT_EQ(O_RDWR, ::fcntl(fd.get(), F_GETFL) & ~kLargeFile);
}

TEST(CreateIpcLockFile, LeavesTheFilesModeToTheUmask) {
  const ScopedUmask mask(027);
  const UniqueFd fd(Path::createIpcLockFile("x"));
  EXPECT_EQ(0640, modeOf("/tmp/kovabackup/lock/x"));
  EXPECT_EQ(0770, modeOf(kLockDir));
}

TEST(CreateIpcLockFile, KeepsTheContentOfAnExistingFile) {
  ASSERT_EQ(kLockDir, Path::createIpcTempPath("lock", 0770));
  std::ofstream("/tmp/kovabackup/lock/x") << "held by 17";
  const UniqueFd fd(Path::createIpcLockFile("x"));
  char text[32] = "";
  EXPECT_EQ(10, ::read(fd.get(), text, sizeof text));
  EXPECT_STREQ("held by 17", text);
}

TEST(CreateIpcLockFile, TakesNoLock) {
  const UniqueFd first(Path::createIpcLockFile("x"));
  const UniqueFd second(Path::createIpcLockFile("x"));
  EXPECT_NE(first.get(), second.get());
  EXPECT_EQ(0, ::flock(first.get(), LOCK_EX | LOCK_NB));
  EXPECT_EQ(-1, ::flock(second.get(), LOCK_EX | LOCK_NB));
  EXPECT_EQ(EWOULDBLOCK, errno);
}

TEST(CreateIpcLockFile, LeavesTheDescriptorOpenAcrossExec) {
  const UniqueFd fd(Path::createIpcLockFile("x"));
  EXPECT_EQ(0, ::fcntl(fd.get(), F_GETFD) & FD_CLOEXEC);
}

TEST(CreateIpcLockFile, DropsLeadingSlashesOfTheName) {
  const UniqueFd fd(Path::createIpcLockFile("//x"));
  EXPECT_TRUE(fd);
  EXPECT_TRUE(isThere("/tmp/kovabackup/lock/x"));
}

TEST(CreateIpcLockFile, NamesAFileInASubdirectoryThatMustExist) {
  EXPECT_EQ(-1, Path::createIpcLockFile("sub/x"));
  EXPECT_EQ(ENOENT, errno);
  ASSERT_EQ(0, ::mkdir("/tmp/kovabackup/lock/sub", 0755));
  const UniqueFd fd(Path::createIpcLockFile("sub/x"));
  EXPECT_TRUE(fd);
  EXPECT_TRUE(isThere("/tmp/kovabackup/lock/sub/x"));
}

TEST(CreateIpcLockFile, FailsSilentlyForANameThatIsTheDirectory) {
  for (const char *name : {"", "/", "."}) {
    EXPECT_EQ(-1, Path::createIpcLockFile(name)) << name;
    EXPECT_EQ(EISDIR, errno) << name;
  }
}

TEST(CreateIpcLockFile, FailsSilentlyWhenTheFileCannotBeOpened) {
  KovaTest::forEachFailure("open", EMFILE, [](Fault &fault) {
    const UniqueFd fd(Path::createIpcLockFile("x"));
    EXPECT_EQ(!fault.fired(), static_cast<bool>(fd));
    if (fault.fired()) {
      EXPECT_EQ(EMFILE, errno);
    }
  });
}

TEST(CreateIpcLockFile, FailsWithTheLineOfTheStepWhenItsDirectoryFails) {
  for (const char *function : {"mkdir", "chmod"}) {
    KovaTest::forEachFailure(function, EROFS, [](Fault &fault) {
      LogCapture log;
      const UniqueFd fd(Path::createIpcLockFile("x"));
      EXPECT_EQ(!fault.fired(), static_cast<bool>(fd));
      EXPECT_EQ(fault.fired() ? 1U : 0U, log.take().size());
    });
  }
  LogCapture log;
  Fault fault("chmod", 2, EROFS);
  EXPECT_EQ(-1, Path::createIpcLockFile("x"));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 414,
                                  withErrno("chmod /tmp/kovabackup/lock path failed. ", EROFS))));
}

} // namespace
