// Which patterns the index offers for a text, and that they are few. path_filter_random_test shows
// that the answers agree with a plain walk.

#include "path/filter/literal_tries.h"
#include "path/filter/pattern_index.h"

#include <gmock/gmock.h>
#include <string>
#include <vector>

using namespace KOVA::PatternSearch;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::UnorderedElementsAre;
using testing::UnorderedElementsAreArray;

namespace {

std::vector<std::string> asked;

int record(const char *pattern, const char *) {
  asked.emplace_back(pattern);
  return 0;
}

int matchAll(const char *, const char *) {
  return 1;
}

int abortAll(const char *, const char *) {
  return -1;
}

PatternIndex indexOf(const std::vector<const char *> &patterns) {
  PatternIndex index;
  for (const char *pattern : patterns) {
    index.add(pattern);
  }
  return index;
}

std::vector<std::string> askedFor(const PatternIndex &index, const char *text) {
  asked.clear();
  EXPECT_FALSE(index.anyMatches(text, &record));
  return asked;
}

TEST(LiteralTries, WalkVisitsTheKeysThatATextBeginsWithShortestFirst) {
  LiteralTries tries;
  const NodeId root = tries.addRoot();
  const std::vector<std::string> keys{"/ab/cd", "", "/ab", "/ax", "/ab/cde", "/ab/c", "b"};
  for (std::size_t at = 0; at < keys.size(); ++at) {
    tries.node(tries.insert(root, keys[at])).first = at;
  }
  std::vector<std::string> seen;
  const std::string text = "/ab/cdx";
  EXPECT_FALSE(
      tries.walk(root, text.begin(), text.end(), [&](const LiteralTries::Node &node, auto end) {
        if (node.first != kNone) {
          seen.push_back(keys[node.first]);
          EXPECT_EQ(seen.back(), std::string(text.begin(), end));
        }
        return false;
      }));
  EXPECT_THAT(seen, ElementsAre("", "/ab", "/ab/c", "/ab/cd"));
}

TEST(LiteralTries, InsertingAKeyAgainFindsItsNode) {
  LiteralTries tries;
  const NodeId root = tries.addRoot();
  const NodeId node = tries.insert(root, "/ab/cd");
  tries.insert(root, "/ab/ce");
  tries.insert(root, "/");
  EXPECT_EQ(node, tries.insert(root, "/ab/cd"));
  EXPECT_EQ(root, tries.insert(root, ""));
}

TEST(LiteralTries, KeepsTriesOfOneStoreApart) {
  LiteralTries tries;
  const NodeId one = tries.addRoot();
  const NodeId other = tries.addRoot();
  tries.node(tries.insert(one, "a")).first = 1;
  tries.node(tries.insert(other, "a")).first = 2;
  const std::string text = "a";
  const auto isTwo = [](const LiteralTries::Node &node, auto) { return node.first == 2; };
  EXPECT_FALSE(tries.walk(one, text.begin(), text.end(), isTwo));
  EXPECT_TRUE(tries.walk(other, text.begin(), text.end(), isTwo));
}

TEST(LiteralTries, FindsEachOfManyKeys) {
  LiteralTries tries;
  const NodeId root = tries.addRoot();
  std::vector<std::string> keys;
  for (int i = 0; i < 5000; ++i) {
    keys.push_back(std::to_string(i * 7919) + "\xff" + std::string(1, static_cast<char>(i)));
    tries.node(tries.insert(root, keys.back())).first = keys.size() - 1;
  }
  for (std::size_t at = 0; at < keys.size(); ++at) {
    const auto isIt = [at](const LiteralTries::Node &node, auto) { return node.first == at; };
    ASSERT_TRUE(tries.walk(root, keys[at].begin(), keys[at].end(), isIt)) << at;
  }
}

TEST(PatternIndex, EmptyOneAsksNobody) {
  EXPECT_FALSE(PatternIndex().anyMatches("/a", &matchAll));
}

TEST(PatternIndex, OnlyTheResultOneIsAMatch) {
  const PatternIndex index = indexOf({"/a"});
  EXPECT_TRUE(index.anyMatches("/a", &matchAll));
  EXPECT_FALSE(index.anyMatches("/a", &abortAll));
}

TEST(PatternIndex, LiteralPatternsAreAskedForTheirOwnTextOnly) {
  const PatternIndex index = indexOf({"/a", "/a/b", "/a/b/c", "", "/a/\\*"});
  EXPECT_THAT(askedFor(index, "/a/b"), ElementsAre("/a/b"));
  EXPECT_THAT(askedFor(index, "/a/*"), ElementsAre("/a/\\*"));
  EXPECT_THAT(askedFor(index, ""), ElementsAre(""));
  EXPECT_THAT(askedFor(index, "/a/"), IsEmpty());
}

TEST(PatternIndex, PatternsAreAskedWhenTheTextHasTheirBeginning) {
  const PatternIndex index = indexOf({"/a/**", "/a/b/**", "/b/**", "/a/b*", "/a/?"});
  EXPECT_THAT(askedFor(index, "/a/c"), UnorderedElementsAre("/a/**", "/a/?"));
  EXPECT_THAT(askedFor(index, "/a/b/c"), UnorderedElementsAre("/a/**", "/a/b/**", "/a/b*", "/a/?"));
}

TEST(PatternIndex, PatternsAreAskedWhenTheTextHasTheirEnding) {
  const PatternIndex index = indexOf({"**.log", "**.g", "*/core", "**?.tmp", "/v/*.log"});
  EXPECT_THAT(askedFor(index, "/x/a.log"), ElementsAre("**.log"));
  EXPECT_THAT(askedFor(index, "/v/a.log"), UnorderedElementsAre("**.log", "/v/*.log"));
  EXPECT_THAT(askedFor(index, "a/core"), ElementsAre("*/core"));
  EXPECT_THAT(askedFor(index, "log"), IsEmpty());
}

TEST(PatternIndex, PatternsAreAskedWhenTheTextHasTheirLongestInnerRun) {
  const PatternIndex index = indexOf({"**/cache/**", "**x*.app/**", "/v/**/tmp/*.c", "**abc?d**"});
  EXPECT_THAT(askedFor(index, "/u/cache/f"), ElementsAre("**/cache/**"));
  EXPECT_THAT(askedFor(index, "/v/b.app/cache/"),
              UnorderedElementsAre("**/cache/**", "**x*.app/**"));
  EXPECT_THAT(askedFor(index, "/v/b/tmp/m.c"), ElementsAre("/v/**/tmp/*.c"));
  EXPECT_THAT(askedFor(index, "abc"), ElementsAre("**abc?d**"));
  EXPECT_THAT(askedFor(index, "/v/tm/m.c"), IsEmpty());
}

// Otherwise a text that repeats the infix of a pattern would be compared with it at every position.
TEST(PatternIndex, PatternsAreAskedOnceHoweverOftenTheirRunStandsInTheText) {
  const PatternIndex index = indexOf({"**a**", "**aa**", "?*aaa/*?", "**a/a**", "**a**"});
  EXPECT_THAT(askedFor(index, "/aaa/aaaa/a"),
              UnorderedElementsAre("**a**", "**aa**", "?*aaa/*?", "**a/a**", "**a**"));
}

// The index remembers a limited number of infixes that it has compared in a text.
TEST(PatternIndex, PatternsAreAskedHoweverManyInfixesTheTextHas) {
  std::vector<std::string> patterns;
  std::string text;
  for (int number = 10; number < 90; ++number) {
    patterns.push_back("**" + std::to_string(number) + "-**");
    text += std::to_string(number) + "-";
  }
  PatternIndex index;
  for (const std::string &pattern : patterns) {
    index.add(pattern.c_str());
  }
  EXPECT_THAT(askedFor(index, text.c_str()), IsSupersetOf(patterns));
}

TEST(PatternIndex, PatternsWithoutLiteralPartsAreAskedForEveryText) {
  const std::vector<const char *> patterns{"*", "**", "?", "*?", "***", "?*?"};
  const PatternIndex index = indexOf(patterns);
  for (const char *text : {"", "/", "abc"}) {
    EXPECT_THAT(askedFor(index, text), UnorderedElementsAreArray(patterns));
  }
}

TEST(PatternIndex, PatternsThatNeverMatchAreNeverAsked) {
  const PatternIndex index = indexOf({"/a\\", "**\\", "\\"});
  EXPECT_EQ(3U, index.size());
  for (const char *text : {"", "/a", "/a\\", "\\"}) {
    EXPECT_THAT(askedFor(index, text), IsEmpty());
  }
}

TEST(PatternIndex, TakesBackThePatternsAddedLast) {
  PatternIndex index = indexOf({"/a*", "**b", "/a*", "**c**", "\\", "/a*"});
  index.shrink(2);
  EXPECT_EQ(2U, index.size());
  EXPECT_THAT(askedFor(index, "/acb"), UnorderedElementsAre("/a*", "**b"));
  index.add("**c**");
  EXPECT_THAT(askedFor(index, "/acb"), UnorderedElementsAre("/a*", "**b", "**c**"));
  index.shrink(0);
  EXPECT_THAT(askedFor(index, "/acb"), IsEmpty());
}

TEST(PatternIndex, BytesBeyondAsciiAreKeysToo) {
  const PatternIndex index = indexOf({"/\xff\x80*", "**\xc3\xa9", "**\xf0**"});
  EXPECT_THAT(askedFor(index, "/\xff\x80/\xc3\xa9"),
              UnorderedElementsAre("/\xff\x80*", "**\xc3\xa9"));
}

} // namespace
