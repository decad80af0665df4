#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_support.h"

#include <sys/mount.h>
#include <sys/stat.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

constexpr char kTag[] = "Signature: 8a477f597d28d172789f06886806bc55";

WalkOptions leaveOut(const Paths &paths) {
  WalkOptions options;
  options.leaveOut = paths;
  return options;
}

class TreeWalkCaches : public TreeWalkTest {
protected:
  // Whether a folder with this content of the tag is taken for a cache.
  static bool isSkipped() {
    WalkOptions options;
    options.skipCaches = true;
    const Paths paths = pathsOf(walkAll(kRoot, options));
    return paths == Paths{"/tmp/walk", "/tmp/walk/cache"};
  }
};

} // namespace

TEST_F(TreeWalkTest, GivesAFolderOnAnotherFileSystemButDoesNotEnterIt) {
  makeAll({"a/mount/", "b"});
  const std::string mount = kRoot + "/a/mount";
  ASSERT_EQ(0, ::mount("tmpfs", mount.c_str(), "tmpfs", 0, nullptr));
  make("a/mount/inside");
  WalkOptions options;
  options.oneFileSystem = true;
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/mount", "/tmp/walk/b"}),
            pathsOf(walkAll(kRoot, options)));
  EXPECT_EQ((Paths{"/tmp/walk/a/mount", "/tmp/walk/a/mount/inside"}),
            pathsOf(walkAll(mount, options)))
      << "the root decides which file system it is";
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/mount", "/tmp/walk/a/mount/inside",
                   "/tmp/walk/b"}),
            pathsOf(walkAll(kRoot)));
  EXPECT_EQ(0, ::umount(mount.c_str()));
}

TEST_F(TreeWalkTest, LeavesAMountPointTowardsItsFolder) {
  makeAll({"a/mount/", "b"});
  const std::string mount = kRoot + "/a/mount";
  ASSERT_EQ(0, ::mount("tmpfs", mount.c_str(), "tmpfs", 0, nullptr));
  make("a/mount/1/2/3/4/5/6"); // deep enough that the folders above are closed
  const Paths paths = pathsOf(walkAll(kRoot));
  EXPECT_EQ("/tmp/walk/b", paths.back());
  EXPECT_EQ(10U, paths.size());
  EXPECT_EQ(0, ::umount(mount.c_str()));
}

TEST_F(TreeWalkTest, DoesNotGiveWhatIsLeftOut) {
  makeAll({"a/b/c", "a/d", "ab", "e"});
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/d", "/tmp/walk/ab"}),
            pathsOf(walkAll(kRoot, leaveOut({"/tmp/walk/a/b", "/tmp/walk/e"}))));
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/ab", "/tmp/walk/e"}),
            pathsOf(walkAll(kRoot, leaveOut({"/tmp/walk/a//"}))));
}

TEST_F(TreeWalkTest, LeavesOutByThePathAsTheRootIsWritten) {
  makeAll({"a", "b"});
  EXPECT_EQ((Paths{"/tmp//walk", "/tmp//walk/b"}),
            pathsOf(walkAll("/tmp//walk", leaveOut({"/tmp//walk/a", "/tmp/walk/b"}))));
}

TEST_F(TreeWalkTest, GivesNothingWhenTheRootIsLeftOut) {
  make("a");
  EXPECT_EQ(Paths{}, pathsOf(walkAll(kRoot, leaveOut({"/tmp/walk/"}))));
  EXPECT_EQ(Paths{}, pathsOf(walkAll("/", leaveOut({"/"}))));
}

TEST_F(TreeWalkTest, LeavesOutNothingAboveItsRoot) {
  make("a");
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a"}), pathsOf(walkAll(kRoot, leaveOut({"/tmp", "/"}))));
}

TEST_F(TreeWalkCaches, AreNotEnteredOnDemand) {
  make("cache/CACHEDIR.TAG", kTag);
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/cache", "/tmp/walk/cache/CACHEDIR.TAG"}),
            pathsOf(walkAll(kRoot)));
  EXPECT_TRUE(isSkipped());
  make("cache/CACHEDIR.TAG", std::string(kTag) + "\n# more");
  EXPECT_TRUE(isSkipped());
}

TEST_F(TreeWalkCaches, AreMarkedByTheSignatureAlone) {
  const std::string tag = kTag;
  for (const std::string &text : {std::string(), tag.substr(0, tag.size() - 1), " " + tag,
                                  tag.substr(0, tag.size() - 1) + "6"}) {
    make("cache/CACHEDIR.TAG", text);
    EXPECT_FALSE(isSkipped()) << text;
  }
}

TEST_F(TreeWalkCaches, AreMarkedByARegularFileAlone) {
  make("tag", kTag);
  make("cache/");
  const std::string path = kRoot + "/cache/CACHEDIR.TAG";
  fs::create_symlink("../tag", path);
  EXPECT_FALSE(isSkipped());
  fs::remove(path);
  fs::create_directory(path);
  EXPECT_FALSE(isSkipped());
  fs::remove(path);
  ASSERT_EQ(0, ::mkfifo(path.c_str(), 0600)); // to open it would wait for a writer
  EXPECT_FALSE(isSkipped());
}

TEST_F(TreeWalkCaches, IncludeTheRoot) {
  make("CACHEDIR.TAG", kTag);
  WalkOptions options;
  options.skipCaches = true;
  EXPECT_EQ(Paths{"/tmp/walk"}, pathsOf(walkAll(kRoot, options)));
}
