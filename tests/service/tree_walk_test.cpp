#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_support.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <random>
#include <set>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

using namespace KovaTest;
using KOVA::Backup::Service::Error;

namespace {

namespace fs = std::filesystem;

// A plain recursion over paths.
void listPlainly(const std::string &path, Paths &out) {
  out.push_back(path);
  if (!fs::is_directory(fs::symlink_status(path))) {
    return;
  }
  std::set<std::string> names;
  for (const fs::directory_entry &entry : fs::directory_iterator(path)) {
    names.insert(entry.path().filename().string());
  }
  for (const std::string &name : names) {
    listPlainly(path + "/" + name, out);
  }
}

void makeRandomly(const std::string &folder, int depth, std::mt19937 &random) {
  for (auto left = random() % 6; left > 0; --left) {
    std::string name;
    for (auto size = 1 + random() % 12; size > 0; --size) {
      name += "abAZ.-\xc3\x01 ~"[random() % 10];
    }
    if (name == "." || name == "..") {
      continue;
    }
    const std::string path = folder + "/" + name;
    const auto kind = random() % 4;
    std::error_code taken;
    if (kind == 0) {
      fs::create_symlink("/tmp/walk", path, taken);
    } else if (kind == 1) {
      std::ofstream out(path);
    } else if (fs::create_directory(path, taken) && depth > 0) {
      makeRandomly(path, depth - 1, random);
    }
  }
}

} // namespace

TEST_F(TreeWalkTest, GivesNamesInByteOrderWithContentsDirectlyAfterTheirFolder) {
  makeAll({"b", "a/x", "a.c", "a/y/1", "B", "\xff", "\x01", "aaaaaaaab", "aaaaaaaaa"});
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/\x01", "/tmp/walk/B", "/tmp/walk/a", "/tmp/walk/a/x",
                   "/tmp/walk/a/y", "/tmp/walk/a/y/1", "/tmp/walk/a.c", "/tmp/walk/aaaaaaaaa",
                   "/tmp/walk/aaaaaaaab", "/tmp/walk/b", "/tmp/walk/\xff"}),
            pathsOf(walkAll(kRoot)));
}

TEST_F(TreeWalkTest, GivesWhatAPlainRecursionFinds) {
  for (unsigned seed = 1; seed <= 60; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::mt19937 random(seed);
    makeRandomly(kRoot, 8, random);
    Paths expected;
    listPlainly(kRoot, expected);
    ASSERT_EQ(expected, pathsOf(walkAll(kRoot)));
    fs::remove_all(kRoot);
    fs::create_directory(kRoot);
  }
}

TEST_F(TreeWalkTest, GivesTheSameListTwice) {
  std::mt19937 random(99);
  makeRandomly(kRoot, 10, random);
  EXPECT_EQ(pathsOf(walkAll(kRoot)), pathsOf(walkAll(kRoot)));
}

TEST_F(TreeWalkTest, SortsAFolderOfManyNames) {
  constexpr int kFiles = 5000; // more than one buffer of getdents64
  Paths expected = {kRoot};
  for (int i = 0; i < kFiles; ++i) {
    make("some-rather-long-name-" + std::to_string(i));
    expected.push_back(kRoot + "/some-rather-long-name-" + std::to_string(i));
  }
  std::sort(expected.begin(), expected.end());
  EXPECT_EQ(expected, pathsOf(walkAll(kRoot)));
}

TEST_F(TreeWalkTest, FillsAnEntryAsLstatDoes) {
  make("file", "content");
  fs::create_symlink("nowhere", kRoot + "/link");
  ASSERT_EQ(0, ::mkfifo("/tmp/walk/fifo", 0640));
  fs::create_hard_link(kRoot + "/file", kRoot + "/second");
  ASSERT_EQ(0, ::chmod("/tmp/walk/file", 04751));
  ASSERT_EQ(0, ::lchown("/tmp/walk/link", ::geteuid(), ::getegid()));
  const timespec times[] = {{1, 2}, {-1, 999999999}};
  ASSERT_EQ(0, ::utimensat(AT_FDCWD, "/tmp/walk/file", times, 0));
  const std::vector<WalkEntry> entries = walkAll(kRoot);
  ASSERT_EQ(5U, entries.size());
  for (const WalkEntry &entry : entries) {
    SCOPED_TRACE(entry.path);
    struct stat expected = {};
    ASSERT_EQ(0, ::lstat(entry.path.c_str(), &expected));
    EXPECT_EQ(expected.st_mode, entry.mode);
    EXPECT_EQ(expected.st_uid, entry.uid);
    EXPECT_EQ(expected.st_gid, entry.gid);
    EXPECT_EQ(expected.st_dev, entry.device);
    EXPECT_EQ(expected.st_ino, entry.inode);
    EXPECT_EQ(expected.st_nlink, entry.links);
    EXPECT_EQ(expected.st_size, static_cast<off_t>(entry.size));
    EXPECT_EQ(expected.st_mtim.tv_sec, entry.modified.tv_sec);
    EXPECT_EQ(expected.st_mtim.tv_nsec, entry.modified.tv_nsec);
    EXPECT_EQ(expected.st_ctim.tv_sec, entry.changed.tv_sec);
    EXPECT_EQ(expected.st_ctim.tv_nsec, entry.changed.tv_nsec);
    EXPECT_TRUE(entry.kept);
  }
}

TEST_F(TreeWalkTest, EndsForGoodAndLeavesTheEntryAlone) {
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry));
  entry.path = "mine";
  EXPECT_FALSE(walk.next(entry));
  EXPECT_FALSE(walk.next(entry));
  EXPECT_EQ("mine", entry.path);
}

TEST_F(TreeWalkTest, GivesPathsAsTheRootIsWritten) {
  make("a/x");
  EXPECT_EQ((Paths{"/tmp//./walk", "/tmp//./walk/a", "/tmp//./walk/a/x"}),
            pathsOf(walkAll("/tmp//./walk")));
  EXPECT_EQ((Paths{"/tmp/walk/a", "/tmp/walk/a/x"}), pathsOf(walkAll("/tmp/walk/a//")));
}

TEST_F(TreeWalkTest, WritesNoSlashTwiceBelowTheRootFolder) {
  for (const std::string root : {"/", "///"}) {
    PathFilter filter;
    TreeWalk walk(root, filter);
    WalkEntry entry;
    ASSERT_TRUE(walk.next(entry));
    EXPECT_EQ("/", entry.path);
    ASSERT_TRUE(walk.next(entry));
    EXPECT_EQ(0U, entry.path.rfind('/'));
    EXPECT_LT(1U, entry.path.size());
  }
}

TEST_F(TreeWalkTest, GivesARootThatIsNotAFolder) {
  make("file");
  fs::create_symlink(kRoot, kRoot + "/link");
  EXPECT_EQ(Paths{"/tmp/walk/file"}, pathsOf(walkAll("/tmp/walk/file")));
  const std::vector<WalkEntry> entries = walkAll("/tmp/walk/link");
  EXPECT_EQ(Paths{"/tmp/walk/link"}, pathsOf(entries));
  EXPECT_TRUE(S_ISLNK(entries.front().mode));
}

TEST_F(TreeWalkTest, FollowsLinksAboveTheRoot) {
  make("real/a/x");
  fs::create_symlink("real", kRoot + "/link");
  EXPECT_EQ((Paths{"/tmp/walk/link/a", "/tmp/walk/link/a/x"}),
            pathsOf(walkAll("/tmp/walk/link/a")));
}

TEST_F(TreeWalkTest, ReportsARootThatCannotBeOpened) {
  EXPECT_EQ(Paths{"openat /tmp/walk/none: " + std::to_string(ENOENT)},
            failuresOf(walkAll("/tmp/walk/none")));
  const std::string name(NAME_MAX + 1, 'n');
  EXPECT_EQ(Paths{"openat /" + name + ": " + std::to_string(ENAMETOOLONG)},
            failuresOf(walkAll("/" + name)));
}

TEST_F(TreeWalkTest, RefusesARootThatIsNotAnAbsolutePath) {
  using std::string_literals::operator""s;
  for (const std::string &root : {""s, "tmp/walk"s, "."s, "/tmp/walk\0/x"s}) {
    EXPECT_EQ(Paths{"openat " + root + ": " + std::to_string(EINVAL)}, failuresOf(walkAll(root)));
  }
}

TEST_F(TreeWalkTest, KeepsOutOfAFolderThatIsSkipped) {
  makeAll({"a/b/1", "a/b/2", "a/c", "d"});
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  Paths paths;
  for (WalkEntry entry; walk.next(entry);) {
    paths.push_back(entry.path);
    if (entry.path == "/tmp/walk/a/b" || entry.path == "/tmp/walk/a/c") {
      walk.skipFolder();
    }
  }
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/b", "/tmp/walk/a/c", "/tmp/walk/d"}),
            paths);
}

TEST_F(TreeWalkTest, EndsWhenTheRootIsSkipped) {
  make("a");
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  walk.skipFolder(); // before the first entry there is nothing to skip
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry));
  walk.skipFolder();
  EXPECT_FALSE(walk.next(entry));
}

TEST_F(TreeWalkTest, ReadsTheTargetsOfLinks) {
  const std::string longTarget(PATH_MAX - 1, 'x');
  make("a/");
  fs::create_symlink("../b", kRoot + "/a/link");
  ASSERT_EQ(0, ::symlink(longTarget.c_str(), "/tmp/walk/long"));
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  Paths targets;
  for (WalkEntry entry; walk.next(entry);) {
    std::string target;
    Error error;
    if (walk.linkTarget(target, error)) {
      EXPECT_TRUE(S_ISLNK(entry.mode));
      targets.push_back(target);
    } else {
      EXPECT_FALSE(S_ISLNK(entry.mode));
      EXPECT_EQ(EINVAL, error.code);
      EXPECT_EQ("readlinkat", error.step);
      EXPECT_EQ(entry.path, error.path);
    }
  }
  EXPECT_EQ((Paths{"../b", longTarget}), targets);
}

TEST_F(TreeWalkTest, ReadsTheTargetOfARootThatIsALinkOfUnknownSize) {
  PathFilter filter;
  TreeWalk walk("/proc/self/cwd", filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry));
  EXPECT_EQ(0U, entry.size);
  std::string target;
  Error error;
  ASSERT_TRUE(walk.linkTarget(target, error));
  EXPECT_EQ(fs::current_path().string(), target);
}

TEST_F(TreeWalkTest, ReportsALinkThatHasVanished) {
  fs::create_symlink("target", kRoot + "/link");
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry) && walk.next(entry));
  fs::remove(kRoot + "/link");
  std::string target = "mine";
  Error error;
  EXPECT_FALSE(walk.linkTarget(target, error));
  EXPECT_EQ("mine", target);
  EXPECT_EQ(ENOENT, error.code);
  EXPECT_EQ("/tmp/walk/link", error.path);
}

TEST_F(TreeWalkTest, OpensNothingBeforeItsFirstEntryAndClosesEverythingAtItsEnd) {
  make("a/b/c/d/e/f/g/h");
  PathFilter filter;
  const auto descriptors = [] {
    const fs::directory_iterator all("/proc/self/fd");
    return std::distance(fs::begin(all), fs::end(all));
  };
  const auto before = descriptors();
  TreeWalk walk(kRoot, filter);
  EXPECT_EQ(before, descriptors());
  for (WalkEntry entry; walk.next(entry);) {
    EXPECT_LT(before, descriptors());
  }
  EXPECT_EQ(before, descriptors());
}

TEST_F(TreeWalkTest, ClosesEverythingWhenItIsDestroyedInTheMiddle) {
  make("a/b/c/d/e/f/g/h"); // the census after the test sees what stays open
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  for (int i = 0; i < 7; ++i) {
    ASSERT_TRUE(walk.next(entry));
  }
}

TEST_F(TreeWalkTest, IsIndependentOfWalksInOtherThreads) {
  std::mt19937 random(7);
  makeRandomly(kRoot, 8, random);
  PathFilter filter;
  filter.addExcludePattern("**a");
  const auto keptPaths = [&filter] {
    Paths paths;
    for (const WalkEntry &entry : walkAll(kRoot, filter)) {
      paths.push_back((entry.kept ? "+" : "-") + entry.path);
    }
    return paths;
  };
  const Paths expected = keptPaths();
  std::vector<Paths> seen(4);
  std::vector<std::thread> threads;
  for (Paths &paths : seen) {
    threads.emplace_back([&paths, &keptPaths] { paths = keptPaths(); });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
  for (const Paths &paths : seen) {
    EXPECT_EQ(expected, paths);
  }
}
