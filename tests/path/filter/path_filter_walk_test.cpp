// Paths in the order in which programs walk trees. What a query remembers of a folder must never
// change an answer: not for the next path, not for another filter, not for one that has changed.

#include "kovabackup/path_filter.h"

#include "tests/path/filter/path_filter_oracle.h"

#include <algorithm>
#include <array>
#include <gtest/gtest.h>
#include <list>
#include <optional>
#include <random>
#include <string>
#include <thread>
#include <vector>

using namespace KOVA::Backup;
namespace Oracle = KovaTest::Oracle;

using Strings = std::list<std::string>;

namespace {

class Random {
public:
  explicit Random(unsigned seed) : random_(seed) {}
  std::size_t below(std::size_t end) { return random_() % end; }
  bool oneOf(std::size_t count) { return below(count) == 0; }
  const std::string &pick(const std::vector<std::string> &from) { return from[below(from.size())]; }

private:
  std::mt19937 random_;
};

const std::vector<std::string> kNames{"a",     "b",         "ab",          "abc",    "x.c",
                                      "x.log", "cache",     "lib64",       "share",  "docs",
                                      "core",  "cache.old", "library-one", "a long", "*",
                                      "é",     "",          "c",           "aab",    "ab*cd?e.c"};

// Walks through a tree that is made on the way: goes down, up, or on to the next path of a folder.
class Walk {
public:
  explicit Walk(unsigned seed) : random_(seed) {}

  std::string next() {
    switch (random_.below(12)) {
    case 0:
    case 1:
      folders_.push_back(random_.pick(kNames));
      break;
    case 2:
      folders_.resize(random_.below(folders_.size() + 1));
      break;
    case 3:
      if (folders_.size() > 9) {
        folders_.clear();
      }
      break;
    default:
      break;
    }
    return folder() + (random_.oneOf(20) ? std::string(300, 'n') : random_.pick(kNames));
  }

private:
  std::string folder() const {
    std::string all = "/";
    for (const std::string &name : folders_) {
      all += name + "/";
    }
    return all;
  }

  std::vector<std::string> folders_;
  Random random_;
};

std::string escaped(const std::string &text) {
  std::string all;
  for (const char byte : text) {
    all += byte == '*' || byte == '?' || byte == '\\' ? "\\" : "";
    all += byte;
  }
  return all;
}

// Patterns of all kinds that can apply to the path.
std::string patternFor(const std::string &path, Random &random) {
  const std::size_t slash = path.rfind('/');
  const std::string folder = escaped(path.substr(0, slash));
  const std::string name = escaped(path.substr(slash + 1));
  const std::string middle =
      path.substr(random.below(path.size()), 1 + random.below(random.oneOf(2) ? 4 : 20));
  switch (random.below(12)) {
  case 0:
    return folder + "/" + name;
  case 1:
  case 2:
    return folder + "/**";
  case 3:
    return folder + (random.oneOf(2) ? "**" : "*");
  case 4:
  case 5:
    return "**/" + name + "/**";
  case 6:
    return "**/" + name;
  case 7:
    return "**" + name.substr(name.size() / 2);
  case 8:
    return "**" + escaped(middle) + "**";
  case 9:
    return folder + "/?" + name.substr(std::min<std::size_t>(1, name.size()));
  case 10:
    return "/*" + escaped(middle) + "*/**";
  default:
    return folder.substr(0, folder.size() / 2) + "**" + escaped(middle) + "*" + name;
  }
}

// A filter, and the lists that it must agree with.
struct Subject {
  std::optional<PathFilter> filter; // a new one takes the address of the old one
  Strings includes;
  Strings excludes;

  void restart() {
    filter.emplace();
    includes.clear();
    excludes.clear();
  }
  void exclude(const std::string &pattern) {
    excludes.push_back(pattern);
    filter->addExcludePattern(pattern);
  }
  void include(const std::string &pattern) {
    includes.push_back(pattern);
    filter->addIncludePattern(pattern);
  }
  bool agreesOn(const std::string &path) {
    return filter->filterOut(path) == Oracle::filterOut(includes, excludes, path);
  }
};

void addSome(Subject &subject, const std::string &path, Random &random) {
  for (auto left = random.below(4); left > 0; --left) {
    subject.exclude(patternFor(path, random));
  }
  if (random.oneOf(4)) {
    subject.include(patternFor(path, random));
  }
}

class Walks : public testing::TestWithParam<unsigned> {};
INSTANTIATE_TEST_SUITE_P(Seeds, Walks, testing::Range(1U, 9U));

TEST_P(Walks, OfOneFilterAgreeWithThePlainWalk) {
  Random random(GetParam());
  std::size_t leftOut = 0;
  std::size_t cases = 0;
  for (unsigned round = 0; round < 60; ++round) {
    Walk walk(GetParam() * 1000 + round);
    Subject subject;
    subject.restart();
    for (int i = 0; i < 12; ++i) {
      addSome(subject, walk.next(), random);
    }
    for (int i = 0; i < 200; ++i) {
      const std::string path = walk.next();
      ASSERT_TRUE(subject.agreesOn(path)) << path << testing::PrintToString(subject.excludes)
                                          << testing::PrintToString(subject.includes);
      leftOut += subject.filter->filterOut(path) ? 1U : 0U;
      ++cases;
    }
  }
  EXPECT_LT(cases / 20, leftOut);
  EXPECT_LT(leftOut, cases - cases / 20);
}

// More filters than a thread remembers folders for, each on a walk of its own. They change between
// the queries, and new ones take the addresses of old ones.
TEST_P(Walks, OfManyChangingFiltersAgreeWithThePlainWalk) {
  Random random(GetParam() + 100);
  std::array<Subject, 7> subjects;
  std::vector<Walk> walks;
  for (unsigned i = 0; i < subjects.size(); ++i) {
    subjects[i].restart();
    walks.emplace_back(GetParam() * 100 + i);
  }
  std::size_t at = 0;
  for (int i = 0; i < 8000; ++i) {
    at = random.oneOf(3) ? random.below(subjects.size()) : at;
    Subject &subject = subjects[at];
    const std::string path = walks[random.oneOf(4) ? 0 : at].next();
    ASSERT_TRUE(subject.agreesOn(path)) << path << testing::PrintToString(subject.excludes)
                                        << testing::PrintToString(subject.includes);
    if (random.oneOf(8)) {
      addSome(subject, path, random);
      ASSERT_TRUE(subject.agreesOn(path)) << path << testing::PrintToString(subject.excludes);
    } else if (random.oneOf(60) || subject.excludes.size() > 40) {
      subject.restart();
      ASSERT_TRUE(subject.agreesOn(path));
    }
  }
}

TEST_P(Walks, OnManyThreadsAgreeWithThePlainWalk) {
  Random random(GetParam() + 200);
  std::array<Subject, 3> subjects;
  Walk source(GetParam());
  for (Subject &subject : subjects) {
    subject.restart();
    for (int i = 0; i < 10; ++i) {
      addSome(subject, source.next(), random);
    }
  }
  std::vector<std::thread> threads;
  std::array<int, 4> wrong{};
  for (unsigned number = 0; number < wrong.size(); ++number) {
    threads.emplace_back([&, number] {
      Walk walk(GetParam() * 10 + number);
      for (std::size_t i = 0; i < 2000; ++i) {
        const std::string path = walk.next();
        wrong[number] += subjects[i / 7 % subjects.size()].agreesOn(path) ? 0 : 1;
      }
    });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
  EXPECT_EQ((std::array<int, 4>{}), wrong);
}

// A folder with more nodes on its way than are remembered, and the longest path that is.
TEST(WalkOfDeepFolders, AgreesWithThePlainWalk) {
  Subject subject;
  subject.restart();
  std::string folder = "/";
  for (int i = 0; i < 60; ++i) {
    subject.exclude(folder + "*.c");
    folder += "ab/";
  }
  for (std::size_t size = folder.size() + 1; size < 300; ++size) {
    for (const char *end : {".c", "/x", "/.c", ".d"}) {
      for (const std::size_t depth : {folder.size(), folder.size() / 2, std::size_t{31}}) {
        const std::string path = folder.substr(0, depth) + std::string(size - depth, 'n') + end;
        ASSERT_TRUE(subject.agreesOn(path)) << path;
        ASSERT_TRUE(subject.agreesOn(path)) << path;
      }
    }
  }
}

// The nodes that did not fit are still found for each path.
TEST(WalkOfDeepFolders, MissesNoPatternOfANodeThatIsNotRemembered) {
  Subject subject;
  subject.restart();
  std::string folder = "/";
  for (int i = 0; i < 40; ++i) {
    folder += "ab/";
    subject.exclude(folder + "**.e" + std::to_string(i));
  }
  for (int i = 0; i < 40; ++i) {
    for (const char *name : {"q/x.c", "q/y.c", "q/z.c"}) {
      ASSERT_TRUE(subject.agreesOn(folder + name));
    }
    ASSERT_TRUE(subject.agreesOn(folder + "q/x.e" + std::to_string(i)));
  }
}

TEST(WalkOfASettledFolder, EndsWhereTheFolderEnds) {
  PathFilter filter;
  filter.addExcludePattern("/v/a/**");
  filter.addExcludePattern("**/tmp/**");
  for (int i = 0; i < 3; ++i) {
    EXPECT_TRUE(filter.filterOut("/v/a/b"));
    EXPECT_TRUE(filter.filterOut("/v/a/b/c"));
    EXPECT_FALSE(filter.filterOut("/v/a"));
    EXPECT_FALSE(filter.filterOut("/v/ab/c"));
    EXPECT_TRUE(filter.filterOut("/v/tmp/c"));
    EXPECT_FALSE(filter.filterOut("/v/tmp"));
    EXPECT_FALSE(filter.filterOut("/v/tmpx/c"));
  }
  filter.addIncludePattern("/v/a/k*");
  EXPECT_TRUE(filter.filterOut("/v/a/b"));
  EXPECT_FALSE(filter.filterOut("/v/a/keep"));
}

} // namespace
