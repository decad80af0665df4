// Mounts in a tree: reported, never entered, and everything around them removed. With openat2 and
// with the calls that stand in for it.

#include "tests/service/tree_hooks.h"
#include "tests/service/tree_removal_support.h"
#include "tests/support/child_process.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"

#include <cerrno>
#include <memory>
#include <sys/mount.h>
#include <unistd.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

// A mount for its lifetime.
class Mount {
public:
  Mount(const std::string &source, std::string target, const char *type, unsigned long flags)
      : target_(std::move(target)) {
    mounted_ = ::mount(source.c_str(), target_.c_str(), type, flags, nullptr) == 0;
  }
  ~Mount() {
    if (mounted_) {
      EXPECT_EQ(0, ::umount2(target_.c_str(), MNT_DETACH | UMOUNT_NOFOLLOW));
    }
  }
  Mount(const Mount &) = delete;
  Mount &operator=(const Mount &) = delete;
  explicit operator bool() const { return mounted_; }

private:
  std::string target_;
  bool mounted_;
};

// The parameter: openat2's errno when it is refused, 0 when it works.
class TreeRemovalMount : public TreeRemovalTest, public testing::WithParamInterface<int> {
protected:
  void SetUp() override {
    TreeRemovalTest::SetUp();
    if (GetParam() != 0) {
      refused_ = std::make_unique<Fault>("openat2", 1, GetParam(), true);
    }
  }
  void TearDown() override {
    beforeCall = nullptr;
    refused_.reset();
    TreeRemovalTest::TearDown();
  }

  static const char *opening() { return GetParam() == 0 ? "openat2" : "openat"; }
  static std::string mountPoint(const std::string &path) { return failure(opening(), path, EXDEV); }

private:
  std::unique_ptr<Fault> refused_;
};

// clang-format off
INSTANTIATE_TEST_SUITE_P(Openat2, TreeRemovalMount, testing::Values(0, ENOSYS, EPERM));
// clang-format on

} // namespace

TEST_P(TreeRemovalMount, OfAnotherFileSystemStays) {
  makeAll({"a/1", "a/m/", "b/1"});
  const Mount mount("tmpfs", kRoot + "/a/m", "tmpfs", 0);
  ASSERT_TRUE(mount);
  make("a/m/kept");
  EXPECT_EQ((Outcome{false, {mountPoint(kRoot + "/a/m")}}), removeTree(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/a/m", kRoot + "/a/m/kept"}), pathsIn(kRoot));
}

TEST_P(TreeRemovalMount, OfTheSameFileSystemStays) {
  makeAll({"a/1", "a/m/hidden", "b/1", "/tmp/outside/kept"});
  {
    const Mount mount(kOutside, kRoot + "/a/m", nullptr, MS_BIND);
    ASSERT_TRUE(mount);
    EXPECT_EQ((Outcome{false, {mountPoint(kRoot + "/a/m")}}), removeTree(kRoot));
    EXPECT_TRUE(isThere(kOutside + "/kept"));
  }
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/a/m", kRoot + "/a/m/hidden"}), pathsIn(kRoot));
}

TEST_P(TreeRemovalMount, OfAFolderOnItselfStays) {
  makeAll({"a/1", "a/m/kept"});
  const Mount mount(kRoot + "/a/m", kRoot + "/a/m", nullptr, MS_BIND);
  ASSERT_TRUE(mount);
  EXPECT_EQ((Outcome{false, {mountPoint(kRoot + "/a/m")}}), removeTree(kRoot));
  EXPECT_TRUE(isThere(kRoot + "/a/m/kept"));
}

TEST_P(TreeRemovalMount, OfTheTreeInItselfStays) {
  makeAll({"a/1", "a/m/", "z"});
  const Mount mount(kRoot, kRoot + "/a/m", nullptr, MS_BIND);
  ASSERT_TRUE(mount);
  EXPECT_EQ((Outcome{false, {mountPoint(kRoot + "/a/m")}}), removeTree(kRoot));
}

TEST_P(TreeRemovalMount, OnAFileStays) {
  makeAll({"a/1", "a/m", "/tmp/outside/kept"});
  const Mount mount(kOutside + "/kept", kRoot + "/a/m", nullptr, MS_BIND);
  ASSERT_TRUE(mount);
  EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot + "/a/m", EBUSY)}}), removeTree(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/a/m"}), pathsIn(kRoot));
  EXPECT_TRUE(isThere(kOutside + "/kept"));
}

TEST_P(TreeRemovalMount, AtTheRootIsEmptiedAndStays) {
  make("m/hidden");
  {
    const Mount mount("tmpfs", kRoot + "/m", "tmpfs", 0);
    ASSERT_TRUE(mount);
    // Deeper than the removal has descriptors: the way back leads through the mount again.
    makeAll({"m/1", "m/a/b/c/d/e/f/g/h/i/j/k/l/m/n/1", "m/a/b/2", "m/z/1"});
    EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot + "/m", EBUSY)}}),
              removeTree(kRoot + "/m"));
    EXPECT_EQ(Paths{kRoot + "/m"}, pathsIn(kRoot + "/m"));
  }
  EXPECT_TRUE(isThere(kRoot + "/m/hidden"));
}

TEST_P(TreeRemovalMount, OfTheSystemRootIsRefused) {
  makeAll({"/tmp/outside/m/", "/tmp/outside/kept"});
  const Mount mount(kOutside, kOutside + "/m", nullptr, MS_BIND);
  ASSERT_TRUE(mount);
  EXPECT_EQ(0, runInChild([] { // in which "/" is a folder that may be lost
              const Outcome refused = {false, {failure("openat", "/m", EINVAL)}};
              return ::chroot(kOutside.c_str()) == 0 && removeTree("/m") == refused ? 0 : 1;
            }));
  EXPECT_TRUE(isThere(kOutside + "/kept"));
}

TEST_P(TreeRemovalMount, ThatAppearsOnTheWayBackStays) {
  // "c" is open no longer when the removal returns to it.
  makeAll({"a/b/c/d/e/f/g/h/i/j/k/l/m/n/1", "a/b/c/2/", "a/b/3", "z"});
  const std::string covered = kRoot + "/a/b/c";
  for (const std::string &at : {kRoot + "/a", kRoot + "/a/b", covered}) {
    fs::remove_all(kRoot);
    makeAll({"a/b/c/d/e/f/g/h/i/j/k/l/m/n/1", "a/b/c/2/", "a/b/3", "z", "/tmp/outside/kept"});
    make("/tmp/outside/b/c/d/kept");
    std::unique_ptr<Mount> mount;
    beforeCall = [&](const std::string &call, const std::string &name) {
      if (mount == nullptr && call == "unlinkat" && name == "1") {
        mount = std::make_unique<Mount>(kOutside, at, nullptr, MS_BIND);
      }
    };
    const Outcome outcome = removeTree(kRoot);
    beforeCall = nullptr;
    ASSERT_TRUE(mount != nullptr && *mount);
    EXPECT_EQ((Outcome{false, {mountPoint(at)}}), outcome);
    EXPECT_EQ((Paths{kOutside, kOutside + "/b", kOutside + "/b/c", kOutside + "/b/c/d",
                     kOutside + "/b/c/d/kept", kOutside + "/kept"}),
              pathsIn(kOutside));
  }
}

TEST_P(TreeRemovalMount, ThatAppearsAtTheRootStays) {
  makeAll({"a/1", "/tmp/outside/kept"});
  std::unique_ptr<Mount> mount;
  bool added = false;
  beforeCall = [&](const std::string &call, const std::string &name) {
    if (!added && call == "unlinkat" && name == "tree") {
      added = true;
      make("new");
    } else if (added && mount == nullptr && call == opening() && name == "tree") {
      mount = std::make_unique<Mount>(kOutside, kRoot, nullptr, MS_BIND);
    }
  };
  const Outcome outcome = removeTree(kRoot);
  beforeCall = nullptr;
  ASSERT_TRUE(mount != nullptr && *mount);
  EXPECT_EQ((Outcome{false, {mountPoint(kRoot)}}), outcome);
  EXPECT_TRUE(isThere(kOutside + "/kept"));
  mount.reset();
  EXPECT_TRUE(isThere(kRoot + "/new"));
}

TEST_P(TreeRemovalMount, ThatIsTakenAwayFromTheRootUncoversNothing) {
  make("m/hidden");
  auto mount = std::make_unique<Mount>("tmpfs", kRoot + "/m", "tmpfs", 0UL);
  ASSERT_TRUE(*mount);
  make("m/a/1");
  beforeCall = [&](const std::string &call, const std::string &name) {
    if (call == "unlinkat" && name == "m") {
      mount.reset();
    }
  };
  const Outcome outcome = removeTree(kRoot + "/m");
  beforeCall = nullptr;
  EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot + "/m", ENOTEMPTY)}}), outcome);
  EXPECT_TRUE(isThere(kRoot + "/m/hidden"));
}
