#include "kovabackup/path_filter.h"

#include <gmock/gmock.h>
#include <list>
#include <stdexcept>
#include <string>
#include <type_traits>

using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

using Strings = std::list<std::string>;

namespace {

static_assert(!std::is_copy_constructible<PathFilter>::value, "the handle owns its patterns");
static_assert(!std::is_copy_assignable<PathFilter>::value, "the handle owns its patterns");

Strings includesOf(PathFilter &filter) {
  Strings out;
  EXPECT_TRUE(filter.getIncludePattern(out, ""));
  return out;
}

Strings excludesOf(PathFilter &filter) {
  Strings out;
  EXPECT_TRUE(filter.getExcludePattern(out, ""));
  return out;
}

// Both lists behave alike: each test of them runs for both.
struct List {
  const char *name;
  bool (PathFilter::*add)(const std::string &);
  bool (PathFilter::*addAll)(Strings &);
  bool (PathFilter::*get)(Strings &, const std::string &);
};

void PrintTo(const List &list, std::ostream *os) {
  *os << list.name;
}

class EachList : public testing::TestWithParam<List> {
protected:
  bool add(const std::string &pattern) { return (filter_.*GetParam().add)(pattern); }
  bool addAll(Strings &patterns) { return (filter_.*GetParam().addAll)(patterns); }
  bool get(Strings &out, const std::string &base) { return (filter_.*GetParam().get)(out, base); }
  Strings all() {
    Strings out;
    EXPECT_TRUE(get(out, ""));
    return out;
  }

  PathFilter filter_;
};

INSTANTIATE_TEST_SUITE_P(
    PathFilter, EachList,
    testing::Values(List{"include", &PathFilter::addIncludePattern, &PathFilter::addIncludePattern,
                         &PathFilter::getIncludePattern},
                    List{"exclude", &PathFilter::addExcludePattern, &PathFilter::addExcludePattern,
                         &PathFilter::getExcludePattern}),
    [](const auto &list) { return std::string(list.param.name); });

TEST_P(EachList, IsEmptyAtFirst) {
  EXPECT_THAT(all(), IsEmpty());
}

TEST_P(EachList, AppendsSinglePatternsAndKeepsDuplicates) {
  EXPECT_TRUE(add("/b"));
  EXPECT_TRUE(add("/a"));
  EXPECT_TRUE(add("/b"));
  EXPECT_TRUE(add(""));
  EXPECT_THAT(all(), ElementsAre("/b", "/a", "/b", ""));
}

TEST_P(EachList, MergesListsInByteOrderAndEmptiesTheCallers) {
  add("/b");
  add("/d");
  Strings more{"/a", "/c", "/\xc3\xa9"};
  EXPECT_TRUE(addAll(more));
  EXPECT_THAT(more, IsEmpty());
  EXPECT_THAT(all(), ElementsAre("/a", "/b", "/c", "/d", "/\xc3\xa9"));
}

TEST_P(EachList, MergesEqualPatternsBehindThoseThatAreThere) {
  add("/a");
  Strings more{"/a", "/a"};
  EXPECT_TRUE(addAll(more));
  EXPECT_THAT(all(), ElementsAre("/a", "/a", "/a"));
}

TEST_P(EachList, MergesListsOutOfOrderAsTheStandardMergeDoes) {
  Strings expected{"/m", "/c"};
  for (const std::string &pattern : expected) {
    add(pattern);
  }
  Strings more{"/z", "/a"};
  Strings same = more;
  expected.merge(same);
  EXPECT_TRUE(addAll(more));
  EXPECT_EQ(expected, all());
}

TEST_P(EachList, MergesAnEmptyList) {
  add("/a");
  Strings none;
  EXPECT_TRUE(addAll(none));
  EXPECT_THAT(all(), ElementsAre("/a"));
}

TEST_P(EachList, IsCopiedWholeInPlaceOfWhatTheCallersListHeldWithoutABase) {
  add("/b");
  add("\\");
  add("/a");
  Strings out{"old"};
  EXPECT_TRUE(get(out, ""));
  EXPECT_THAT(out, ElementsAre("/b", "\\", "/a"));
}

TEST_P(EachList, IsAppendedRebasedInListOrderWithABase) {
  for (const char *pattern :
       {"/v/s/dir/sub/*.txt", "/v/other/x", "/v/s/dir", "/v/**/*.log", "/v/s/*/x"}) {
    add(pattern);
  }
  Strings out{"old"};
  EXPECT_TRUE(get(out, "/v/s/dir"));
  EXPECT_THAT(out, ElementsAre("old", "/dir/sub/*.txt", "/dir", "/dir/**/*.log", "/dir/x"));
}

TEST_P(EachList, TakesAListsOwnElementAsBase) {
  add("/v/s/x");
  Strings out{"/v/s"};
  EXPECT_TRUE(get(out, out.front()));
  EXPECT_THAT(out, ElementsAre("/v/s", "/s/x"));
  out = {""};
  EXPECT_TRUE(get(out, out.front()));
  EXPECT_THAT(out, ElementsAre("/v/s/x"));
}

TEST_P(EachList, ThrowsOnABaseWithoutSlashAndLeavesTheCallersListAlone) {
  for (const bool applies : {true, false}) {
    add(applies ? "dir/x" : "/other");
    Strings out{"old"};
    try {
      get(out, "dir");
      ADD_FAILURE() << "nothing was thrown";
    } catch (const std::out_of_range &error) {
      EXPECT_STREQ("basic_string::substr", error.what());
    }
    EXPECT_THAT(out, ElementsAre("old"));
  }
}

TEST_P(EachList, BaseWithTrailingSlashHasAnEmptyLastComponent) {
  add("/v/s/x");
  add("/v/s/**");
  Strings out;
  EXPECT_TRUE(get(out, "/v/s/"));
  EXPECT_THAT(out, ElementsAre("//**")); // "/v/s/x" has no "/" where the base ends
}

TEST_P(EachList, BaseRootKeepsWhatBeginsAnew) {
  add("//x");
  add("/x");
  add("**.c");
  Strings out;
  EXPECT_TRUE(get(out, "/"));
  EXPECT_THAT(out, ElementsAre("//x", "//**.c"));
}

TEST(PathFilter, EmptyOneLeavesNothingOut) {
  PathFilter filter;
  for (const char *path : {"", "/", "/a", "*", "/a/b/c"}) {
    EXPECT_FALSE(filter.filterOut(path)) << path;
  }
}

TEST(PathFilter, WithIncludesAloneLeavesNothingOut) {
  PathFilter filter;
  filter.addIncludePattern("/a");
  EXPECT_FALSE(filter.filterOut("/a"));
  EXPECT_FALSE(filter.filterOut("/b"));
}

TEST(PathFilter, LeavesOutWhatAnyExcludeMatches) {
  PathFilter filter;
  filter.addExcludePattern("/a");
  filter.addExcludePattern("/b/*");
  filter.addExcludePattern("**.tmp");
  EXPECT_TRUE(filter.filterOut("/a"));
  EXPECT_TRUE(filter.filterOut("/b/x"));
  EXPECT_TRUE(filter.filterOut("/c/d.tmp"));
  EXPECT_FALSE(filter.filterOut("/b/x/y"));
  EXPECT_FALSE(filter.filterOut("/c"));
}

TEST(PathFilter, IncludeWinsWheneverItWasAdded) {
  PathFilter filter;
  filter.addIncludePattern("/a/b/**");
  filter.addExcludePattern("/a/**");
  filter.addIncludePattern("/a/z");
  EXPECT_FALSE(filter.filterOut("/a/b/c"));
  EXPECT_FALSE(filter.filterOut("/a/z"));
  EXPECT_TRUE(filter.filterOut("/a/c"));
}

TEST(PathFilter, OutcomesOtherThanAMatchCountAsNone) {
  PathFilter filter;
  filter.addExcludePattern("abc"); // -1 on "ab"
  filter.addExcludePattern("*c");  // -2 on "a/b"
  EXPECT_FALSE(filter.filterOut("ab"));
  EXPECT_FALSE(filter.filterOut("a/b"));
}

TEST(PathFilter, EmptyPatternMatchesTheEmptyPathOnly) {
  PathFilter filter;
  filter.addExcludePattern("");
  EXPECT_TRUE(filter.filterOut(""));
  EXPECT_FALSE(filter.filterOut("/"));
}

TEST(PathFilter, PatternsEndingInAnOddBackslashMatchNothing) {
  PathFilter filter;
  filter.addExcludePattern("/a\\");
  filter.addExcludePattern("\\");
  filter.addExcludePattern("**\\");
  for (const char *path : {"", "/a", "/a\\", "\\", "/ab"}) {
    EXPECT_FALSE(filter.filterOut(path)) << path;
  }
  EXPECT_THAT(excludesOf(filter), ElementsAre("/a\\", "\\", "**\\"));
}

TEST(PathFilter, PatternAndPathEndAtTheirFirstNul) {
  PathFilter filter;
  filter.addExcludePattern(std::string("/a\0b", 4));
  filter.addExcludePattern(std::string("/c/*\0.x", 7));
  EXPECT_TRUE(filter.filterOut("/a"));
  EXPECT_TRUE(filter.filterOut(std::string("/a\0zzz", 6)));
  EXPECT_FALSE(filter.filterOut("/ab"));
  EXPECT_TRUE(filter.filterOut("/c/d"));
  EXPECT_THAT(excludesOf(filter), ElementsAre(std::string("/a\0b", 4), std::string("/c/*\0.x", 7)));
}

TEST(PathFilter, ListsAreMatchedLikeSinglePatterns) {
  PathFilter filter;
  Strings excludes{"**.tmp", "/a/**", "/z"};
  Strings includes{"/a/keep", "/b"};
  filter.addExcludePattern("/m");
  filter.addExcludePattern(excludes);
  filter.addIncludePattern(includes);
  for (const char *path : {"/x.tmp", "/a/b", "/z", "/m"}) {
    EXPECT_TRUE(filter.filterOut(path)) << path;
  }
  EXPECT_FALSE(filter.filterOut("/a/keep"));
  EXPECT_FALSE(filter.filterOut("/b"));
}

TEST(PathFilter, OutlivesTheListsItWasGiven) {
  PathFilter filter;
  {
    Strings excludes{std::string(100, 'x') + "*", "/a"};
    filter.addExcludePattern(excludes);
    excludes = {"/other"};
  }
  EXPECT_TRUE(filter.filterOut(std::string(100, 'x') + "y"));
  EXPECT_TRUE(filter.filterOut("/a"));
  EXPECT_FALSE(filter.filterOut("/other"));
}

TEST(PathFilter, AWalkerCanAskWhetherAnExcludedFolderHoldsIncludedPaths) {
  PathFilter filter;
  filter.addExcludePattern("/v/photo/**");
  filter.addExcludePattern("/v/music");
  filter.addIncludePattern("/v/photo/raw/*.raw");
  const auto mayHoldIncluded = [&filter](const std::string &folder) {
    Strings below;
    filter.getIncludePattern(below, folder);
    return !below.empty();
  };
  EXPECT_TRUE(mayHoldIncluded("/v/photo"));
  EXPECT_TRUE(mayHoldIncluded("/v/photo/raw"));
  EXPECT_FALSE(mayHoldIncluded("/v/photo/jpeg"));
  EXPECT_FALSE(mayHoldIncluded("/v/music"));
  EXPECT_THAT(includesOf(filter), ElementsAre("/v/photo/raw/*.raw"));
}

} // namespace
