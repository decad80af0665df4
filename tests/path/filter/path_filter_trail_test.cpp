// Trails of copies of an index, and what a trail remembers. path_filter_walk_test shows that the
// answers of filters agree with a plain walk.

#include "path/filter/path_filter_private.h"
#include "path/filter/pattern_index.h"
#include "path/filter/trail.h"

#include <gtest/gtest.h>
#include <string>
#include <utility>

using namespace KOVA::PatternSearch;
using KOVA::Backup::PathFilterPrivate;

namespace {

// Twice, since only the second path in a row makes a trail turn to a folder.
bool matches(const PatternIndex &index, const std::string &text) {
  bool answer = false;
  for (int i = 0; i < 3; ++i) {
    Trail &trail = Trail::turnedTo(text, index.id());
    answer = trail.settled() || index.anyMatches(text, &PathFilterPrivate::match, trail);
  }
  return answer;
}

TEST(PatternIndexId, BelongsToOneStateOfOneIndex) {
  PatternIndex one;
  PatternIndex other;
  one.add("/a");
  other.add("/a");
  EXPECT_NE(one.id(), other.id());
  const auto before = one.id();
  one.add("/b");
  EXPECT_NE(before, one.id());
  one.shrink(1);
  EXPECT_NE(before, one.id());
}

TEST(Trail, OfACopyFollowsTheCopy) {
  PatternIndex index;
  index.add("/v/a/x*");
  EXPECT_FALSE(matches(index, "/v/a/b"));
  PatternIndex copy = index;
  EXPECT_FALSE(matches(copy, "/v/a/b"));
  copy.add("/v/a/**");
  EXPECT_TRUE(matches(copy, "/v/a/b"));
  EXPECT_FALSE(matches(index, "/v/a/b"));
  index = copy;
  EXPECT_TRUE(matches(index, "/v/a/b"));
  index.shrink(1);
  EXPECT_FALSE(matches(index, "/v/a/b"));
  EXPECT_TRUE(matches(copy, "/v/a/b"));
}

TEST(Trail, OfAMovedIndexGoesWithIt) {
  PatternIndex index;
  index.add("/v/a/**");
  EXPECT_TRUE(matches(index, "/v/a/b"));
  PatternIndex moved = std::move(index);
  EXPECT_TRUE(matches(moved, "/v/a/b"));
  EXPECT_FALSE(matches(moved, "/v/b/b"));
  index = PatternIndex();
  index.add("/v/b/**");
  EXPECT_FALSE(matches(index, "/v/a/b"));
  EXPECT_TRUE(matches(index, "/v/b/b"));
}

TEST(Trail, KnowsThatAFolderIsSettled) {
  PatternIndex index;
  index.add("/v/a/**");
  index.add("**/tmp/**");
  for (const char *text : {"/v/a/b", "/v/tmp/b"}) {
    EXPECT_TRUE(matches(index, text));
    EXPECT_TRUE(Trail::turnedTo(text, index.id()).settled());
  }
  EXPECT_TRUE(matches(index, "/v/tmp/b/c"));
  EXPECT_TRUE(Trail::turnedTo("/v/tmp/b/c", index.id()).settled());
  EXPECT_FALSE(Trail::turnedTo("/v/tm", index.id()).settled());
}

// Patterns that match one path of a folder but perhaps not the next.
TEST(Trail, DoesNotTakeAFolderForSettled) {
  for (const char *pattern : {"/v/a/*", "/v/a**b", "/v/a?**", "*/v/a/**", "**/a/b**", "/v/a/b",
                              "**/a/?**", "**v*a/**", "/v/a/b\\**", "**/a\\**"}) {
    PatternIndex index;
    index.add(pattern);
    (void)matches(index, "/v/a/b");
    EXPECT_FALSE(Trail::turnedTo("/v/a/b", index.id()).settled()) << pattern;
  }
}

// A thread's share, which it has from the start.
TEST(Trail, IsSmall) {
  EXPECT_GE(1024U, sizeof(Trail));
}

} // namespace
