// The filter's answer, which comes from its indexes, against a plain walk over both lists.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "tests/path/filter/path_filter_oracle.h"
#include "tests/path/filter/path_filter_tree.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <iterator>
#include <list>
#include <random>
#include <string>
#include <vector>

using namespace KOVA::Backup;
namespace Oracle = KovaTest::Oracle;
namespace Tree = KovaTest::Tree;

using Strings = std::list<std::string>;

namespace {

class Inputs {
public:
  explicit Inputs(unsigned seed) : random_(seed) {}

  std::size_t below(std::size_t end) { return random_() % end; }

  std::string pattern() {
    std::string all;
    for (std::size_t left = below(9); left > 0; --left) {
      all += pick(kElements);
    }
    return all;
  }

  // A text that the pattern often matches: wildcards are filled in, then some bytes may be changed.
  std::string pathLike(const std::string &pattern) {
    std::string all;
    for (std::size_t at = 0; at < pattern.size(); ++at) {
      if (pattern[at] == '*' || pattern[at] == '?') {
        all += pick(kFillings);
      } else if (pattern[at] != '\\') {
        all += pattern[at];
      }
    }
    if (below(4) == 0 && !all.empty()) {
      all[below(all.size())] = pick(kElements)[0];
    }
    return all;
  }

  // Patterns are added in turn one by one and in lists, since a caller may do both.
  template <typename Add, typename AddAll>
  Strings fill(std::size_t most, Add add, AddAll addAll) {
    Strings all;
    for (std::size_t left = below(most + 1); left > 0; --left) {
      all.push_back(pattern());
      if (below(3) == 0) {
        Strings two{all.back(), pattern()};
        all.push_back(two.back());
        addAll(two);
      } else {
        add(all.back());
      }
    }
    return all;
  }

private:
  const std::string &pick(const std::vector<std::string> &from) { return from[below(from.size())]; }

  const std::vector<std::string> kElements{"/",  "/",    "a",  "b",   "ab",  "cache",    ".c",
                                           "*",  "*",    "**", "**/", "/**", "?",        "\\*",
                                           "\\", "\\\\", "x",  "/*",  "*.",  "\xc3\xa9", "***"};
  const std::vector<std::string> kFillings{"", "", "a", "b", "/", "x/y", "cache", "*", ".c"};
  std::mt19937 random_;
};

struct Tally {
  std::size_t cases = 0;
  std::size_t leftOut = 0;
};

void compare(PathFilter &filter, const Strings &includes, const Strings &excludes,
             const std::string &path, Tally &tally) {
  const bool expected = Oracle::filterOut(includes, excludes, path);
  ASSERT_EQ(expected, filter.filterOut(path))
      << "path [" << path << "], includes " << testing::PrintToString(includes) << ", excludes "
      << testing::PrintToString(excludes);
  ++tally.cases;
  tally.leftOut += expected ? 1 : 0;
}

void compareFilters(unsigned seed, int filters, std::size_t mostPatterns, int pathsEach,
                    Tally &tally) {
  SCOPED_TRACE("seed " + std::to_string(seed));
  Inputs inputs(seed);
  for (int round = 0; round < filters; ++round) {
    PathFilter filter;
    const Strings includes = inputs.fill(
        mostPatterns / 4, [&](const std::string &one) { filter.addIncludePattern(one); },
        [&](Strings &many) { filter.addIncludePattern(many); });
    const Strings excludes = inputs.fill(
        mostPatterns, [&](const std::string &one) { filter.addExcludePattern(one); },
        [&](Strings &many) { filter.addExcludePattern(many); });
    const std::vector<std::string> likes(excludes.begin(), excludes.end());
    for (int i = 0; i < pathsEach; ++i) {
      const bool like = !likes.empty() && inputs.below(8) != 0;
      const std::string path =
          inputs.pathLike(like ? likes[inputs.below(likes.size())] : inputs.pattern());
      ASSERT_NO_FATAL_FAILURE(compare(filter, includes, excludes, path, tally));
    }
  }
}

// Both answers are common enough for the comparison to be meaningful.
void expectBothAnswers(const Tally &tally) {
  EXPECT_LT(tally.cases / 20, tally.leftOut);
  EXPECT_LT(tally.leftOut, tally.cases - tally.cases / 20);
}

class RandomFilters : public testing::TestWithParam<unsigned> {};

TEST_P(RandomFilters, AnswerAsThePlainWalk) {
  Tally tally;
  compareFilters(GetParam(), 5000, 8, 100, tally);
  EXPECT_EQ(500000U, tally.cases);
  expectBothAnswers(tally);
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomFilters, testing::Values(1U, 2U, 3U, 4U, 5U, 6U));

TEST(LargeRandomFilters, AnswerAsThePlainWalk) {
  Tally tally;
  compareFilters(20240602, 150, 400, 100, tally);
  EXPECT_EQ(15000U, tally.cases);
  expectBothAnswers(tally);
}

TEST(GrowingRandomFilters, AnswerAsThePlainWalkWhileTheyGrow) {
  Inputs inputs(20240603);
  for (int round = 0; round < 200; ++round) {
    PathFilter filter;
    Strings excludes;
    Tally tally;
    for (int i = 0; i < 50; ++i) {
      excludes.push_back(inputs.pattern());
      filter.addExcludePattern(excludes.back());
      const auto any =
          std::next(excludes.begin(), static_cast<long>(inputs.below(excludes.size())));
      ASSERT_NO_FATAL_FAILURE(compare(filter, {}, excludes, inputs.pathLike(*any), tally));
    }
  }
}

TEST(AllSmallPatterns, AloneInAFilterAnswerAsThePlainWalk) {
  Strings patterns(1);
  for (auto at = patterns.begin(); at != patterns.end() && at->size() < 4; ++at) {
    for (const char byte : std::string("a/*?\\")) {
      patterns.push_back(*at + byte);
    }
  }
  const std::vector<std::string> paths{
      "",  "a",  "/",    "*",   "\\",  "aa", "a/", "/a", "//",  "a/a", "aaa",  "/a/", "a//a",
      "?", "a*", "/aa/", "a\\", "*/*", "b",  "ab", "ba", "a/b", "b/a", "aaaa", "a/aa"};
  EXPECT_EQ(781U, patterns.size());
  Tally tally;
  for (const std::string &pattern : patterns) {
    PathFilter filter;
    filter.addExcludePattern(pattern);
    for (const std::string &path : paths) {
      ASSERT_NO_FATAL_FAILURE(compare(filter, {}, {pattern}, path, tally));
    }
  }
}

// The plain walk with the library's own match, which the oracle has confirmed elsewhere: the oracle
// itself would take minutes for so many patterns and paths.
bool matchesOne(const Strings &patterns, const std::string &path) {
  return std::any_of(patterns.begin(), patterns.end(), [&path](const std::string &pattern) {
    return PathFilterPrivate::match(pattern.c_str(), path.c_str()) == 1;
  });
}

struct TreeCase {
  int patterns;
  std::size_t leftOut;
  std::size_t comparedEvery; // the plain walk with many patterns is slow: one path in so many
};

void PrintTo(const TreeCase &c, std::ostream *os) {
  *os << c.patterns << " patterns";
}

class RealisticTree : public testing::TestWithParam<TreeCase> {};

// The counts come from the plain walk over all paths (the benchmark compares every one). If they
// change, what backups leave out has changed.
TEST_P(RealisticTree, LosesExactlyWhatThePlainWalkLeavesOut) {
  PathFilter filter;
  const Strings includes{"**/semver/**", "/volume1/photo/2010/**", "**/report 1*"};
  Strings excludes;
  for (const std::string &include : includes) {
    filter.addIncludePattern(include);
  }
  for (int i = 0; i < GetParam().patterns; ++i) {
    excludes.push_back(Tree::pattern(i));
    filter.addExcludePattern(excludes.back());
  }
  std::size_t leftOut = 0;
  const std::vector<std::string> paths = Tree::paths();
  for (std::size_t at = 0; at < paths.size(); ++at) {
    const bool answer = filter.filterOut(paths[at]);
    if (at % GetParam().comparedEvery == 0) {
      ASSERT_EQ(!matchesOne(includes, paths[at]) && matchesOne(excludes, paths[at]), answer)
          << paths[at];
    }
    leftOut += answer ? 1 : 0;
  }
  EXPECT_EQ(GetParam().leftOut, leftOut);
}

INSTANTIATE_TEST_SUITE_P(Patterns, RealisticTree,
                         testing::Values(TreeCase{10, 1199, 1}, TreeCase{100, 1365, 1},
                                         TreeCase{1000, 2527, 7}, TreeCase{10000, 3118, 97}));

TEST(RealisticTree, HasThePathsThatTheCountsAreAbout) {
  EXPECT_EQ(17525U, Tree::paths().size());
}

} // namespace
