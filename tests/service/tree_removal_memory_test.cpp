// A removal when memory runs out, the memory and descriptors that it needs, and trees of any depth.

#include "tests/service/tree_hooks.h"
#include "tests/service/tree_removal_support.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"

#include "base/unique_fd.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <malloc.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;
using KOVA::Base::UniqueFd;

std::size_t bytesInUse() {
  const struct mallinfo2 info = ::mallinfo2();
  return info.uordblks + info.hblkhd;
}

class TreeRemovalMemory : public TreeRemovalTest {
protected:
  void TearDown() override {
    beforeCall = nullptr;
    TreeRemovalTest::TearDown();
  }

  // Removes the root. Returns: the most bytes that were in use more than before.
  static std::size_t mostBytes() {
    const std::size_t before = bytesInUse();
    std::size_t most = before;
    beforeCall = [&](const std::string &, const char *) { most = std::max(most, bytesInUse()); };
    EXPECT_EQ(kGone, removeTree(kRoot));
    beforeCall = nullptr;
    fs::create_directory(kRoot);
    return most - before;
  }
};

// A file system of its own: the tests' one has too few inodes.
class TreeRemovalDeep : public TreeRemovalMemory {
protected:
  void SetUp() override {
    TreeRemovalTest::SetUp();
    ASSERT_EQ(0, ::mount("tmpfs", kRoot.c_str(), "tmpfs", 0, "nr_inodes=0"));
    mounted_ = true;
  }
  void TearDown() override {
    beforeCall = nullptr;
    if (mounted_) {
      EXPECT_EQ(0, ::umount(kRoot.c_str()));
    }
    TreeRemovalTest::TearDown();
  }

  // A folder of this name in each folder, with siblings a file "z" and an empty folder "e" beside
  // it.
  static void makeLevels(int levels, bool siblings = true, const std::string &name = "d") {
    UniqueFd folder(::open(kRoot.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    ASSERT_EQ(0, ::mkdirat(folder.get(), "tree", 0700));
    folder.reset(::openat(folder.get(), "tree", O_PATH | O_DIRECTORY | O_CLOEXEC));
    for (int level = 0; level < levels; ++level) {
      ASSERT_EQ(0, ::mkdirat(folder.get(), name.c_str(), 0700));
      if (siblings) {
        ASSERT_EQ(0, ::mkdirat(folder.get(), "e", 0700));
        ASSERT_EQ(0, ::mknodat(folder.get(), "z", S_IFREG | 0600, 0));
      }
      folder.reset(::openat(folder.get(), name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
      ASSERT_TRUE(folder);
    }
  }

  static inline const std::string kTree = kRoot + "/tree";

private:
  bool mounted_ = false;
};

// Keeps the soft limit of descriptors low for its lifetime.
class FewDescriptors {
public:
  explicit FewDescriptors(int most) {
    ::getrlimit(RLIMIT_NOFILE, &before_);
    const rlimit few = {static_cast<rlim_t>(most), before_.rlim_max};
    EXPECT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &few));
  }
  ~FewDescriptors() { EXPECT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &before_)); }
  FewDescriptors(const FewDescriptors &) = delete;
  FewDescriptors &operator=(const FewDescriptors &) = delete;

private:
  rlimit before_ = {};
};

} // namespace

TEST_F(TreeRemovalMemory, ThrowsNothingButBadAllocWhenItRunsOut) {
  bool gone = false;
  bool reported = false;
  const TreeRemoval::Report report = [&](const Error &error) {
    reported = reported || error.code == ELOOP;
  };
  fs::create_symlink("loop", "/tmp/loop");
  forEachAllocation(
      [&] {
        {
          const std::string deep = "a/b/c/d/e/f/g/h/i/j/k/l/a-name-that-needs-memory-of-its-own/";
          makeAll({deep + "x/", deep + "a-file-whose-name-needs-memory-of-its-own", "b/z"});
        }
        gone = false;
        reported = false;
        gone = TreeRemoval::remove(kRoot, report);
        (void)TreeRemoval::remove("/tmp/loop/below", report);
      },
      [&](bool threw) { EXPECT_TRUE(threw || (gone && reported)); });
  fs::remove("/tmp/loop");
  fs::create_directory(kRoot);
}

TEST_F(TreeRemovalMemory, IsNotHeldForFiles) {
  if (bytesInUse() == 0) {
    GTEST_SKIP() << "skipped: this allocator does not count";
  }
  make("folder/1");
  const std::size_t one = mostBytes();
  for (int i = 0; i < 5000; ++i) {
    make("folder/" + std::string(200, 'n') + std::to_string(i));
  }
  // The allocator rounds up as it finds free blocks; the names alone are a megabyte.
  constexpr std::size_t kRounding = 512;
  EXPECT_LE(mostBytes(), one + kRounding);
}

TEST_F(TreeRemovalMemory, IsHeldForFoldersThatAreDueOnTheWayAlone) {
  if (bytesInUse() == 0) {
    GTEST_SKIP() << "skipped: this allocator does not count";
  }
  const auto makeFolders = [](const std::string &above, int count) {
    for (int i = 0; i < count; ++i) {
      make(above + "/" + std::string(100, 'n') + std::to_string(i) + "/");
    }
  };
  makeFolders("a", 500);
  const std::size_t once = mostBytes();
  EXPECT_LT(500U * 100, once);
  for (const char *above : {"a", "b", "c", "d", "e", "f"}) {
    makeFolders(above, 500);
  }
  EXPECT_GT(once + once / 10, mostBytes()) << "one after the other, each the same memory";
}

TEST_F(TreeRemovalDeep, IsRemovedWithTenDescriptorsAndLittleMemory) {
  constexpr int kLevels = 30000;
  ASSERT_NO_FATAL_FAILURE(makeLevels(kLevels));
  const std::size_t bytesBefore = bytesInUse();
  const int before = countOpenDescriptors();
  std::size_t mostBytes = 0;
  int most = 0;
  int calls = 0;
  beforeCall = [&](const std::string &, const char *) {
    if (++calls < 2000 || calls % 1000 == 0) {
      most = std::max(most, countOpenDescriptors() - before);
      mostBytes = std::max(mostBytes, bytesInUse());
    }
  };
  EXPECT_EQ(kGone, removeTree(kTree));
  beforeCall = nullptr;
  EXPECT_EQ(9, most) << "before the tenth is opened";
  if (bytesBefore != 0) {
    EXPECT_GT(200U * kLevels, mostBytes - bytesBefore);
  }
}

TEST_F(TreeRemovalDeep, IsRemovedWithoutStackForEachLevel) {
  ASSERT_NO_FATAL_FAILURE(makeLevels(100000, false));
  const FewDescriptors few(countOpenDescriptors() + 10);
  EXPECT_EQ(kGone, removeTree(kTree));
}

TEST_F(TreeRemovalDeep, NeedsFewCallsForTheWayBack) {
  constexpr int kLevels = 5000;
  for (const std::size_t length : {1U, 100U}) {
    ASSERT_NO_FATAL_FAILURE(makeLevels(kLevels, true, std::string(length, 'd')));
    int opened = 0;
    std::size_t longest = 0;
    beforeCall = [&](const std::string &call, const std::string &name) {
      opened += call == "openat2" ? 1 : 0;
      longest = std::max(longest, name.size());
    };
    EXPECT_EQ(kGone, removeTree(kTree));
    beforeCall = nullptr;
    EXPECT_GT(2 * kLevels + kLevels * 3 / 2, opened) << "two to enter folders";
    EXPECT_LT(2000U, longest);
    EXPECT_GT(4096U, longest) << "the kernel takes no longer path";
  }
}

TEST_F(TreeRemovalDeep, IsRemovedWithoutOpenat2) {
  ASSERT_NO_FATAL_FAILURE(makeLevels(3000));
  const Fault refused("openat2", 1, EPERM, true);
  EXPECT_EQ(kGone, removeTree(kTree));
}
