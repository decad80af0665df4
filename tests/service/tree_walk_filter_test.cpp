// Which folders a walk enters, and which pattern decided about an entry.

#include "kovabackup/service/tree_walk.h"

#include "tests/path/filter/path_filter_tree.h"
#include "tests/service/tree_walk_support.h"

#include <list>
#include <map>
#include <string>
#include <vector>

using namespace KovaTest;

namespace {

// The names below the root that a walk gives; those that are left out have a "-" in front.
Paths given(const Paths &includes, const Paths &excludes, bool leftOutCloses = true) {
  PathFilter filter;
  for (const std::string &pattern : includes) {
    filter.addIncludePattern(pattern);
  }
  for (const std::string &pattern : excludes) {
    filter.addExcludePattern(pattern);
  }
  WalkOptions options;
  options.leftOutCloses = leftOutCloses;
  Paths names;
  for (const WalkEntry &entry : walkAll("/tmp/walk", filter, options)) {
    if (entry.path != "/tmp/walk") {
      names.push_back((entry.kept ? "" : "-") + entry.path.substr(10));
    }
  }
  return names;
}

class TreeWalkFilter : public TreeWalkTest {
protected:
  void SetUp() override {
    TreeWalkTest::SetUp();
    makeAll({"a/b/c", "a/b/d", "a/e", "f"});
  }
};

} // namespace

TEST_F(TreeWalkFilter, KeepsEverythingWithoutPatterns) {
  EXPECT_EQ((Paths{"a", "a/b", "a/b/c", "a/b/d", "a/e", "f"}), given({}, {}));
}

TEST_F(TreeWalkFilter, ClosesAFolderThatIsLeftOut) {
  EXPECT_EQ((Paths{"-a", "f"}), given({}, {"/tmp/walk/a"}));
  EXPECT_EQ((Paths{"a", "-a/b", "a/e", "f"}), given({}, {"**/b"}));
}

TEST_F(TreeWalkFilter, EntersAFolderThatIsLeftOutWhereAnIncludePatternReachesBelow) {
  EXPECT_EQ((Paths{"-a", "-a/b", "a/b/c", "-a/b/d", "-a/e", "f"}),
            given({"/tmp/walk/a/b/c"}, {"/tmp/walk/a", "/tmp/walk/a/**"}));
  EXPECT_EQ((Paths{"-a", "-a/b", "-a/e", "f"}),
            given({"/tmp/walk/a/x"}, {"/tmp/walk/a", "/tmp/walk/a/**"}));
}

TEST_F(TreeWalkFilter, KnowsAnIncludePatternThatMatchesTheFolderOnly) {
  for (const std::string pattern : {"/tmp/walk/a", "/tmp/walk/a*", "/tmp/walk/?", "/*/*/*"}) {
    EXPECT_EQ((Paths{"a", "f"}), given({pattern}, {"/tmp/walk/a", "/tmp/walk/a/**"})) << pattern;
  }
}

TEST_F(TreeWalkFilter, ReadsAnEscapedSlashAsASlash) {
  for (const std::string pattern : {"/tmp/walk/a\\/b/c", "/tmp/walk\\/a\\/b\\/c", "\\/tmp/**/c"}) {
    EXPECT_EQ((Paths{"-a", "-a/b", "a/b/c", "-a/b/d", "-a/e", "f"}),
              given({pattern}, {"/tmp/walk/a", "/tmp/walk/a/**"}))
        << pattern;
  }
}

TEST_F(TreeWalkFilter, TakesAnEscapedBackslashForNoEscapeOfTheSlashBehindIt) {
  EXPECT_EQ((Paths{"-a", "-f"}), given({"/tmp/walk/a\\\\/b/c"}, {"/tmp/walk/*"}));
}

TEST_F(TreeWalkFilter, DoesNotEnterAKeptFolderBelowWhichEverythingIsLeftOut) {
  for (const std::string pattern :
       {"/tmp/walk/a/**", "**/a/**", "/*/*/a/**", "/tmp/walk/a/***", "/tmp/walk/a\\/**"}) {
    EXPECT_EQ((Paths{"a", "f"}), given({}, {pattern})) << pattern;
    EXPECT_EQ((Paths{"a", "-a/b", "-a/b/c", "a/b/d", "-a/e", "f"}), given({"**/d"}, {pattern}))
        << pattern;
  }
}

TEST_F(TreeWalkFilter, EntersAKeptFolderBelowWhichNotEverythingIsLeftOut) {
  EXPECT_EQ((Paths{"a", "-a/b", "-a/e", "f"}), given({}, {"/tmp/walk/a/*"}));
  EXPECT_EQ((Paths{"a", "a/b", "-a/b/c", "a/b/d", "a/e", "f"}), given({}, {"/tmp/walk/a/**c"}));
  EXPECT_EQ((Paths{"a", "a/b", "a/b/c", "a/b/d", "a/e", "f"}), given({}, {"/tmp/walk/a/*\\*"}));
}

// getExcludePattern gives the rest "/**" for "/tmp/walk/a/b" with this pattern, as if the single
// star could match "walk/a".
TEST_F(TreeWalkFilter, DoesNotTakeASingleStarAcrossASlash) {
  EXPECT_EQ((Paths{"a", "a/b", "a/b/c", "a/b/d", "a/e", "f"}), given({}, {"/*/*x*b/**"}));
  makeAll({"ac/ab/y"});
  EXPECT_EQ((Paths{"a", "a/b", "a/b/c", "a/b/d", "a/e", "ac", "ac/ab", "ac/ab/y", "f"}),
            given({}, {"/*/*/a*b/**"}));
}

TEST_F(TreeWalkFilter, TakesEachPathByItselfOnDemand) {
  EXPECT_EQ((Paths{"-a", "a/b", "a/b/c", "a/b/d", "a/e", "f"}), given({}, {"/tmp/walk/a"}, false));
  EXPECT_EQ((Paths{"-a", "f"}), given({}, {"/tmp/walk/a", "/tmp/walk/a/**"}, false));
}

TEST_F(TreeWalkFilter, IgnoresAPatternThatMatchesNothing) {
  EXPECT_EQ((Paths{"-a", "-f"}), given({"/tmp/walk/a/b/c\\"}, {"/tmp/walk/*"}));
  using std::string_literals::operator""s;
  EXPECT_EQ((Paths{"a", "-f"}), given({"/tmp/walk/a\0/b/c"s}, {"/tmp/walk/*", "/tmp/walk/a/**"}));
}

TEST_F(TreeWalkFilter, FiltersARootThatIsLeftOut) {
  PathFilter filter;
  filter.addExcludePattern("/tmp/**");
  std::vector<WalkEntry> entries = walkAll(kRoot, filter);
  ASSERT_EQ(1U, entries.size());
  EXPECT_FALSE(entries.front().kept);
  filter.addIncludePattern("**/a/b/**");
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/b", "/tmp/walk/a/b/c",
                   "/tmp/walk/a/b/d", "/tmp/walk/a/e", "/tmp/walk/f"}),
            pathsOf(walkAll(kRoot, filter)));
}

TEST_F(TreeWalkFilter, FiltersBelowTheRootFolder) {
  PathFilter closed;
  closed.addExcludePattern("/**");
  EXPECT_EQ(Paths{"/"}, pathsOf(walkAll("/", closed)));
  PathFilter open;
  open.addExcludePattern("/**");
  open.addIncludePattern("/tmp/walk/f");
  Paths kept;
  for (const WalkEntry &entry : walkAll("/", open)) {
    if (entry.kept) {
      kept.push_back(entry.path);
    }
  }
  EXPECT_EQ(Paths{"/tmp/walk/f"}, kept);
}

TEST_F(TreeWalkFilter, ReadsTheFilterInItsConstructorOnly) {
  auto filter = std::make_unique<PathFilter>();
  filter->addExcludePattern("**/b");
  TreeWalk walk(kRoot, *filter);
  filter->addExcludePattern("**");
  filter.reset();
  Paths kept;
  for (WalkEntry entry; walk.next(entry);) {
    if (entry.kept) {
      kept.push_back(entry.path);
    }
  }
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/a", "/tmp/walk/a/e", "/tmp/walk/f"}), kept);
}

TEST_F(TreeWalkFilter, NamesTheFirstPatternThatDecided) {
  PathFilter filter;
  for (const char *pattern : {"**/x", "**/c", "/tmp/walk/a/b/c"}) {
    filter.addIncludePattern(pattern);
  }
  for (const char *pattern : {"**/e", "/tmp/walk/a/**", "**"}) {
    filter.addExcludePattern(pattern);
  }
  std::map<std::string, std::string> decided;
  TreeWalk walk(kRoot, filter);
  std::string pattern = "mine";
  EXPECT_FALSE(walk.decidedBy(pattern)) << "no entry was given yet";
  for (WalkEntry entry; walk.next(entry);) {
    ASSERT_TRUE(walk.decidedBy(pattern));
    decided[entry.path] = pattern;
  }
  EXPECT_EQ((std::map<std::string, std::string>{{"/tmp/walk", "**"},
                                                {"/tmp/walk/a", "**"},
                                                {"/tmp/walk/a/b", "/tmp/walk/a/**"},
                                                {"/tmp/walk/a/b/c", "**/c"},
                                                {"/tmp/walk/a/b/d", "/tmp/walk/a/**"},
                                                {"/tmp/walk/a/e", "**/e"},
                                                {"/tmp/walk/f", "**"}}),
            decided);
}

TEST_F(TreeWalkFilter, NamesNoPatternWhereNoneMatches) {
  PathFilter filter;
  filter.addExcludePattern("**/none");
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry));
  std::string pattern = "mine";
  EXPECT_FALSE(walk.decidedBy(pattern));
  EXPECT_EQ("mine", pattern);
}

TEST_F(TreeWalkFilter, FindsTheDecidingPatternAmongTenThousand) {
  std::list<std::string> patterns;
  PathFilter filter;
  for (int i = 0; i < 10000; ++i) {
    patterns.push_back(i == 9990 ? "**/e" : i == 9991 ? "/tmp/walk/a/e" : Tree::pattern(i));
    filter.addExcludePattern(patterns.back());
  }
  TreeWalk walk(kRoot, filter);
  for (WalkEntry entry; walk.next(entry);) {
    std::string pattern;
    EXPECT_EQ(entry.path == "/tmp/walk/a/e", walk.decidedBy(pattern)) << entry.path;
    EXPECT_EQ(entry.path == "/tmp/walk/a/e" ? "**/e" : "", pattern);
  }
}
