// The path filter: typical patterns of users, and patterns and paths that are made to be slow. The
// size is that of the path in bytes unless a comment says otherwise.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "tests/counts/counted.h"
#include "tests/path/filter/path_filter_tree.h"

namespace KovaCounts {
namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::PathFilterPrivate;
using Strings = std::list<std::string>;

constexpr std::size_t kEvery = 170; // of the typical paths, some 100

void addTypical(PathFilter &filter, std::size_t patterns) {
  for (std::size_t i = 0; i < patterns; ++i) {
    filter.addExcludePattern(KovaTest::Tree::pattern(static_cast<int>(i)));
  }
}

std::size_t leftOut(PathFilter &filter, const std::vector<std::string> &paths) {
  std::size_t count = 0;
  for (std::size_t i = 0; i < paths.size(); i += kEvery) {
    if (filter.filterOut(paths[i])) {
      ++count;
    }
  }
  return count;
}

// The size is the number of patterns. The first question is part of the cost, since a filter may
// leave a part of the building to it.
void build(std::size_t patterns) {
  Strings texts;
  for (std::size_t i = 0; i < patterns; ++i) {
    texts.push_back(KovaTest::Tree::pattern(static_cast<int>(i)));
  }
  count([&] {
    PathFilter filter;
    for (const std::string &text : texts) {
      filter.addExcludePattern(text);
    }
    return filter.filterOut("/volume1/homes/user00/Documents/a");
  });
}

// The size is the number of patterns. Few of them concern any one path.
void ask(std::size_t patterns) {
  const std::vector<std::string> paths = KovaTest::Tree::paths();
  PathFilter filter;
  addTypical(filter, patterns);
  const std::size_t expected = leftOut(filter, paths);
  count([&] { return leftOut(filter, paths) == expected && expected > 0; });
}

// The size is the number of patterns, all of which concern the path.
void askEqual(std::size_t patterns) {
  PathFilter filter;
  for (std::size_t i = 0; i < patterns; ++i) {
    filter.addExcludePattern("**aaaa*a?");
  }
  const std::string path = std::string(1000, 'a') + "/";
  count([&] { return !filter.filterOut(path); });
}

// The size is the number of patterns.
void excludePatterns(std::size_t patterns) {
  PathFilter filter;
  addTypical(filter, patterns);
  count([&] {
    Strings out;
    return filter.getExcludePattern(out, "/volume1/homes/user00") && !out.empty();
  });
}

void excludePatternsOfLongBase(std::size_t bytes) {
  PathFilter filter;
  for (const char *pattern : {"/*a*b/**", "**/a/**", "**a*", "/a*a*a*a*a*/b"}) {
    filter.addExcludePattern(pattern);
  }
  const std::string base = "/" + std::string(bytes, 'a');
  count([&] {
    Strings out;
    return filter.getExcludePattern(out, base) && !out.empty();
  });
}

struct Hostile {
  Strings patterns;
  std::string unit; // of the path
  std::string end;  // of the path; what the patterns require there
};

void askLong(const Hostile &hostile, std::size_t bytes) {
  PathFilter filter;
  for (const std::string &pattern : hostile.patterns) {
    filter.addExcludePattern(pattern);
  }
  const std::string path = "/" + repeated(hostile.unit, bytes / hostile.unit.size()) + hostile.end;
  count([&] { return !filter.filterOut(path); });
}

std::string manyStars() {
  return "**" + repeated("*a", 60) + "b";
}

Strings pairs() {
  Strings all;
  for (const char one : std::string("abcdefghij")) {
    for (const char other : std::string("bcdefghijk")) {
      all.push_back(std::string("**") + one + "*" + other + "*");
    }
  }
  return all;
}

void askStars(std::size_t bytes) {
  askLong({{"**a*a*b"}, "a", "/b"}, bytes);
}
void askManyStars(std::size_t bytes) {
  askLong({{manyStars()}, "a", "/b"}, bytes);
}
void askComponents(std::size_t bytes) {
  askLong({{manyStars()}, "aaaaaaaa/", "b"}, bytes);
}
void askManyMarks(std::size_t bytes) {
  askLong({{"**a????????????????????????b**"}, "aac/", ""}, bytes);
}
void askLongInfix(std::size_t bytes) {
  askLong({{"**" + std::string(50, 'a') + "b**c*"}, "a", ""}, bytes);
}
void askPairs(std::size_t bytes) {
  askLong({pairs(), "a", "/b"}, bytes);
}

void matchText(std::size_t bytes) {
  const std::string pattern = manyStars();
  const std::string text(bytes, 'a');
  count([&] { return PathFilterPrivate::match(pattern.c_str(), text.c_str()) != 1; });
}

// The size is that of the pattern.
void matchPattern(std::size_t bytes) {
  const std::string pattern = "**" + repeated("*a?", bytes / 3) + "b";
  const std::string text(1000, 'a');
  count([&] { return PathFilterPrivate::match(pattern.c_str(), text.c_str()) != 1; });
}

void rebase(std::size_t bytes) {
  const std::string base = "/" + std::string(bytes, 'a') + "/b";
  count([&] {
    std::string rest;
    return PathFilterPrivate::rebase("/*a*a*a/b/c", base.c_str(), rest) == 1;
  });
}

constexpr Case kCases[] = {
    {"PathFilter.build", build, {10, 1000}, 1000},
    {"PathFilter.ask", ask, {10, 1000}, 1000, kNearlyConstant},
    {"PathFilter.ask.equal", askEqual, {100}, 100},
    {"PathFilter.ask.stars", askStars, {2000}, 4000},
    {"PathFilter.ask.manyStars", askManyStars, {2000}, 4000},
    {"PathFilter.ask.components", askComponents, {2000}, 4000},
    {"PathFilter.ask.manyMarks", askManyMarks, {2000}, 4000},
    {"PathFilter.ask.longInfix", askLongInfix, {2000}, 4000},
    {"PathFilter.ask.pairs", askPairs, {2000}, 4000},
    {"PathFilter.getExcludePattern", excludePatterns, {10, 1000}, 1000},
    {"PathFilter.getExcludePattern.longBase", excludePatternsOfLongBase, {200}, 4000},
    {"PathFilter.match", matchText, {200}, 4000},
    {"PathFilter.match.pattern", matchPattern, {60}, 1200},
    {"PathFilter.rebase", rebase, {200}, 4000},
};

} // namespace

Cases filterCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
