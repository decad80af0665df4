// What a walk does while others change the tree under it.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_hooks.h"
#include "tests/service/tree_walk_support.h"
#include "tests/support/census.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <set>
#include <sys/stat.h>
#include <utility>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

class TreeWalkRace : public TreeWalkTest {
protected:
  void TearDown() override {
    beforeCall = nullptr;
    TreeWalkTest::TearDown();
  }

  // Walks, and runs action once, before the first system call of this kind on this name.
  static std::vector<WalkEntry> walkWith(const std::string &call, const std::string &name,
                                         const std::function<void()> &action) {
    bool done = false;
    beforeCall = [&](const std::string &calling, const char *called) {
      if (!done && calling == call && name == called) {
        done = true;
        action();
      }
    };
    const std::vector<WalkEntry> entries = walkAll(kRoot);
    beforeCall = nullptr;
    EXPECT_TRUE(done);
    return entries;
  }

  static Paths allPaths(const std::vector<WalkEntry> &entries) {
    Paths paths;
    for (const WalkEntry &entry : entries) {
      paths.push_back(entry.path);
    }
    return paths;
  }
};

} // namespace

TEST_F(TreeWalkRace, DoesNotFollowALinkThatTakesThePlaceOfAFolder) {
  makeAll({"a/1", "b", "/tmp/outside/secret"});
  const auto entries = walkWith("openat", "a", [] {
    fs::rename(kRoot + "/a", kRoot + "/z");
    fs::create_directory_symlink(kOutside, kRoot + "/a");
  });
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a", "/tmp/walk/b"}), allPaths(entries));
  EXPECT_EQ(Paths{failure("openat", "/tmp/walk/a", ENOTDIR)}, failuresOf(entries));
  const WalkEntry &again = entries[2];
  EXPECT_TRUE(S_ISDIR(again.mode));
  EXPECT_EQ(entries[1].inode, again.inode);
  EXPECT_EQ(entries[1].device, again.device);
  EXPECT_TRUE(again.kept);
  EXPECT_EQ(0U, again.links);
}

TEST_F(TreeWalkRace, DoesNotEnterAnotherFolderInThePlaceOfTheGivenOne) {
  makeAll({"a/1", "b", "/tmp/outside/secret"});
  const auto entries = walkWith("openat", "a", [] {
    fs::rename(kRoot + "/a", kRoot + "/z");
    fs::rename(kOutside, kRoot + "/a");
  });
  EXPECT_EQ(Paths{failure("openat", "/tmp/walk/a", ESTALE)}, failuresOf(entries));
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a", "/tmp/walk/b"}), allPaths(entries));
}

TEST_F(TreeWalkRace, GivesALinkAsOneWhenItTakesThePlaceBeforeTheEntryIsGiven) {
  makeAll({"a/1", "b", "/tmp/outside/secret"});
  const auto entries = walkWith("statx", "a", [] {
    fs::remove_all(kRoot + "/a");
    fs::create_directory_symlink(kOutside, kRoot + "/a");
  });
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/b"}), pathsOf(entries));
  EXPECT_TRUE(S_ISLNK(entries[1].mode));
}

TEST_F(TreeWalkRace, PassesOverWhatHasVanished) {
  makeAll({"a/1", "b", "c/1"});
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/1", "/tmp/walk/c", "/tmp/walk/c/1"}),
            pathsOf(walkWith("statx", "b", [] { fs::remove(kRoot + "/b"); })));
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/c", "/tmp/walk/c/1"}),
            pathsOf(walkWith("openat", "a", [] { fs::remove_all(kRoot + "/a"); })));
}

TEST_F(TreeWalkRace, PassesOverAFolderThatVanishesBeforeItIsRead) {
  makeAll({"a/1", "b"});
  int reads = 0;
  beforeCall = [&](const std::string &call, const char *) {
    if (call == "getdents64" && ++reads == 3) { // the first two are the root's
      fs::remove_all(kRoot + "/a");
    }
  };
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/b"}), pathsOf(walkAll(kRoot)));
  EXPECT_LE(3, reads);
}

TEST_F(TreeWalkRace, EndsWhenTheTreeIsRemoved) {
  make("a/b/c/d/e/f/g/1");
  makeAll({"a/2", "a/b/2", "a/b/c/2", "z"});
  const auto entries = walkWith("statx", "1", [] { fs::remove_all(kRoot); });
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/2", "/tmp/walk/a/b", "/tmp/walk/a/b/2",
                   "/tmp/walk/a/b/c", "/tmp/walk/a/b/c/2", "/tmp/walk/a/b/c/d",
                   "/tmp/walk/a/b/c/d/e", "/tmp/walk/a/b/c/d/e/f", "/tmp/walk/a/b/c/d/e/f/g"}),
            pathsOf(entries));
}

TEST_F(TreeWalkRace, GivesTheContentsOfAFolderThatIsMovedAway) {
  makeAll({"a/b/c/d/e/f/1", "a/b/c/d/e/f/2", "a/b/c/y", "a/y", "z"});
  const auto entries = walkWith("statx", "1", [] {
    fs::create_directory(kOutside);
    fs::rename(kRoot + "/a/b/c", kOutside + "/c");
  });
  const Paths paths = allPaths(entries);
  EXPECT_EQ(Paths{failure("openat", "/tmp/walk/a/b/c", ESTALE)}, failuresOf(entries));
  EXPECT_EQ((Paths{"/tmp/walk/a/b/c/d/e/f/1", "/tmp/walk/a/b/c/d/e/f/2", "/tmp/walk/a/b/c/y",
                   "/tmp/walk/a/b/c", "/tmp/walk/a/y", "/tmp/walk/z"}),
            Paths(paths.end() - 6, paths.end()));
}

TEST_F(TreeWalkRace, LeavesAFolderThatIsMovedWithinTheTreeTowardsItsOldParent) {
  makeAll({"a/b/c/d/e/f/1", "a/b/y", "a/y", "z/"});
  const auto entries = walkWith("statx", "1", [] { fs::rename(kRoot + "/a/b/c", kRoot + "/z/c"); });
  const Paths paths = allPaths(entries);
  EXPECT_EQ(Paths{failure("openat", "/tmp/walk/a/b/c", ESTALE)}, failuresOf(entries));
  EXPECT_EQ((Paths{"/tmp/walk/a/b/c", "/tmp/walk/a/b/y", "/tmp/walk/a/y", "/tmp/walk/z",
                   "/tmp/walk/z/c", "/tmp/walk/z/c/d", "/tmp/walk/z/c/d/e", "/tmp/walk/z/c/d/e/f",
                   "/tmp/walk/z/c/d/e/f/1"}),
            Paths(paths.end() - 9, paths.end()));
}

TEST_F(TreeWalkRace, ReportsAnAncestorThatWasReplaced) {
  makeAll({"a/b/c/d/e/f/1", "a/y", "z"});
  const auto entries = walkWith("statx", "1", [] {
    fs::create_directory(kOutside);
    fs::rename(kRoot + "/a/b/c", kOutside + "/c");
    fs::rename(kRoot + "/a", kOutside + "/a");
    make("a/b/y");
  });
  const Paths paths = allPaths(entries);
  EXPECT_EQ((Paths{failure("openat", "/tmp/walk/a/b/c", ESTALE),
                   failure("openat", "/tmp/walk/a", ESTALE)}),
            failuresOf(entries));
  EXPECT_EQ((Paths{"/tmp/walk/a/b/c/d/e/f/1", "/tmp/walk/a/b/c", "/tmp/walk/a", "/tmp/walk/z"}),
            Paths(paths.end() - 4, paths.end()));
}

TEST_F(TreeWalkRace, PassesOverTheRestOfAnAncestorThatVanished) {
  makeAll({"a/b/c/d/e/f/1", "a/y", "z"});
  const auto entries = walkWith("statx", "1", [] {
    fs::create_directory(kOutside);
    fs::rename(kRoot + "/a/b/c", kOutside + "/c");
    fs::remove_all(kRoot + "/a");
  });
  const Paths paths = allPaths(entries);
  EXPECT_EQ(Paths{failure("openat", "/tmp/walk/a/b/c", ESTALE)}, failuresOf(entries));
  EXPECT_EQ((Paths{"/tmp/walk/a/b/c/d/e/f/1", "/tmp/walk/a/b/c", "/tmp/walk/z"}),
            Paths(paths.end() - 3, paths.end()));
}

TEST_F(TreeWalkRace, KeepsWalkingARootThatIsMoved) {
  makeAll({"a/b/c/d/e/f/1", "a/y", "z"});
  const auto entries = walkWith("statx", "1", [] { fs::rename(kRoot, kOutside); });
  EXPECT_EQ("/tmp/walk/z", pathsOf(entries).back());
  fs::create_directory(kRoot);
}

TEST_F(TreeWalkRace, HoldsFewDescriptorsInTheMiddleOfAStepToo) {
  std::string folder;
  for (int level = 0; level < 20; ++level) {
    folder += "d/";
    make(folder + "CACHEDIR.TAG", "not the signature, but as long as the signature is");
  }
  const int before = countOpenDescriptors();
  int most = 0;
  beforeCall = [&](const std::string &, const char *) {
    most = std::max(most, countOpenDescriptors() - before);
  };
  WalkOptions options;
  options.skipCaches = true;
  EXPECT_EQ(41U, walkAll(kRoot, options).size());
  EXPECT_EQ(6, most) << "before the last one, the tag, is opened";
}

namespace {

using Ids = std::set<std::pair<dev_t, std::uint64_t>>;

Ids idsOutside() {
  Ids ids;
  for (const WalkEntry &entry : walkAll("/tmp/outside")) {
    ids.emplace(entry.device, entry.inode);
  }
  return ids;
}

} // namespace

TEST_F(TreeWalkRace, NeverLeavesTheTreeWhateverIsChanged) {
  makeAll({"/tmp/outside/a/a/a", "/tmp/outside/b/b/b", "/tmp/outside/a/b"});
  const Ids outside = idsOutside();
  std::size_t given = 0;
  std::set<int> codes;
  for (unsigned seed = 1; seed <= 300; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    Vandal vandal(kRoot, seed);
    vandal.makeTree();
    beforeCall = [&](const std::string &, const char *) { vandal.act(); };
    const auto entries = walkAll(kRoot);
    beforeCall = nullptr;
    for (const WalkEntry &entry : entries) {
      ASSERT_EQ(0U, outside.count({entry.device, entry.inode})) << entry.path;
      ASSERT_EQ(0U, entry.path.rfind(kRoot, 0));
      codes.insert(entry.error.code);
    }
    given += entries.size();
    fs::remove_all(kRoot);
    fs::create_directory(kRoot);
  }
  EXPECT_LT(3000U, given);
  EXPECT_EQ((std::set<int>{0, ENOTDIR, ESTALE}), codes);
}
