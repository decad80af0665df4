// What a walk does while others change the tree under it.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_support.h"
#include "tests/support/census.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <functional>
#include <random>
#include <set>
#include <sys/stat.h>
#include <utility>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

// Runs before each of the walk's system calls, with the call's name and the path in it.
std::function<void(const std::string &call, const char *name)> beforeCall;

void step(const char *call, const char *name) {
  if (beforeCall) {
    const auto hook = std::exchange(beforeCall, nullptr); // its own calls are not the walk's
    hook(call, name);
    beforeCall = hook;
  }
}

} // namespace

extern "C" int openat(int dir, const char *path, int flags, ...) {
  step("openat", path);
  return realFunction<int(int, const char *, int, ...)>("openat")(dir, path, flags);
}

extern "C" int statx(int dir, const char *path, int flags, unsigned int mask,
                     struct statx *out) noexcept {
  step("statx", path);
  return realFunction<int(int, const char *, int, unsigned int, struct statx *)>("statx")(
      dir, path, flags, mask, out);
}

extern "C" ssize_t getdents64(int fd, void *buffer, size_t size) noexcept {
  step("getdents64", "");
  return realFunction<ssize_t(int, void *, size_t)>("getdents64")(fd, buffer, size);
}

namespace {

std::string failure(const std::string &step, const std::string &path, int code) {
  return step + " " + path + ": " + std::to_string(code);
}

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

// Changes a tree at random while it is walked. What is outside is linked to, but never moved.
class Vandal {
public:
  explicit Vandal(unsigned seed) : random_(seed) {}

  void act() {
    std::error_code ignored;
    const std::string one = somePath();
    const std::string other = somePath();
    switch (random_() % 16) {
    case 0:
      fs::remove_all(one, ignored);
      break;
    case 1:
    case 2:
      fs::rename(one, other, ignored);
      break;
    case 3:
      fs::remove_all(one, ignored);
      fs::create_directory_symlink("/tmp/outside", one, ignored);
      break;
    case 4:
      fs::rename(one, one + "x", ignored);
      fs::create_directory_symlink("/tmp/outside", one, ignored);
      break;
    case 5:
    case 6:
      fs::create_directories(one, ignored);
      break;
    default:
      break;
    }
  }

  void makeTree() {
    for (int i = 0; i < 40; ++i) {
      std::error_code ignored;
      fs::create_directories(somePath(), ignored);
    }
  }

private:
  std::string somePath() {
    std::string path = "/tmp/walk";
    for (auto depth = 1 + random_() % 9; depth > 0; --depth) {
      path += random_() % 2 == 0 ? "/a" : "/b";
    }
    return path;
  }

  std::mt19937 random_;
};

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
    Vandal vandal(seed);
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
