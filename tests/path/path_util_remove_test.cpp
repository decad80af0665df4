// removeAll: what is removed, what stays, and what is logged.

#include "kovabackup/path_util.h"

#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <climits>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <ftw.h>
#include <functional>
#include <gmock/gmock.h>
#include <linux/capability.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::removeAll;
using KovaTest::errLine;
using KovaTest::Fault;
using KovaTest::LogCapture;
using testing::ElementsAre;
using testing::EndsWith;

constexpr char kModule[] = "path/path_util";
constexpr char kTree[] = "/tmp/tree";

// The last arguments of nftw below, and what it does instead of walking if a test sets it.
struct {
  int calls = 0;
  int descriptors = 0;
  int flags = 0;
  std::function<void(__nftw_func_t)> instead;
} lastWalk;

// Drops this thread's right to bypass permission bits for its lifetime.
class WithoutOverride {
public:
  WithoutOverride() {
    EXPECT_EQ(0, ::syscall(SYS_capget, &header_, before_));
    __user_cap_data_struct less[2] = {before_[0], before_[1]};
    less[0].effective &= ~((1U << CAP_DAC_OVERRIDE) | (1U << CAP_DAC_READ_SEARCH));
    EXPECT_EQ(0, ::syscall(SYS_capset, &header_, less));
  }
  ~WithoutOverride() { EXPECT_EQ(0, ::syscall(SYS_capset, &header_, before_)); }
  WithoutOverride(const WithoutOverride &) = delete;
  WithoutOverride &operator=(const WithoutOverride &) = delete;

private:
  __user_cap_header_struct header_ = {_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct before_[2] = {};
};

// Removes what a test has left, even if an assertion ends it early.
class RemoveAll : public testing::Test {
protected:
  void SetUp() override { ASSERT_TRUE(fs::create_directory(kTree)); }
  void TearDown() override { fs::remove_all(kTree); }

  static std::string path(const std::string &name) { return std::string(kTree) + "/" + name; }
  static void makeFile(const std::string &name) { std::ofstream(path(name)) << name; }
  static void makeFolder(const std::string &name) { fs::create_directories(path(name)); }
};

TEST_F(RemoveAll, TakesAwayATreeOfEveryKindOfEntry) {
  makeFolder("a/b/c");
  makeFolder("empty");
  makeFile("a/file");
  makeFile("a/b/.hidden");
  fs::create_symlink("nowhere", path("a/dangling"));
  fs::create_symlink(".", path("a/loop"));
  ASSERT_EQ(0, ::mkfifo(path("a/pipe").c_str(), 0600));
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_FALSE(fs::exists(kTree));
}

TEST_F(RemoveAll, TakesAwayASingleFile) {
  makeFile("file");
  EXPECT_TRUE(removeAll(path("file")));
  EXPECT_TRUE(fs::is_empty(kTree));
}

TEST_F(RemoveAll, TakesAMissingOrEmptyPathForDone) {
  EXPECT_TRUE(removeAll(path("missing")));
  EXPECT_TRUE(removeAll(path("missing/below")));
  EXPECT_TRUE(removeAll(""));
}

TEST_F(RemoveAll, TakesAPathThatCannotBeLookedAtForDone) {
  makeFile("file");
  EXPECT_TRUE(removeAll(path("file/below")));          // ENOTDIR
  EXPECT_TRUE(removeAll(path(std::string(300, 'n')))); // ENAMETOOLONG
  EXPECT_TRUE(fs::exists(path("file")));
}

TEST_F(RemoveAll, RemovesALinkAndLeavesItsTarget) {
  makeFolder("target");
  makeFile("target/kept");
  fs::create_symlink("target", path("link"));
  fs::create_symlink("target", path("other"));
  EXPECT_TRUE(removeAll(path("link")));
  EXPECT_TRUE(removeAll(path("other/"))); // the walk strips the slash that would follow the link
  EXPECT_FALSE(fs::is_symlink(path("link")));
  EXPECT_FALSE(fs::is_symlink(path("other")));
  EXPECT_TRUE(fs::exists(path("target/kept")));
}

TEST_F(RemoveAll, RemovesALinkInsideAndLeavesItsTarget) {
  makeFolder("target");
  makeFile("target/kept");
  makeFolder("doomed");
  fs::create_directory_symlink(path("target"), path("doomed/link"));
  EXPECT_TRUE(removeAll(path("doomed")));
  EXPECT_FALSE(fs::exists(path("doomed")));
  EXPECT_TRUE(fs::exists(path("target/kept")));
}

TEST_F(RemoveAll, IgnoresAnEntryThatVanishes) {
  makeFile("file");
  Fault fault("unlink", 1, ENOENT);
  LogCapture log;
  EXPECT_FALSE(removeAll(kTree)); // because of its folder, which is not empty
  EXPECT_TRUE(fault.fired());
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 32,
                                              std::string("rmdir /tmp/tree failed. ") +
                                                  std::strerror(ENOTEMPTY))));
  Fault gone("rmdir", 1, ENOENT);
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_TRUE(gone.fired());
}

TEST_F(RemoveAll, LogsTheFirstFailureOnlyAndGoesOn) {
  makeFolder("a");
  makeFolder("b");
  makeFile("a/file");
  makeFile("b/file");
  Fault fault("unlink", 1, EBUSY);
  LogCapture log;
  EXPECT_FALSE(removeAll(kTree));
  const bool keptA = fs::exists(path("a/file"));
  EXPECT_NE(keptA, fs::exists(path("b/file"))); // the other one was removed with its folder
  EXPECT_EQ(keptA, fs::exists(path("a")));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 39,
                                              "unlink " + path(keptA ? "a/file" : "b/file") +
                                                  " failed. " + std::strerror(EBUSY))));
}

TEST_F(RemoveAll, NamesAFolderThatCannotBeRemoved) {
  makeFolder("a");
  Fault fault("rmdir", 1, EPERM);
  LogCapture log;
  EXPECT_FALSE(removeAll(kTree));
  EXPECT_THAT(
      log.take(),
      ElementsAre(errLine(kModule, 32, "rmdir " + path("a") + " failed. " + std::strerror(EPERM))));
}

TEST_F(RemoveAll, IgnoresNoFailureButAMissingEntry) {
  makeFile("file");
  for (const int error : {EACCES, EPERM, EBUSY, EROFS, EIO, EISDIR, ENOTDIR, ELOOP, ENAMETOOLONG,
                          EINTR, ENOMEM, EEXIST, ENOTEMPTY, EINVAL}) {
    Fault fault("unlink", 1, error);
    LogCapture log;
    EXPECT_FALSE(removeAll(path("file")));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(
                    kModule, 39, "unlink " + path("file") + " failed. " + std::strerror(error))));
  }
}

TEST_F(RemoveAll, ForgetsTheFailureOfTheRunBefore) {
  makeFile("file");
  {
    Fault fault("unlink", 1, EBUSY);
    LogCapture log;
    EXPECT_FALSE(removeAll(kTree));
  }
  EXPECT_TRUE(removeAll(kTree));
}

TEST_F(RemoveAll, FailsOnceAndNeverTwiceWhicheverCallFails) {
  for (const char *function : {"unlink", "rmdir"}) {
    KovaTest::forEachFailure(function, EIO, [](Fault &fault) {
      makeFolder("a/b");
      makeFolder("c");
      makeFile("a/one");
      makeFile("a/b/two");
      makeFile("c/three");
      const int before = KovaTest::countOpenDescriptors();
      LogCapture log;
      EXPECT_EQ(!fault.fired(), removeAll(kTree));
      EXPECT_EQ(fault.fired() ? 1U : 0U, log.take().size());
      EXPECT_EQ(before, KovaTest::countOpenDescriptors());
      EXPECT_EQ(fault.fired(), fs::exists(kTree));
    });
  }
}

TEST_F(RemoveAll, WalksDepthFirstWithTwentyDirectoriesAndStaysOnTheFileSystem) {
  lastWalk = {};
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_EQ(1, lastWalk.calls);
  EXPECT_EQ(20, lastWalk.descriptors);
  EXPECT_EQ(FTW_PHYS | FTW_MOUNT | FTW_DEPTH, lastWalk.flags);
}

TEST_F(RemoveAll, ChoosesTheCallByTheTypeOfTheEntry) {
  const struct {
    int type;
    const char *function;
  } types[] = {
      {FTW_D, "rmdir"},   {FTW_DP, "rmdir"},   {FTW_DNR, "rmdir"}, {FTW_F, "unlink"},
      {FTW_SL, "unlink"}, {FTW_SLN, "unlink"}, {FTW_NS, "unlink"},
  };
  for (const auto &one : types) {
    SCOPED_TRACE(one.type);
    Fault rmdirs("rmdir", 1, EBUSY);
    Fault unlinks("unlink", 1, EBUSY);
    LogCapture log;
    lastWalk.instead = [&one](__nftw_func_t callback) {
      EXPECT_EQ(0,
                callback("/tmp/tree/x", nullptr, one.type, nullptr)); // continues after a failure
    };
    EXPECT_FALSE(removeAll(kTree));
    const bool rmdir = std::strcmp(one.function, "rmdir") == 0;
    EXPECT_EQ(rmdir ? 1 : 0, rmdirs.calls());
    EXPECT_EQ(rmdir ? 0 : 1, unlinks.calls());
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, rmdir ? 32 : 39,
                                    std::string(one.function) + " /tmp/tree/x failed. " +
                                        std::strerror(EBUSY))));
  }
  lastWalk = {};
}

TEST_F(RemoveAll, IgnoresTheOutcomeOfTheWalk) {
  Fault fault("nftw", 1, EMFILE);
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_TRUE(fault.fired());
  EXPECT_TRUE(fs::exists(kTree));
}

TEST_F(RemoveAll, RemovesAnEmptyDirectoryThatCannotBeRead) {
  makeFolder("closed");
  ASSERT_EQ(0, ::chmod(path("closed").c_str(), 0));
  const WithoutOverride user;
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_FALSE(fs::exists(kTree));
}

TEST_F(RemoveAll, NamesADirectoryThatCannotBeReadWhenItHoldsSomething) {
  makeFolder("closed");
  makeFile("closed/kept");
  makeFile("file");
  ASSERT_EQ(0, ::chmod(path("closed").c_str(), 0));
  {
    const WithoutOverride user;
    LogCapture log;
    EXPECT_FALSE(removeAll(kTree));
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 32,
                                                "rmdir " + path("closed") + " failed. " +
                                                    std::strerror(ENOTEMPTY))));
  }
  EXPECT_TRUE(fs::exists(path("closed/kept")));
  EXPECT_FALSE(fs::exists(path("file")));
}

TEST_F(RemoveAll, NamesAFileInADirectoryThatCannotBeWritten) {
  makeFolder("fixed");
  makeFile("fixed/kept");
  makeFile("file");
  ASSERT_EQ(0, ::chmod(path("fixed").c_str(), 0500));
  {
    const WithoutOverride user;
    LogCapture log;
    EXPECT_FALSE(removeAll(kTree));
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 39,
                                                "unlink " + path("fixed/kept") + " failed. " +
                                                    std::strerror(EACCES))));
  }
  EXPECT_TRUE(fs::exists(path("fixed/kept")));
  EXPECT_FALSE(fs::exists(path("file")));
}

TEST_F(RemoveAll, IsSilentWhenThePathItselfVanishes) {
  makeFile("file");
  Fault fault("unlink", 1, ENOENT);
  EXPECT_TRUE(removeAll(path("file")));
  EXPECT_TRUE(fault.fired());
}

// A chain of directories that is longer than a path may be.
void makeEndlessFolder() {
  const std::string name(200, 'd');
  int dir = ::open(kTree, O_PATH | O_CLOEXEC);
  for (int depth = 0; depth < 2 * PATH_MAX / 200; ++depth) {
    ASSERT_EQ(0, ::mkdirat(dir, name.c_str(), 0700));
    const int below = ::openat(dir, name.c_str(), O_PATH | O_CLOEXEC);
    ::close(dir);
    dir = below;
  }
  ::close(dir);
}

TEST_F(RemoveAll, FailsOnceForATreeWhosePathsAreTooLong) {
  makeFile("before");
  makeEndlessFolder();
  makeFile("after");
  LogCapture log;
  EXPECT_FALSE(removeAll(kTree));
  EXPECT_FALSE(fs::exists(path("before")));
  EXPECT_FALSE(fs::exists(path("after")));
  const std::vector<KovaTest::LogLine> lines = log.take();
  ASSERT_EQ(1U, lines.size());
  EXPECT_THAT(lines[0].text, EndsWith(std::string("failed. ") + std::strerror(ENAMETOOLONG)));
  EXPECT_GT(lines[0].text.size(), static_cast<std::size_t>(PATH_MAX));
  EXPECT_TRUE(fs::exists(kTree));
}

TEST_F(RemoveAll, LeavesAnotherFileSystemAlone) {
  makeFolder("mounted");
  makeFile("file");
  if (::mount("tmpfs", path("mounted").c_str(), "tmpfs", 0, nullptr) != 0) {
    GTEST_SKIP() << "skipped: no mount: " << std::strerror(errno);
  }
  makeFile("mounted/kept");
  LogCapture log;
  EXPECT_FALSE(removeAll(kTree));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 32,
                                              std::string("rmdir /tmp/tree failed. ") +
                                                  std::strerror(ENOTEMPTY))));
  EXPECT_TRUE(fs::exists(path("mounted/kept")));
  EXPECT_FALSE(fs::exists(path("file")));
  EXPECT_EQ(0, ::umount(path("mounted").c_str()));
}

TEST_F(RemoveAll, RemovesATreeDeeperThanTheDirectoriesItKeepsOpen) {
  std::string deep;
  for (int depth = 0; depth < 200; ++depth) {
    deep += "d/";
  }
  makeFolder(deep);
  makeFile(deep + "file");
  EXPECT_TRUE(removeAll(kTree));
  EXPECT_FALSE(fs::exists(kTree));
}

} // namespace

extern "C" int nftw(const char *dir, __nftw_func_t callback, int descriptors, int flags) {
  static auto *const real =
      KovaTest::realFunction<int(const char *, __nftw_func_t, int, int)>("nftw");
  ++lastWalk.calls;
  lastWalk.descriptors = descriptors;
  lastWalk.flags = flags;
  if (lastWalk.instead) {
    lastWalk.instead(callback);
    return 0;
  }
  return KovaTest::failsNow("nftw") ? -1 : real(dir, callback, descriptors, flags);
}
