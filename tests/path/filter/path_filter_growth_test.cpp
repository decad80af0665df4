// How the work of a query grows with the path and with the number of patterns. Hostile inputs must
// not cost more than their size explains.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "tests/path/filter/path_filter_steps.h"

#include <cstdint>
#include <functional>
#include <gtest/gtest.h>
#include <list>
#include <ostream>
#include <random>
#include <string>
#include <vector>

using namespace KOVA::Backup;
using KovaTest::stepsOf;

using Strings = std::list<std::string>;

namespace {

std::string repeated(const std::string &text, std::size_t size) {
  std::string all;
  while (all.size() < size) {
    all += text;
  }
  return all;
}

struct Case {
  const char *name;
  Strings patterns;
  std::function<std::string(std::size_t)> path; // of about that size
};

void PrintTo(const Case &c, std::ostream *os) {
  *os << c.name;
}

std::function<std::string(std::size_t)> repeats(const std::string &unit, const std::string &tail) {
  return [unit, tail](std::size_t size) { return repeated(unit, size) + tail; };
}

std::string randomBytes(std::size_t size) {
  std::mt19937 random(20240701);
  std::string all;
  while (all.size() < size) {
    all += "ab/"[random() % 3];
  }
  return all;
}

// Patterns like "**a*b*" with every pair of some letters.
Strings pairs() {
  Strings all;
  for (const char one : std::string("abcdefghij")) {
    for (const char other : std::string("abcdefghij")) {
      all.push_back(std::string("**") + one + "*" + other + "*");
    }
  }
  return all;
}

// Patterns whose infixes are "a", "aa", "aaa" and so on.
Strings nestedInfixes(std::size_t count) {
  Strings all;
  for (std::size_t size = 1; size <= count; ++size) {
    all.push_back("**" + std::string(size, 'a') + "*b*c");
  }
  return all;
}

// Patterns whose prefixes are nested and lead to a trie of infixes each.
Strings nestedPrefixes(std::size_t count) {
  Strings all;
  for (std::size_t size = 0; size < count; ++size) {
    all.push_back(std::string(size, 'a') + "**aab*c");
    all.push_back(std::string(size, 'a') + "**aaac*?");
  }
  return all;
}

std::vector<Case> cases() {
  const std::string manyStars = repeated("*a", 60) + "b";
  return {
      {"OneSlash", {"**a*a*"}, repeats("a", "/b")},
      {"NoSlash", {"**a*a*b"}, repeats("a", "")},
      {"ManySlashes", {"**a*a*/b"}, repeats("a/", "")},
      {"ManyStars", {"**" + manyStars}, repeats("a", "/")},
      {"ManyComponents", {"**" + manyStars}, repeats("aaaaaaaa/", "")},
      {"AnyBytes", {"**a????????????????????????b**"}, randomBytes},
      {"LongInfix", {"**" + std::string(50, 'a') + "b**c*"}, repeats("a", "")},
      {"LongElements", {"**" + repeated("a?*", 900) + "b"}, repeats("ab", "")},
      {"LateInfix",
       {"**b*?", "**ab**", "**aab**c", "**b*c", "**b*d", "**b*e"},
       [](std::size_t size) { return std::string(size / 2, 'a') + std::string(size / 2, 'b'); }},
      {"Pairs", pairs(), repeats("a", "/b")},
      {"PairsAtRandom", pairs(), randomBytes},
      {"NestedInfixes", nestedInfixes(60), repeats("a", "")},
      {"NestedPrefixes", nestedPrefixes(60), repeats("a", "")},
      {"Equal", Strings(50, "**aaaa*a?"), repeats("a", "/")},
  };
}

class Growth : public testing::TestWithParam<Case> {};

std::size_t words(const Strings &patterns) {
  std::size_t bytes = 0;
  for (const std::string &pattern : patterns) {
    bytes += pattern.size() + 1;
  }
  return 1 + bytes / 16;
}

TEST_P(Growth, OfAQueryIsThatOfThePath) {
  PathFilter filter;
  for (const std::string &pattern : GetParam().patterns) {
    filter.addExcludePattern(pattern);
  }
  const auto work = [&](std::size_t size) {
    const std::string path = GetParam().path(size);
    return stepsOf([&] { filter.filterOut(path); });
  };
  const std::uint64_t small = work(2000);
  const std::uint64_t large = work(8000);
  EXPECT_LT(0U, small);
  EXPECT_LE(large, small * 5);
  EXPECT_LE(large, 8000 * 8 * words(GetParam().patterns));
}

TEST_P(Growth, OfMatchIsThatOfTheText) {
  for (const std::string &pattern : GetParam().patterns) {
    const auto work = [&](std::size_t size) {
      const std::string text = GetParam().path(size);
      return stepsOf([&] { PathFilterPrivate::match(pattern.c_str(), text.c_str()); });
    };
    EXPECT_LE(work(8000), work(2000) * 5) << pattern;
  }
}

TEST_P(Growth, OfRebaseIsThatOfTheBase) {
  PathFilter filter;
  for (std::string pattern : GetParam().patterns) {
    // A double star consumes any base at once.
    for (std::size_t at; (at = pattern.find("**")) != std::string::npos;) {
      pattern.erase(at, 1);
    }
    filter.addExcludePattern("/" + pattern);
    filter.addExcludePattern("/*" + pattern + "*x");
  }
  const auto work = [&](std::size_t size) {
    const std::string base = "/" + GetParam().path(size);
    return stepsOf([&] {
      Strings out;
      filter.getExcludePattern(out, base);
    });
  };
  EXPECT_LE(work(8000), work(2000) * 5);
}

INSTANTIATE_TEST_SUITE_P(Hostile, Growth, testing::ValuesIn(cases()),
                         [](const auto &one) { return std::string(one.param.name); });

// Four times the stars, which could be combined in very many more ways.
TEST(GrowthOfRebase, IsThatOfThePattern) {
  for (const char *unit : {"a", "a/", "aaaab/", "ab"}) {
    const std::string base = "/" + repeated(unit, 2000);
    for (const char *element : {"*a", "*?", "/*a", "a*b*"}) {
      const auto work = [&](std::size_t elements) {
        PathFilter filter;
        filter.addExcludePattern("/*" + repeated(element, elements) + "*b");
        return stepsOf([&] {
          Strings out;
          filter.getExcludePattern(out, base);
        });
      };
      EXPECT_LE(work(400), work(100) * 5 + base.size() * 8) << unit << " " << element;
    }
  }
}

TEST(GrowthOfPatterns, IsThatOfTheirNumber) {
  const auto work = [](std::size_t count) {
    PathFilter filter;
    for (const Strings &patterns : {nestedInfixes(count), nestedPrefixes(count)}) {
      for (const std::string &pattern : patterns) {
        filter.addExcludePattern(pattern);
      }
    }
    const std::string path = repeated("a", 4000);
    return stepsOf([&] { filter.filterOut(path); });
  };
  // Patterns of the same size: only their number grows.
  const auto fixed = [](std::size_t count) {
    PathFilter filter;
    for (std::size_t i = 0; i < count; ++i) {
      filter.addExcludePattern("**aaa*a" + std::to_string(1000 + i) + "*a?");
    }
    const std::string path = repeated("a", 4000);
    return stepsOf([&] { filter.filterOut(path); });
  };
  EXPECT_LE(fixed(400), fixed(100) * 5);
  EXPECT_LE(work(40), work(10) * 20); // their sizes grow as well
}

// A path that is short enough for the infixes to be searched for, which can begin at each place.
TEST(GrowthOfShortPaths, LooksAtEachPlaceOnce) {
  PathFilter filter;
  filter.addExcludePattern("**aaab" + std::string(40, 'a') + "%*");
  filter.addExcludePattern("**aaa*b*c");
  const std::string path(200, 'a');
  const std::uint64_t steps = stepsOf([&] { filter.filterOut(path); });
  EXPECT_LE(steps, path.size() * 16 * 3);
}

} // namespace
