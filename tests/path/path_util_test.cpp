// The path algebra: pure functions, tested by tables.

#include "kovabackup/path_util.h"

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
namespace Path = KOVA::Backup::Path;
namespace ConfigPath = KOVA::Backup::ConfigPath;

using Parts = std::vector<std::string>;

struct OnePath {
  const char *path;
  const char *expected;
};

struct TwoPaths {
  const char *a;
  const char *b;
  const char *expected;
};

// Initialised before main: the functions depend on nothing that is set up later.
const std::string joinedEarly = Path::join("/a", "b");

TEST(PathJoin, PutsExactlyOneSlashBetweenTwoPaths) {
  const TwoPaths cases[] = {
      {"", "", ""},
      {"", "x", "x"},
      {"", "/x", "x"},
      {"", "/", ""},
      {"/", "x", "/x"},
      {"/", "/x", "/x"},
      {"/", "", "/"},
      {"//", "", "/"},
      {"//", "//", "/"},
      {"a", "", "a"},
      {"a/", "", "a"},
      {"a//", "", "a"},
      {"a", "b", "a/b"},
      {"a/", "b", "a/b"},
      {"a", "/b", "a/b"},
      {"a//", "//b", "a/b"},
      {"a/", "/b/", "a/b/"},
      {"a", "b//", "a/b//"},
      {"a", "/", "a"},
      {"a", "///", "a"},
      {"/a", "b/c", "/a/b/c"},
      {"a//b", "c", "a//b/c"},
      {"/a", "..", "/a/.."},
      {"..", "a", "../a"},
  };
  for (const TwoPaths &one : cases) {
    EXPECT_EQ(one.expected, Path::join(one.a, one.b)) << one.a << " with " << one.b;
  }
}

TEST(PathJoin, TakesALoneDotForNothing) {
  const TwoPaths cases[] = {
      {".", "x", "x"},       {".", "/x", "x"},    {"./", "x", "x"},      {".", ".", ""},
      {".", "", ""},         {"a", ".", "a"},     {"a", "/.", "a"},      {"a/", "//.", "a"},
      {"/", ".", "/"},       {"", ".", ""},       {"a", "./x", "a/./x"}, {"a", "./", "a/./"},
      {"a/.", "x", "a/./x"}, {"/.", "x", "/./x"}, {"./.", "x", "././x"},
  };
  for (const TwoPaths &one : cases) {
    EXPECT_EQ(one.expected, Path::join(one.a, one.b)) << one.a << " with " << one.b;
  }
}

TEST(PathJoin, WorksBeforeMain) {
  EXPECT_EQ("/a/b", joinedEarly);
}

TEST(PathJoin, KeepsEveryByte) {
  const std::string odd("\xff\0*", 3);
  EXPECT_EQ(odd + "/" + odd, Path::join(odd, odd));
}

TEST(PathJoinOfSeven, AlwaysJoinsTheThirdSoThatASlashOfTheSecondIsStripped) {
  EXPECT_EQ("a/b", Path::join("a/", "b/", "", "", "", "", ""));
  EXPECT_EQ("a", Path::join("a/", "", "", "", "", "", ""));
  EXPECT_EQ("/", Path::join("/", "", "", "", "", "", ""));
}

TEST(PathJoinOfSeven, LeavesASlashOfTheThirdWhenTheRestIsEmpty) {
  EXPECT_EQ("a/b/c/", Path::join("a", "b", "c/", "", "", "", ""));
}

TEST(PathJoinOfSeven, SkipsEmptyOnesAmongTheLastFour) {
  EXPECT_EQ("a/b/c/e/g/", Path::join("a", "b", "c/", "", "e/", "", "g/"));
  EXPECT_EQ("a/b/c/d/e/f/g", Path::join("a", "b", "c", "d", "e", "f", "g"));
}

TEST(PathJoinOfSeven, StripsASlashBeforeALoneDotAmongTheLastFour) {
  EXPECT_EQ("a/b/c", Path::join("a", "b", "c/", ".", "", "", ""));
}

TEST(PathJoinOfARange, FoldsFromLeftToRight) {
  const struct {
    Parts parts;
    const char *expected;
  } cases[] = {
      {{}, ""},
      {{"a/"}, "a/"},
      {{"/", "a", "b/"}, "/a/b/"},
      {{"."}, "."},
      {{""}, ""},
      {{"a/", ""}, "a"},
      {{"/", "a", "b"}, "/a/b"},
      {{"", "", "x"}, "x"},
      {{"a", "", "b/"}, "a/b/"},
      {{".", ".", "x"}, "x"},
  };
  for (const auto &one : cases) {
    EXPECT_EQ(one.expected, Path::join(one.parts));
    EXPECT_EQ(one.expected, Path::join(one.parts.begin(), one.parts.end()));
  }
}

TEST(PathJoinOfARange, TakesAPieceOfAVector) {
  const Parts parts = {"a", "b", "c", "d"};
  EXPECT_EQ("b/c", Path::join(parts.begin() + 1, parts.begin() + 3));
  EXPECT_EQ("", Path::join(parts.begin() + 1, parts.begin() + 1));
}

TEST(PathSplit, TakesRunsOfSlashesForOne) {
  const struct {
    const char *path;
    Parts expected;
  } cases[] = {
      {"", {}},
      {"/", {"/"}},
      {"//", {"/"}},
      {"///", {"/"}},
      {"a", {"a"}},
      {"a/", {"a/"}},
      {"a//", {"a/"}},
      {"/a", {"/", "a"}},
      {"//a", {"/", "a"}},
      {"/a/", {"/", "a/"}},
      {"/a//", {"/", "a/"}},
      {"a/b", {"a", "b"}},
      {"a//b", {"a", "b"}},
      {"a/b/", {"a", "b/"}},
      {"a/b//", {"a", "b/"}},
      {"/a/b", {"/", "a", "b"}},
      {"//a//b", {"/", "a", "b"}},
      {"/./..", {"/", ".", ".."}},
  };
  for (const auto &one : cases) {
    Parts out = {"left", "over"};
    EXPECT_TRUE(Path::split(one.path, out)) << one.path;
    EXPECT_EQ(one.expected, out) << one.path;
  }
}

TEST(PathSplit, MayReplaceTheVectorThatHoldsThePath) {
  const std::string name(100, 'n'); // too long for the inline buffer of a string
  Parts parts = {"/" + name + "/b/"};
  EXPECT_TRUE(Path::split(parts[0], parts));
  EXPECT_THAT(parts, ElementsAre("/", name, "b/"));
}

TEST(PathToken, CountsComponentsFromZero) {
  const struct {
    const char *path;
    unsigned int index;
    const char *expected;
  } cases[] = {
      {"", 0, ""},       {"", 1, ""},         {"/", 0, "/"},
      {"/", 1, ""},      {"/a/b", 0, "/"},    {"/a/b", 1, "a"},
      {"/a/b", 2, "b"},  {"/a/b", 3, ""},     {"/a/b/", 2, "b/"},
      {"//a", 0, "/"},   {"//a", 1, "a"},     {"a", 0, "a"},
      {"a", 1, ""},      {"a/", 0, "a/"},     {"a//", 0, "a/"},
      {"a///", 0, "a/"}, {"a/b", 0, "a"},     {"a//b", 0, "a"},
      {"a//b", 1, "b"},  {"a//b//", 1, "b/"}, {"a", 4294967295U, ""},
  };
  for (const auto &one : cases) {
    EXPECT_EQ(one.expected, Path::token(one.path, one.index)) << one.path << " at " << one.index;
  }
}

TEST(PathCommon, JoinsTheComponentsThatBothBeginWith) {
  const TwoPaths cases[] = {
      {"", "", ""},
      {"", "/a", ""},
      {"/a", "", ""},
      {"a", "b", ""},
      {"a", "a", "a"},
      {"/a", "b", ""},
      {"/a", "a", ""},
      {"a/", "a", "a"},
      {"a", "a/", "a"},
      {"a/", "a/", "a"},
      {"/a/b/c", "/a/b/d", "/a/b"},
      {"/a/b", "/a/b/c", "/a/b"},
      {"/a/b/", "/a/b", "/a/b"},
      {"/a//b", "/a/b/x", "/a/b"},
      {"/a", "/b", "/"},
      {"/ab", "/abc", "/"},
      {"a/b", "a/c", "a"},
      {"/a/b/", "/a/b/c", "/a/b"},
      {"./a", "./b", "."},
      {"a/./b", "a/./c", "a"},
  };
  for (const TwoPaths &one : cases) {
    EXPECT_EQ(one.expected, Path::common(one.a, one.b)) << one.a << " with " << one.b;
  }
}

TEST(PathCommon, SharesNothingWithTheRootAlone) {
  EXPECT_EQ("", Path::common("/", "/"));
  EXPECT_EQ("", Path::common("/", "/a"));
  EXPECT_EQ("", Path::common("/a", "/"));
}

TEST(PathRelative, TakesTheBaseOffTheFront) {
  const TwoPaths cases[] = {
      {"/a/b/c", "/a", "b/c"},
      {"/a/b/c", "/a/", "b/c"},
      {"/a/b/c", "/a//", "b/c"},
      {"/a/b/c", "/", "a/b/c"},
      {"/a/b/c", "//", "a/b/c"},
      {"/a/b/", "/a", "b/"},
      {"/a/", "/a", ""},
      {"/a", "/a", ""},
      {"/ab", "/a", ""},
      {"/a//b", "/a", "/b"},
      {"a/b", "a", "b"},
      {"a/b", "/a", ""},
      {"/b", "/a", ""},
      {"", "/a", ""},
      {"", "/", ""},
      {"/", "/", ""},
      {"x", "/", ""},
      {"/a", "/a/b", ""},
  };
  for (const TwoPaths &one : cases) {
    EXPECT_EQ(one.expected, Path::relative(one.a, one.b)) << one.a << " to " << one.b;
  }
}

TEST(PathRelative, HasNoAnswerForAnEmptyBase) {
  for (const char *path : {"", "/", "a", "/a/b"}) {
    EXPECT_EQ("", Path::relative(path, "")) << path;
  }
}

TEST(ConfigPathShareName, GivesTheFirstComponentOfAnAbsolutePath) {
  const OnePath cases[] = {
      {"", ""},
      {"/", ""},
      {"//x", ""},
      {"music", ""},
      {"music/a", ""},
      {"/music", "music"},
      {"/music/", "music"},
      {"/music/a/b", "music"},
      {"/music//a", "music"},
  };
  for (const OnePath &one : cases) {
    EXPECT_EQ(one.expected, ConfigPath::shareName(one.path)) << one.path;
  }
}

TEST(ConfigPathShareRelativePath, GivesWhatFollowsTheFirstComponent) {
  const OnePath cases[] = {
      {"", ""},
      {"/", ""},
      {"//", ""},
      {"//x", "x"},
      {"music/a", ""},
      {"/music", ""},
      {"/music/", ""},
      {"/music/a/b", "a/b"},
      {"/music/a/", "a/"},
      {"/music//a", "/a"},
      {"/music//", "/"},
  };
  for (const OnePath &one : cases) {
    EXPECT_EQ(one.expected, ConfigPath::shareRelativePath(one.path)) << one.path;
  }
}

} // namespace
