// A walk when memory runs out, the memory that it holds, and trees of any depth.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_support.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"

#include "base/unique_fd.h"

#include <algorithm>
#include <fcntl.h>
#include <malloc.h>
#include <sys/mount.h>
#include <sys/stat.h>

using namespace KovaTest;
using KOVA::Backup::Service::Error;

namespace {

namespace fs = std::filesystem;
using KOVA::Base::UniqueFd;

// Everything that a walk does, with the tree of the tests below.
std::size_t walkThoroughly() {
  PathFilter filter;
  filter.addExcludePattern("/tmp/walk/a/**");
  filter.addIncludePattern("/tmp/walk/a/b/**");
  filter.addExcludePattern("/tmp/walk/z");
  WalkOptions options;
  options.oneFileSystem = true;
  options.skipCaches = true;
  options.leaveOut = {"/tmp/walk/left/out/at/a/long/path"};
  TreeWalk walk("/tmp/walk", filter, options);
  std::size_t given = 0;
  std::string text;
  Error error;
  for (WalkEntry entry; walk.next(entry);) {
    ++given;
    (void)walk.decidedBy(text);
    (void)walk.linkTarget(text, error);
  }
  return given;
}

std::size_t bytesInUse() {
  const struct mallinfo2 info = ::mallinfo2();
  return info.uordblks + info.hblkhd;
}

} // namespace

TEST_F(TreeWalkTest, ThrowsNothingButBadAllocWhenMemoryRunsOut) {
  makeAll({"a/b/c/d/e/f/g", "a/b/c/a-name-that-needs-memory-of-its-own", "x/y", "z"});
  fs::create_symlink("a-target-that-needs-memory-of-its-own", kRoot + "/link");
  std::size_t given = 0;
  forEachAllocation(
      [&] {
        given = 0;
        given = walkThoroughly();
      },
      [&](bool threw) { EXPECT_EQ(threw ? 0U : 13U, given); });
}

TEST_F(TreeWalkTest, HoldsTheMemoryOfNamesThatAreDueAlone) {
  if (bytesInUse() == 0) {
    GTEST_SKIP() << "skipped: this allocator does not count";
  }
  for (int i = 0; i < 10000; ++i) {
    make("folder/" + std::string(200, 'n') + std::to_string(10000 + i));
  }
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry) && walk.next(entry));
  const std::size_t before = bytesInUse();
  ASSERT_TRUE(walk.next(entry));
  EXPECT_LT(before + 2000000, bytesInUse());
  for (int i = 1; i < 9900; ++i) {
    ASSERT_TRUE(walk.next(entry));
  }
  EXPECT_GT(before + 300000, bytesInUse());
}

namespace {

// A file system of its own, which is taken away in one go: to remove a deep tree takes long.
class TreeWalkDeep : public TreeWalkTest {
protected:
  void SetUp() override {
    TreeWalkTest::SetUp();
    ASSERT_EQ(0, ::mount("tmpfs", kRoot.c_str(), "tmpfs", 0, nullptr));
    mounted_ = true;
  }
  void TearDown() override {
    if (mounted_) {
      EXPECT_EQ(0, ::umount(kRoot.c_str()));
    }
    TreeWalkTest::TearDown();
  }

  // A folder "d" in each folder, and with siblings a file "z" beside it.
  static void makeLevels(int levels, bool siblings) {
    UniqueFd folder(::open(kRoot.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    for (int level = 0; level < levels; ++level) {
      ASSERT_EQ(0, ::mkdirat(folder.get(), "d", 0700));
      if (siblings) {
        const UniqueFd file(::openat(folder.get(), "z", O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
        ASSERT_TRUE(file);
      }
      folder.reset(::openat(folder.get(), "d", O_PATH | O_DIRECTORY | O_CLOEXEC));
      ASSERT_TRUE(folder);
    }
  }

private:
  bool mounted_ = false;
};

constexpr int kLevels = 30000;

} // namespace

TEST_F(TreeWalkDeep, IsWalkedWithAFixedNumberOfDescriptors) {
  ASSERT_NO_FATAL_FAILURE(makeLevels(kLevels, true));
  const int before = countOpenDescriptors();
  int most = 0;
  int folders = 0;
  int files = 0;
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  for (WalkEntry entry; walk.next(entry);) {
    ASSERT_EQ(0, entry.error.code) << entry.error.step;
    (S_ISDIR(entry.mode) ? folders : files) += 1;
    if (files + folders < 100 || (files + folders) % 500 == 0) {
      most = std::max(most, countOpenDescriptors() - before);
    }
  }
  EXPECT_EQ(kLevels + 1, folders);
  EXPECT_EQ(kLevels, files);
  EXPECT_EQ(5, most) << "the root's and four more between two calls of next";
}

TEST_F(TreeWalkDeep, IsWalkedThoughTheWayUpIsLostOnce) {
  ASSERT_NO_FATAL_FAILURE(makeLevels(2000, true));
  const std::string half = [] {
    std::string path = kRoot;
    for (int level = 0; level < 1000; ++level) {
      path += "/d";
    }
    return path;
  }();
  bool moved = false;
  int failures = 0;
  int files = 0;
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  for (WalkEntry entry; walk.next(entry);) {
    if (!moved && entry.path.size() == half.size() + 2000) { // the deepest folder
      fs::rename(half, kRoot + "/zz");
      moved = true;
    }
    failures += entry.error.code == 0 ? 0 : 1;
    files += S_ISREG(entry.mode) ? 1 : 0;
  }
  EXPECT_EQ(1, failures);
  EXPECT_EQ(2000, files) << "names below the moved folder and above it";
}
