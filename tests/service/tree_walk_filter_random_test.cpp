// Which entries a walk keeps, against asking PathFilter about every path of the tree, and which it
// gives, against asking the rules of the header about every folder above a path.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_rules.h"
#include "tests/service/tree_walk_support.h"

#include <algorithm>
#include <random>
#include <string>
#include <utility>
#include <vector>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

struct Patterns {
  Paths includes;
  Paths excludes;
};

void PrintTo(const Patterns &patterns, std::ostream *os) {
  *os << "includes " << testing::PrintToString(patterns.includes) << ", excludes "
      << testing::PrintToString(patterns.excludes);
}

class Inputs {
public:
  explicit Inputs(unsigned seed) : random_(seed) {}

  std::size_t below(std::size_t end) { return random_() % end; }

  // A tree of at most three levels whose names are made of the characters of patterns.
  void makeTree(const std::string &folder, int depth) {
    for (std::size_t left = 1 + below(4); left > 0; --left) {
      const std::string path = folder + "/" + pick(kNames);
      std::error_code taken;
      if (below(3) == 0) {
        std::ofstream file(path);
      } else if (fs::create_directory(path, taken) && depth > 1) {
        makeTree(path, depth - 1);
      }
    }
  }

  Patterns patterns() {
    Patterns made;
    fill(made.includes, below(4));
    fill(made.excludes, 1 + below(3));
    return made;
  }

private:
  void fill(Paths &list, std::size_t count) {
    while (count-- > 0) {
      std::string pattern = pick(kStarts);
      for (std::size_t left = below(7); left > 0; --left) {
        pattern += pick(kElements);
      }
      list.push_back(pattern);
    }
  }

  const std::string &pick(const Paths &from) { return from[below(from.size())]; }

  const Paths kNames{"a", "b", "ab", "ba", "aab", "*", "\\", "?"};
  const Paths kStarts{"/tmp/walk", "/tmp/walk", "/tmp/walk/", "/tmp/*/",     "**",
                      "/**/",      "/tmp**",    "/tmp/wal?",  "/tmp\\/walk", "/t*/w*"};
  const Paths kElements{"/", "/",  "/",   "a", "a",  "b",   "*",
                        "*", "**", "/**", "?", "\\", "\\/", "\\*"};
  std::mt19937 random_;
};

void listPlainly(const std::string &path, Paths &out) {
  out.push_back(path);
  if (fs::is_directory(fs::symlink_status(path))) {
    for (const fs::directory_entry &entry : fs::directory_iterator(path)) {
      listPlainly(entry.path().string(), out);
    }
  }
}

// The rules of the header, asked for every path and every folder above it.
class Oracle {
public:
  explicit Oracle(const Patterns &patterns) : includes_(patterns.includes) {
    for (const std::string &pattern : patterns.includes) {
      filter_.addIncludePattern(pattern);
    }
    for (const std::string &pattern : patterns.excludes) {
      filter_.addExcludePattern(pattern);
      if (endsInDoubleStar(pattern)) {
        open_.addExcludePattern(pattern);
      }
    }
  }

  PathFilter &filter() { return filter_; }

  // Whether a left-out folder above takes the path with it.
  bool isClosed(const std::string &path) {
    return isAnyAbove(path, [this](const std::string &folder) {
      return filter_.filterOut(folder) && !isIncludedBelow(folder);
    });
  }

  // Whether nothing below some folder above the path can be kept.
  bool isExcludedWithAll(const std::string &path) {
    return isAnyAbove(path, [this](const std::string &folder) {
      return open_.filterOut(folder + "/") && !isIncludedBelow(folder);
    });
  }

private:
  template <typename Claim>
  static bool isAnyAbove(const std::string &path, Claim claim) {
    for (std::size_t end = kTreeRoot.size(); end < path.size(); end = path.find('/', end + 1)) {
      if (claim(path.substr(0, end))) {
        return true;
      }
    }
    return false;
  }

  bool isIncludedBelow(const std::string &folder) const {
    return std::any_of(includes_.begin(), includes_.end(), [&](const std::string &pattern) {
      return reaches(pattern.c_str(), (folder + "/").c_str());
    });
  }

  static inline const std::string kTreeRoot = "/tmp/walk";
  PathFilter filter_;
  PathFilter open_; // the exclude patterns that end in "**"
  Paths includes_;
};

struct Tally {
  std::size_t cases = 0;
  std::size_t kept = 0;
  std::size_t leftOut = 0;
  std::size_t notGiven = 0;
};

class TreeWalkRandomly : public TreeWalkTest, public testing::WithParamInterface<unsigned> {
protected:
  void compare(const Paths &all, const Patterns &patterns, bool leftOutCloses) {
    Oracle oracle(patterns);
    Paths kept;
    Paths given;
    for (const std::string &path : all) {
      const bool isClosed = leftOutCloses && oracle.isClosed(path);
      if (!isClosed && !oracle.filter().filterOut(path)) {
        kept.push_back(path);
      }
      if (!isClosed && !oracle.isExcludedWithAll(path)) {
        given.push_back(path);
      }
    }
    const auto [keptByWalk, givenByWalk] = walk(oracle.filter(), leftOutCloses);
    ASSERT_EQ(kept, keptByWalk) << testing::PrintToString(patterns) << " " << leftOutCloses;
    ASSERT_EQ(given, givenByWalk) << testing::PrintToString(patterns) << " " << leftOutCloses;
    ++tally_.cases;
    tally_.kept += kept.size();
    tally_.leftOut += given.size() - kept.size();
    tally_.notGiven += all.size() - given.size();
  }

  // The paths that are kept, and all that are given, in byte order.
  static std::pair<Paths, Paths> walk(PathFilter &filter, bool leftOutCloses) {
    WalkOptions options;
    options.leftOutCloses = leftOutCloses;
    Paths kept;
    Paths given;
    for (const WalkEntry &entry : walkAll(kRoot, filter, options)) {
      given.push_back(entry.path);
      if (entry.kept) {
        kept.push_back(entry.path);
      }
    }
    std::sort(kept.begin(), kept.end());
    std::sort(given.begin(), given.end());
    return {kept, given};
  }

  Tally tally_;
};

} // namespace

TEST_P(TreeWalkRandomly, KeepsWhatTheFilterKeepsPathByPath) {
  constexpr int kTrees = 25;
  constexpr int kFilters = 500;
  SCOPED_TRACE("seed " + std::to_string(GetParam()));
  Inputs inputs(GetParam());
  for (int tree = 0; tree < kTrees; ++tree) {
    inputs.makeTree(kRoot, 3);
    Paths all;
    listPlainly(kRoot, all);
    std::sort(all.begin(), all.end());
    for (int i = 0; i < kFilters; ++i) {
      const Patterns patterns = inputs.patterns();
      ASSERT_NO_FATAL_FAILURE(compare(all, patterns, true));
      ASSERT_NO_FATAL_FAILURE(compare(all, patterns, false));
    }
    fs::remove_all(kRoot);
    fs::create_directory(kRoot);
  }
  // No outcome is so rare that the comparison says little.
  const std::size_t paths = tally_.kept + tally_.leftOut + tally_.notGiven;
  EXPECT_EQ(2U * kTrees * kFilters, tally_.cases);
  EXPECT_LT(paths / 20, tally_.kept);
  EXPECT_LT(paths / 20, tally_.leftOut);
  EXPECT_LT(paths / 20, tally_.notGiven);
}

INSTANTIATE_TEST_SUITE_P(Seeds, TreeWalkRandomly, testing::Values(1U, 2U, 3U, 4U, 5U, 6U, 7U, 8U));
