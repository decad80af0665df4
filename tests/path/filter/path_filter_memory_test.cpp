// Memory: match allocates none, and a filter is unchanged when an allocation fails.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "tests/support/alloc_failure.h"

#include <gtest/gtest.h>
#include <list>
#include <string>
#include <vector>

using namespace KOVA::Backup;
using KovaTest::AllocFailure;
using KovaTest::forEachAllocation;

using Strings = std::list<std::string>;

namespace {

constexpr const char *kLongPattern = "/v/a long folder that no short string holds/*.log";

// Everything that a caller can observe of a filter.
struct View {
  Strings includes;
  Strings excludes;
  std::vector<bool> answers;
};

View viewOf(PathFilter &filter) {
  View view;
  filter.getIncludePattern(view.includes, "");
  filter.getExcludePattern(view.excludes, "");
  for (const char *path : {"/v/a long folder that no short string holds/x.log", "/v/b", "/v/c/d",
                           "/v/m/cache/n.tmp", "/z", "/v/q", "/v/b/c"}) {
    view.answers.push_back(filter.filterOut(path));
  }
  return view;
}

void expectSame(const View &expected, const View &view) {
  EXPECT_EQ(expected.includes, view.includes);
  EXPECT_EQ(expected.excludes, view.excludes);
  EXPECT_EQ(expected.answers, view.answers);
}

void fill(PathFilter &filter) {
  filter.addExcludePattern(kLongPattern);
  filter.addExcludePattern("/v/b");
  filter.addIncludePattern("/v/q");
}

TEST(PathFilterMemory, AFailedAddLeavesTheFilterAsItWas) {
  for (const char *pattern :
       {"/v/**", "/v/b*x/cache/*.tmp", "/v/another long folder/no string is/**", "**/cache/*.tmp",
        "", "\\"}) {
    PathFilter filter;
    PathFilter twin;
    fill(filter);
    fill(twin);
    const View before = viewOf(twin);
    twin.addExcludePattern(pattern);
    const View after = viewOf(twin);
    const std::string given = pattern;
    forEachAllocation([&] { filter.addExcludePattern(given); },
                      [&](bool threw) { expectSame(threw ? before : after, viewOf(filter)); });
  }
}

// Whatever room earlier patterns left: one that branches off an earlier one needs two places at
// once.
TEST(PathFilterMemory, AFailedAddOfABranchLeavesTheFilterAsItWas) {
  for (char last = 'a'; last <= 'p'; ++last) {
    PathFilter filter;
    PathFilter twin;
    for (char first = 'a'; first <= last; ++first) {
      filter.addExcludePattern(std::string("/v/") + first + "/old");
      twin.addExcludePattern(std::string("/v/") + first + "/old");
    }
    const View before = viewOf(twin);
    twin.addExcludePattern("/v/a/other");
    const View after = viewOf(twin);
    const std::string given = "/v/a/other";
    forEachAllocation([&] { filter.addExcludePattern(given); },
                      [&](bool threw) { expectSame(threw ? before : after, viewOf(filter)); });
  }
}

TEST(PathFilterMemory, AFailedAddOfAListLeavesListAndFilterAsTheyWere) {
  const Strings patterns{"**/cache/*.tmp",
                         "/v/another long folder, longer than a short string",
                         "/v/c/**",
                         "/v/q",
                         "/z",
                         "\\"};
  PathFilter filter;
  PathFilter twin;
  fill(filter);
  fill(twin);
  const View before = viewOf(twin);
  Strings copy = patterns;
  twin.addExcludePattern(copy);
  const View after = viewOf(twin);
  Strings given = patterns;
  forEachAllocation([&] { filter.addExcludePattern(given); },
                    [&](bool threw) {
                      EXPECT_EQ(threw ? patterns : Strings(), given);
                      expectSame(threw ? before : after, viewOf(filter));
                    });
}

TEST(PathFilterMemory, AFailedGetLeavesTheCallersListAsItWas) {
  PathFilter filter;
  fill(filter);
  for (const char *base : {"", "/v/a long folder that no short string holds"}) {
    Strings out{"old"};
    Strings expected = base[0] == '\0' ? Strings() : out;
    filter.getExcludePattern(expected, base);
    const std::string folder = base;
    forEachAllocation([&] { filter.getExcludePattern(out, folder); },
                      [&](bool threw) { EXPECT_EQ(threw ? Strings{"old"} : expected, out); });
  }
}

TEST(PathFilterMemory, MakingAFilterFailsCleanly) {
  forEachAllocation([] { const PathFilter filter; }, [](bool) {});
}

TEST(PathFilterMemory, AskingTakesNone) {
  PathFilter filter;
  fill(filter);
  for (const char *pattern : {"**/cache/*.tmp", "**", "/a?*", "/v/*/x/**/y"}) {
    filter.addIncludePattern(pattern);
  }
  const std::string path = "/v/m/a long name that no short string would hold/x/y";
  const AllocFailure failure(1);
  EXPECT_FALSE(filter.filterOut(path));
  EXPECT_FALSE(failure.fired());
}

TEST(PathFilterMemory, MatchTakesNone) {
  std::string pattern;
  std::string text;
  for (int i = 0; i < 500; ++i) {
    pattern += i % 2 == 0 ? "**a*?\\b" : "*a/";
    text += "ab/aab/a/";
  }
  const AllocFailure failure(1);
  (void)PathFilterPrivate::match(pattern.c_str(), text.c_str());
  (void)PathFilterPrivate::match("/v/**/*.log", text.c_str());
  EXPECT_FALSE(failure.fired());
}

TEST(PathFilterMemory, RebaseTakesNoneButForALongRest) {
  std::string rest;
  const AllocFailure failure(1);
  EXPECT_EQ(1, PathFilterPrivate::rebase("/v/*a*b*/c*d/*.txt", "/v/xaybz/cd", rest));
  EXPECT_EQ("/*.txt", rest);
  EXPECT_FALSE(failure.fired());
}

} // namespace
