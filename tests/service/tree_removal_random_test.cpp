// Random trees, of which some entries cannot be removed, against removeAll and a plain
// transcription: what is left, and what is answered.

#include "kovabackup/path_util.h"

#include "tests/service/tree_removal_support.h"
#include "tests/support/log_capture.h"

#include <random>
#include <set>
#include <sys/stat.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

// The same tree below any root for the same seed.
class RandomTree {
public:
  RandomTree(std::string root, unsigned seed) : root_(std::move(root)), random_(seed) {
    fs::create_directory(root_);
    folders_.push_back(root_);
    for (auto count = random_() % 60; count > 0; --count) {
      add();
    }
    for (const std::string &path : fixed_) {
      EXPECT_TRUE(setImmutable(path, true));
    }
  }
  ~RandomTree() {
    for (const std::string &path : fixed_) {
      EXPECT_TRUE(setImmutable(path, false));
    }
    fs::remove_all(root_);
  }
  RandomTree(const RandomTree &) = delete;
  RandomTree &operator=(const RandomTree &) = delete;

  // What stays by the plain rules: what cannot be removed, what is directly in an immutable folder,
  // and the folders that lead to one of both. Without the root.
  Paths expectedRest() const {
    std::set<std::string> rest(fixed_.begin(), fixed_.end());
    for (const std::string &path : entries_) {
      if (fixed_.count(fs::path(path).parent_path()) != 0) {
        rest.insert(path);
      }
    }
    for (const std::string &path : std::set<std::string>(rest)) {
      for (fs::path above = path; above != fs::path(root_).parent_path();
           above = above.parent_path()) {
        rest.insert(above);
      }
    }
    return relative(Paths(rest.begin(), rest.end()));
  }

  Paths rest() const { return relative(pathsIn(root_)); }

private:
  void add() {
    const std::string path =
        folders_[random_() % folders_.size()] + "/" + std::to_string(entries_.size());
    const auto kind = random_() % 8;
    if (kind < 4) {
      fs::create_directory(path);
      folders_.push_back(path);
    } else if (kind == 4) {
      fs::create_directory_symlink("/tmp", path);
    } else if (kind == 5) {
      EXPECT_EQ(0, ::mkfifo(path.c_str(), 0600));
    } else {
      makeEntry("", path);
    }
    entries_.push_back(path);
    if ((kind < 4 || kind > 5) && random_() % 16 == 0) {
      fixed_.insert(path);
    }
  }

  Paths relative(Paths paths) const {
    for (std::string &path : paths) {
      path.erase(0, root_.size());
    }
    return paths;
  }

  std::string root_;
  std::mt19937 random_;
  Paths folders_;
  Paths entries_;
  std::set<std::string> fixed_;
};

} // namespace

TEST_F(TreeRemovalTest, LeavesWhatRemoveAllLeaves) {
  make("probe");
  if (!setImmutable(kRoot + "/probe", true)) {
    GTEST_SKIP() << "skipped: no immutable files here";
  }
  ASSERT_TRUE(setImmutable(kRoot + "/probe", false));
  int complete = 0;
  for (unsigned seed = 1; seed <= 500; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    const RandomTree one("/tmp/tree/one", seed);
    const RandomTree other("/tmp/tree/other", seed);
    const Outcome outcome = removeTree("/tmp/tree/one");
    {
      LogCapture log; // of the first failure of removeAll
      ASSERT_EQ(outcome.gone, KOVA::Backup::removeAll("/tmp/tree/other"));
    }
    ASSERT_EQ(one.rest(), other.rest());
    ASSERT_EQ(one.expectedRest(), one.rest());
    ASSERT_EQ(outcome.gone, outcome.failures.empty());
    complete += outcome.gone ? 1 : 0;
  }
  EXPECT_LT(50, complete);
  EXPECT_GT(450, complete);
}
