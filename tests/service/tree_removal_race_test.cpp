// What a removal does while others change the tree under it.

#include "tests/service/tree_hooks.h"
#include "tests/service/tree_removal_support.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"

#include <cerrno>
#include <csignal>
#include <functional>
#include <linux/openat2.h>
#include <memory>
#include <sys/wait.h>
#include <unistd.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

class TreeRemovalRace : public TreeRemovalTest {
protected:
  void SetUp() override {
    TreeRemovalTest::SetUp();
    makeAll({"/tmp/outside/secret", "/tmp/outside/b/secret", "/tmp/outside/1"});
  }
  void TearDown() override {
    beforeCall = nullptr;
    TreeRemovalTest::TearDown();
  }

  // Removes the tree, and runs action once, before the first system call of this kind on this name.
  static Outcome removeWith(const std::string &call, const std::string &name,
                            const std::function<void()> &action) {
    bool done = false;
    beforeCall = [&](const std::string &calling, const char *called) {
      if (!done && calling == call && name == called) {
        done = true;
        action();
      }
    };
    const Outcome outcome = removeTree(kRoot);
    beforeCall = nullptr;
    EXPECT_TRUE(done);
    return outcome;
  }

  static void expectOutsideUntouched() {
    EXPECT_EQ((Paths{kOutside, kOutside + "/1", kOutside + "/b", kOutside + "/b/secret",
                     kOutside + "/secret"}),
              pathsIn(kOutside));
  }

  // Deeper than the removal has descriptors: on the way back from "deepest" to "c" and above, each
  // folder is opened again.
  static inline const std::string kDeep = "a/b/c/d/e/f/g/h/i/j/k/l/m/n/deepest";
};

void replaceByLink(const std::string &path) {
  fs::rename(path, path + "-moved");
  fs::create_directory_symlink("/tmp/outside", path);
}

} // namespace

TEST_F(TreeRemovalRace, DoesNotFollowALinkThatTakesThePlaceOfAFolder) {
  makeAll({"a/1", "b/1"});
  EXPECT_EQ(kGone, removeWith("openat2", "a", [] { replaceByLink(kRoot + "/a"); }));
  expectOutsideUntouched();
}

// Links within the tree would be followed without a trace.
TEST_F(TreeRemovalRace, LetsTheKernelKeepEachFolderBeneathOnTheMountAndFreeOfLinks) {
  makeAll({kDeep, "z/1"});
  resolvedWith.clear();
  recordsResolve = true;
  EXPECT_EQ(kGone, removeTree(kRoot));
  recordsResolve = false;
  const std::uint64_t expected = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_XDEV;
  EXPECT_LT(16U, resolvedWith.size());
  for (const std::uint64_t resolve : resolvedWith) {
    EXPECT_EQ(expected, resolve);
  }
}

TEST_F(TreeRemovalRace, DoesNotFollowALinkThatTakesThePlaceOfTheRoot) {
  make("a/1");
  EXPECT_EQ(kGone, removeWith("openat2", "tree", [] { replaceByLink(kRoot); }));
  expectOutsideUntouched();
  EXPECT_EQ((Paths{kRoot + "-moved", kRoot + "-moved/a", kRoot + "-moved/a/1"}),
            pathsIn(kRoot + "-moved"));
  fs::remove_all(kRoot + "-moved");
}

TEST_F(TreeRemovalRace, DoesNotFollowALinkThatTakesThePlaceOfAFolderAboveTheOpenOne) {
  for (const char *replaced : {"/a", "/a/b", "/a/b/c"}) {
    fs::create_directory(kRoot);
    makeAll({kDeep, "a/b/1", "a/b/b/1", "z"});
    EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [&] { replaceByLink(kRoot + replaced); }));
    expectOutsideUntouched();
    EXPECT_FALSE(isThere(kRoot));
  }
}

TEST_F(TreeRemovalRace, DoesNotFollowALinkThatTakesThePlaceOfAFile) {
  makeAll({"a/1", "b"});
  EXPECT_EQ(kGone, removeWith("unlinkat", "1", [] {
              fs::remove(kRoot + "/a/1");
              fs::create_directory_symlink(kOutside, kRoot + "/a/1");
            }));
  expectOutsideUntouched();
}

TEST_F(TreeRemovalRace, RemovesAFolderThatTakesThePlaceOfAFile) {
  makeAll({"a/1", "b"});
  EXPECT_EQ(kGone, removeWith("unlinkat", "1", [] {
              fs::remove(kRoot + "/a/1");
              make("a/1/2/3");
            }));
}

TEST_F(TreeRemovalRace, RemovesWhatTakesThePlaceOfAFolderBeforeItIsRemoved) {
  makeAll({"a/b/", "z"});
  EXPECT_EQ(kGone, removeWith("unlinkat", "b", [] { replaceByLink(kRoot + "/a/b"); }));
  expectOutsideUntouched();
  fs::create_directory(kRoot);
  makeAll({"a/b/", "z"});
  EXPECT_EQ(kGone, removeWith("unlinkat", "b", [] {
              fs::remove(kRoot + "/a/b");
              make("a/b");
            }));
}

TEST_F(TreeRemovalRace, ReportsALinkAtThePathOfTheRootWithASlash) {
  make("a");
  bool done = false;
  beforeCall = [&](const std::string &call, const std::string &name) {
    if (!done && call == "unlinkat" && name == "tree") {
      done = true;
      fs::remove(kRoot);
      fs::create_directory_symlink(kOutside, kRoot);
    }
  };
  const Outcome outcome = removeTree(kRoot + "/");
  beforeCall = nullptr;
  EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot, ENOTDIR)}}), outcome);
  expectOutsideUntouched();
}

TEST_F(TreeRemovalRace, PassesOverWhatOthersRemove) {
  for (const char *call : {"openat2", "unlinkat"}) {
    fs::create_directory(kRoot);
    makeAll({"a/b/1", "z"});
    EXPECT_EQ(kGone, removeWith(call, "b", [] { fs::remove_all(kRoot + "/a"); }));
  }
  make("a/b/1");
  EXPECT_EQ(kGone, removeWith("unlinkat", "1", [] { fs::remove_all(kRoot); }));
  make("a/b/1");
  EXPECT_EQ(kGone, removeWith("openat2", "tree", [] { fs::remove_all(kRoot); }));
  make(kDeep);
  EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [] { fs::remove_all(kRoot); }));
}

TEST_F(TreeRemovalRace, RemovesWhatIsAddedBehindIt) {
  make(kDeep);
  EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [] {
              makeAll({"new", "a/new/1", "a/b/c/new/1", "a/b/c/d/e/f/g/h/i/j/k/l/m/n/new/1"});
            }));
}

TEST_F(TreeRemovalRace, RemovesWhatIsMovedWithinTheTree) {
  makeAll({kDeep, "a/b/c/1", "a/b/2", "y/", "z/"});
  for (const char *to : {"/moved", "/y/moved", "/z/moved", "/a/moved"}) {
    fs::create_directory(kRoot);
    makeAll({kDeep, "a/b/c/1", "a/b/2", "a/y", "y/", "z/"});
    EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [&] {
                fs::create_directories(fs::path(kRoot + to).parent_path());
                fs::rename(kRoot + "/a/b/c", kRoot + to);
              }));
  }
}

TEST_F(TreeRemovalRace, LosesSightOfAFolderThatIsMovedOutOfTheTree) {
  makeAll({kDeep, "a/b/c/1/", "a/b/2/", "z"});
  const std::string moved = "/tmp/outside/moved";
  EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [&] { fs::rename(kRoot + "/a/b", moved); }));
  EXPECT_TRUE(isThere(moved)) << "it is no longer part of the tree";
  fs::remove_all(moved);
  expectOutsideUntouched();
}

TEST_F(TreeRemovalRace, DoesNotReturnToAFolderThatHasTheNumberOfARemovedOne) {
  // "c" ends up in a new folder that is outside. That it may get the number of "b" must not matter.
  makeAll({kDeep, "a/b/b/", "z"});
  EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [&] {
              fs::rename(kRoot + "/a/b/c", kOutside + "/c");
              fs::remove_all(kRoot + "/a/b");
              makeAll({"/tmp/outside/new/b/", "/tmp/outside/new/1"});
              fs::rename(kOutside + "/c", kOutside + "/new/c");
            }));
  EXPECT_TRUE(isThere(kOutside + "/new/b"));
  EXPECT_TRUE(isThere(kOutside + "/new/1"));
  fs::remove_all(kOutside + "/new");
  expectOutsideUntouched();
}

TEST_F(TreeRemovalRace, EmptiesARootThatIsMoved) {
  makeAll({kDeep, "z/1"});
  const std::string moved = "/tmp/outside/moved";
  EXPECT_EQ(kGone, removeWith("unlinkat", "deepest", [&] { fs::rename(kRoot, moved); }));
  EXPECT_EQ(Paths{moved}, pathsIn(moved));
  fs::remove(moved);
  expectOutsideUntouched();
}

TEST_F(TreeRemovalRace, RemovesTheFolderThatTakesThePlaceOfTheRoot) {
  make("a/1");
  EXPECT_EQ(kGone, removeWith("unlinkat", "tree", [] {
              fs::remove(kRoot);
              make("new/1");
            }));
}

TEST_F(TreeRemovalRace, FindsWhatWasMovedAlthoughSomethingFailed) {
  makeAll({kDeep, "a/b/c/1", "z"});
  std::unique_ptr<Fault> refused;
  const Outcome outcome = removeWith("unlinkat", "deepest", [&] {
    fs::rename(kRoot + "/a/b/c", kRoot + "/c");
    refused = std::make_unique<Fault>("unlinkat", 1, EACCES); // that of "deepest"
  });
  EXPECT_EQ((Outcome{true, {failure("unlinkat", kRoot + "/" + kDeep, EACCES)}}), outcome);
}

namespace {

// The vandal makes entries "a" and "b" outside, through its links, and removes them. It never
// touches the others.
void expectSecrets() {
  ASSERT_TRUE(isThere("/tmp/outside/secret"));
  ASSERT_TRUE(isThere("/tmp/outside/1"));
  ASSERT_TRUE(isThere("/tmp/outside/folder/secret"));
}

void makeTreeOf(Vandal &vandal) {
  fs::create_directory("/tmp/tree");
  vandal.makeTree();
  makeEntry("/tmp/tree", "a/a/a/a/a/a/a/a/a/a/a/a/a/1");
}

} // namespace

TEST_F(TreeRemovalRace, NeverLeavesTheTreeWhateverIsChanged) {
  make("/tmp/outside/folder/secret");
  int gone = 0;
  int links = 0;
  for (unsigned seed = 1; seed <= 400; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    Vandal vandal(kRoot, seed);
    makeTreeOf(vandal);
    bool failed = false;
    beforeCall = [&](const std::string &, const char *) {
      vandal.act();
      links += fs::is_symlink(kRoot + "/a") || fs::is_symlink(kRoot + "/b") ? 1 : 0;
    };
    const bool result = TreeRemoval::remove(kRoot, [&](const Error &error) {
      failed = true;
      EXPECT_EQ(0U, error.path.rfind(kRoot, 0)) << error.path;
    });
    beforeCall = nullptr;
    ASSERT_TRUE(result || failed);
    gone += result ? 1 : 0;
    ASSERT_NO_FATAL_FAILURE(expectSecrets());
    EXPECT_EQ(kGone, removeTree(kRoot));
  }
  EXPECT_LT(100, gone);
  EXPECT_LT(100, links);
}

TEST_F(TreeRemovalRace, NeverLeavesTheTreeWithoutOpenat2) {
  make("/tmp/outside/folder/secret");
  const Fault refused("openat2", 1, ENOSYS, true);
  for (unsigned seed = 1; seed <= 200; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    Vandal vandal(kRoot, seed);
    makeTreeOf(vandal);
    beforeCall = [&](const std::string &, const char *) { vandal.act(); };
    (void)removeTree(kRoot);
    beforeCall = nullptr;
    ASSERT_NO_FATAL_FAILURE(expectSecrets());
  }
}

// A process of its own changes the tree at any moment, not only between two calls.
TEST_F(TreeRemovalRace, NeverLeavesTheTreeWhileAProcessChangesIt) {
  make("/tmp/outside/folder/secret");
  const pid_t child = ::fork();
  if (child == 0) {
    for (unsigned seed = 1;; ++seed) {
      std::error_code ignored;
      fs::create_directory(kRoot, ignored);
      Vandal vandal(kRoot, seed);
      vandal.makeTree();
      for (int i = 0; i < 50; ++i) {
        vandal.act();
      }
    }
  }
  ASSERT_LT(0, child);
  for (int round = 0; round < 500; ++round) {
    (void)removeTree(kRoot);
  }
  EXPECT_EQ(0, ::kill(child, SIGKILL));
  EXPECT_EQ(child, ::waitpid(child, nullptr, 0));
  expectSecrets();
  EXPECT_EQ(kGone, removeTree(kRoot));
}
