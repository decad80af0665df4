// What a removal removes, what it refuses, and what it reports.

#include "tests/service/tree_removal_support.h"
#include "tests/support/child_process.h"
#include "tests/support/files.h"

#include <atomic>
#include <cerrno>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

// Removes path as a user who is not root.
// Returns: what was reported, one failure a line, then "gone" or "not gone".
std::string removeAsUser(const std::string &path) {
  const std::string list = "/tmp/outside/list";
  makeEntry("", list);
  EXPECT_EQ(0, ::chmod(list.c_str(), 0666));
  EXPECT_EQ(0, runInChild([&] {
              if (::setgid(12345) != 0 || ::setuid(12345) != 0) {
                return 1;
              }
              std::ofstream out(list);
              const Outcome outcome = removeTree(path);
              for (const std::string &one : outcome.failures) {
                out << one << "\n";
              }
              out << (outcome.gone ? "gone" : "not gone");
              return 0;
            }));
  return readFile(list);
}

constexpr uid_t kUser = 12345;

} // namespace

TEST_F(TreeRemovalTest, RemovesTheTreeAndEverythingInIt) {
  makeAll({"a/1", "a/2", "b/c/d/e/f/g/h/i/j/k/l/m/n/1", "b/c/2", "empty/", "z"});
  EXPECT_EQ(kGone, removeTree(kRoot));
  EXPECT_EQ(Paths{}, pathsIn(kRoot));
}

TEST_F(TreeRemovalTest, SucceedsWhenNothingIsThere) {
  EXPECT_EQ(kGone, removeTree(kRoot + "/missing"));
  EXPECT_EQ(kGone, removeTree(kRoot + "/missing/below"));
  EXPECT_EQ(kGone, removeTree(kRoot + "/missing/"));
  make("file");
  EXPECT_EQ(kGone, removeTree(kRoot + "/file/below"));
  EXPECT_EQ((Paths{kRoot, kRoot + "/file"}), pathsIn(kRoot));
}

TEST_F(TreeRemovalTest, RemovesEntriesOfEveryType) {
  make("file", "text");
  fs::create_symlink("/nowhere", kRoot + "/dangling");
  ASSERT_EQ(0, ::mkfifo((kRoot + "/fifo").c_str(), 0600));
  ASSERT_EQ(0, ::mknod((kRoot + "/socket").c_str(), S_IFSOCK | 0600, 0));
  for (const char *name : {"/file", "/dangling", "/fifo", "/socket"}) {
    EXPECT_EQ(kGone, removeTree(kRoot + name)) << "as the root of the tree";
    EXPECT_FALSE(isThere(kRoot + name));
  }
  make("file", "text");
  fs::create_symlink("/nowhere", kRoot + "/dangling");
  ASSERT_EQ(0, ::mkfifo((kRoot + "/fifo").c_str(), 0600));
  ASSERT_EQ(0, ::mknod((kRoot + "/socket").c_str(), S_IFSOCK | 0600, 0));
  EXPECT_EQ(kGone, removeTree(kRoot));
}

TEST_F(TreeRemovalTest, RemovesLinksAndNotTheirTargets) {
  makeAll({"/tmp/outside/folder/kept", "/tmp/outside/kept"});
  const Paths outside = pathsIn(kOutside);
  make("a/");
  fs::create_directory_symlink(kOutside, kRoot + "/a/folder");
  fs::create_symlink(kOutside + "/kept", kRoot + "/a/file");
  fs::create_hard_link(kOutside + "/kept", kRoot + "/a/second");
  fs::create_directory_symlink(kOutside, kRoot + "/root");
  EXPECT_EQ(kGone, removeTree(kRoot + "/root"));
  EXPECT_FALSE(isThere(kRoot + "/root"));
  EXPECT_EQ(kGone, removeTree(kRoot));
  EXPECT_EQ(outside, pathsIn(kOutside));
}

TEST_F(TreeRemovalTest, FollowsLinksOnTheWayToTheRoot) {
  makeAll({"/tmp/outside/folder/gone", "/tmp/outside/kept"});
  fs::create_directory_symlink(kOutside, kRoot + "/way");
  EXPECT_EQ(kGone, removeTree(kRoot + "/way/folder"));
  EXPECT_EQ((Paths{kOutside, kOutside + "/kept"}), pathsIn(kOutside));
}

TEST_F(TreeRemovalTest, RefusesPathsThatNameNoEntry) {
  makeAll({"a/b/1", "c"});
  const Paths before = pathsIn(kRoot);
  const ScopedWorkingDir inside(kRoot + "/a");
  const std::string paths[] = {"",    "/",    "///",        "/.",         "/..",
                               ".",   "..",   "./",         "..//",       "b/.",
                               "b/.", "b/..", kRoot + "/.", "../a/b/../", std::string("b\0c", 3)};
  for (const std::string &path : paths) {
    EXPECT_EQ((Outcome{false, {failure("openat", path, EINVAL)}}), removeTree(path));
  }
  EXPECT_EQ(before, pathsIn(kRoot));
}

TEST_F(TreeRemovalTest, RequiresAFolderWhereASlashFollows) {
  makeAll({"folder/1", "file", "/tmp/outside/kept"});
  fs::create_directory_symlink(kOutside, kRoot + "/link");
  for (const std::string &path : {kRoot + "/file", kRoot + "/link"}) {
    EXPECT_EQ((Outcome{false, {failure("openat2", path, ENOTDIR)}}), removeTree(path + "/"));
  }
  EXPECT_EQ(kGone, removeTree(kRoot + "/folder//"));
  EXPECT_EQ((Paths{kRoot, kRoot + "/file", kRoot + "/link"}), pathsIn(kRoot));
  EXPECT_TRUE(isThere(kOutside + "/kept"));
}

TEST_F(TreeRemovalTest, TakesRelativePaths) {
  makeAll({"a/b/1", "c/1", "d"});
  const ScopedWorkingDir inside(kRoot + "/a");
  EXPECT_EQ(kGone, removeTree("b"));
  EXPECT_EQ(kGone, removeTree("../c/"));
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/d"}), pathsIn(kRoot));
  EXPECT_EQ(kGone, removeTree("../../tree")) << "also the folder where the process is";
}

TEST_F(TreeRemovalTest, TakesAnyName) {
  for (const std::string &name : {std::string("..."), std::string("-rf"), std::string("new\nline"),
                                  std::string("\xff\xfe"), std::string(255, 'x')}) {
    make(name + "/" + name);
  }
  EXPECT_EQ(kGone, removeTree(kRoot));
}

TEST_F(TreeRemovalTest, RemovesMoreThanOneReadOfAFolderGives) {
  for (int i = 0; i < 3000; ++i) {
    make("many/" + std::to_string(i) + std::string(100, 'n') + (i % 3 == 0 ? "/" : ""));
  }
  EXPECT_EQ(kGone, removeTree(kRoot));
}

TEST_F(TreeRemovalTest, ReportsTheFolderThatHoldsTheRootWhenItCannotBeOpened) {
  fs::create_symlink("loop", kRoot + "/loop");
  EXPECT_EQ((Outcome{false, {failure("openat", kRoot + "/loop/", ELOOP)}}),
            removeTree(kRoot + "/loop/x"));
}

TEST_F(TreeRemovalTest, RemovesWhatIsAroundAnImmutableFile) {
  makeAll({"a/b/fixed", "a/b/1", "a/2", "c"});
  if (!setImmutable(kRoot + "/a/b/fixed", true)) {
    GTEST_SKIP() << "skipped: no immutable files here";
  }
  EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot + "/a/b/fixed", EPERM)}}),
            removeTree(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/a/b", kRoot + "/a/b/fixed"}), pathsIn(kRoot));
  ASSERT_TRUE(setImmutable(kRoot + "/a/b/fixed", false));
  EXPECT_EQ(kGone, removeTree(kRoot));
}

TEST_F(TreeRemovalTest, ReportsEachEntryOfAnImmutableFolderAndEntersItsFolders) {
  makeAll({"a/fixed/1", "a/fixed/b/2", "c"});
  if (!setImmutable(kRoot + "/a/fixed", true)) {
    GTEST_SKIP() << "skipped: no immutable files here";
  }
  EXPECT_EQ((Outcome{false,
                     {failure("unlinkat", kRoot + "/a/fixed/1", EPERM),
                      failure("unlinkat", kRoot + "/a/fixed/b", EPERM),
                      failure("unlinkat", kRoot + "/a/fixed", EPERM)}}),
            removeTree(kRoot));
  ASSERT_TRUE(setImmutable(kRoot + "/a/fixed", false));
  EXPECT_FALSE(isThere(kRoot + "/a/fixed/b/2"));
}

TEST_F(TreeRemovalTest, WorksWithoutAReport) {
  make("a");
  EXPECT_FALSE(TreeRemoval::remove(""));
  EXPECT_TRUE(TreeRemoval::remove(kRoot));
}

TEST_F(TreeRemovalTest, EndsWithTheExceptionOfTheReport) {
  makeAll({"a/b/1", "a/c"});
  fs::create_symlink("loop", kRoot + "/loop");
  EXPECT_THROW((void)TreeRemoval::remove(kRoot + "/loop/x",
                                         [](const Error &) { throw std::runtime_error("mine"); }),
               std::runtime_error);
}

TEST_F(TreeRemovalTest, RemovesAnEmptyFolderThatCannotBeOpened) {
  if (::geteuid() != 0) {
    GTEST_SKIP() << "skipped: needs root to become another user";
  }
  makeAll({"empty/", "full/1", "z"});
  ASSERT_EQ(0, ::chmod((kRoot + "/empty").c_str(), 0));
  ASSERT_EQ(0, ::chmod((kRoot + "/full").c_str(), 0));
  for (const char *path : {"", "/empty", "/full", "/z"}) {
    ASSERT_EQ(0, ::chown((kRoot + path).c_str(), kUser, kUser));
  }
  EXPECT_EQ(failure("openat2", kRoot + "/full", EACCES) + "\nnot gone", removeAsUser(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/full", kRoot + "/full/1"}), pathsIn(kRoot));
}

TEST_F(TreeRemovalTest, ReportsWhatTheUserMayNotRemove) {
  if (::geteuid() != 0) {
    GTEST_SKIP() << "skipped: needs root to become another user";
  }
  makeAll({"theirs/1", "theirs/mine/1", "mine/1"});
  for (const char *path : {"", "/mine", "/theirs/mine"}) {
    ASSERT_EQ(0, ::chown((kRoot + path).c_str(), kUser, kUser));
  }
  EXPECT_EQ(failure("unlinkat", kRoot + "/theirs/1", EACCES) + "\n" +
                failure("unlinkat", kRoot + "/theirs/mine", EACCES) + "\nnot gone",
            removeAsUser(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/theirs", kRoot + "/theirs/1", kRoot + "/theirs/mine"}),
            pathsIn(kRoot));
  EXPECT_EQ(failure("openat", "/tmp/closed/x/", EACCES) + "\nnot gone", [] {
    fs::create_directory("/tmp/closed");
    fs::permissions("/tmp/closed", fs::perms::none);
    fs::create_directory("/tmp/closed/x");
    const std::string given = removeAsUser("/tmp/closed/x/y");
    fs::remove_all("/tmp/closed");
    return given;
  }());
}

TEST_F(TreeRemovalTest, RunsInSeveralThreadsAtOnceOnOneTree) {
  for (int round = 0; round < 20; ++round) {
    for (int i = 0; i < 300; ++i) {
      make(std::to_string(i % 7) + "/" + std::to_string(i % 30) + "/x/" + std::to_string(i));
    }
    std::atomic<int> ready = 0;
    std::atomic<int> gone = 0;
    const auto remove = [&] {
      ++ready;
      while (ready < 4) { // all begin at once
      }
      gone += removeTree(kRoot) == kGone ? 1 : 0;
    };
    std::thread threads[4];
    for (std::thread &thread : threads) {
      thread = std::thread(remove);
    }
    for (std::thread &thread : threads) {
      thread.join();
    }
    ASSERT_EQ(4, gone);
    ASSERT_FALSE(isThere(kRoot));
  }
}
