// Patterns of many elements and long paths, which take other ways through the filter than short
// ones, against the oracle.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "tests/path/filter/path_filter_oracle.h"

#include <cstddef>
#include <gtest/gtest.h>
#include <list>
#include <random>
#include <string>
#include <vector>

using namespace KOVA::Backup;
namespace Oracle = KovaTest::Oracle;

using Strings = std::list<std::string>;

namespace {

class Inputs {
public:
  Inputs(unsigned seed, std::string bytes) : random_(seed), bytes_(std::move(bytes)) {}

  std::size_t below(std::size_t end) { return random_() % end; }
  char byte() { return bytes_[below(bytes_.size())]; }

  std::string text(std::size_t size) {
    std::string all;
    while (all.size() < size) {
      all += byte();
    }
    return all;
  }

  // A text, and a pattern made of it so that it matches or nearly does.
  std::string patternOf(const std::string &text) {
    std::string all;
    for (std::size_t at = 0; at < text.size(); ++at) {
      switch (below(24)) {
      case 0:
        all += "**";
        at += below(12);
        break;
      case 1:
        all += "*";
        for (auto left = below(4); left > 0 && at + 1 < text.size() && text[at + 1] != '/';
             --left) {
          ++at;
        }
        break;
      case 2:
        all += text[at] == '/' ? '/' : '?';
        break;
      case 3:
        all += '\\';
        all += text[at];
        break;
      case 4:
        all += below(8) == 0 ? byte() : '*';
        all += literal(text[at]);
        break;
      default:
        all += literal(text[at]);
      }
    }
    return below(16) == 0 ? all + byte() : all;
  }

private:
  static std::string literal(char byte) {
    return byte == '*' || byte == '?' || byte == '\\' ? std::string("\\") + byte
                                                      : std::string(1, byte);
  }

  std::mt19937 random_;
  std::string bytes_;
};

const std::vector<std::string> kAlphabets{
    "a", "ab", "aab/", "aaaaaaa/", "a/*?\\", "abcdefghijklmnopqrstuvwxyz/.", "\xff\x80\x01/"};

TEST(LongPatterns, MatchAsTheOracleSays) {
  std::size_t matches = 0;
  std::size_t results[4] = {};
  for (unsigned seed = 0; seed < kAlphabets.size(); ++seed) {
    Inputs inputs(seed, kAlphabets[seed]);
    for (int round = 0; round < 800; ++round) {
      const std::string source = inputs.text(inputs.below(200));
      const std::string pattern = inputs.patternOf(source);
      const std::string text = inputs.below(4) == 0 ? source + inputs.byte() : source;
      const int result = PathFilterPrivate::match(pattern.c_str(), text.c_str());
      ASSERT_EQ(Oracle::match(pattern, text), result) << "[" << pattern << "] on [" << text << "]";
      ASSERT_EQ(Oracle::covers(pattern, text), result == 1)
          << "[" << pattern << "] on [" << text << "]";
      matches += result == 1 ? 1 : 0;
      ++results[result + 2];
    }
  }
  EXPECT_LT(1000U, matches);
  for (const std::size_t count : results) {
    EXPECT_LT(100U, count);
  }
}

// The size at which the states of a pattern fill a word, or two.
TEST(LongPatterns, OfEachSizeMatchAsTheOracleSays) {
  for (std::size_t size = 0; size < 200; ++size) {
    const std::string run(size, 'a');
    for (const std::string &pattern :
         {"*" + run, "**" + run + "*", "*" + run + "**b", "*" + run + "*a", "*" + run + "\\"}) {
      for (const std::string &text :
           {run, run + "a", run + "ab", run + "/b", "a" + run + "/", "/" + run}) {
        ASSERT_EQ(Oracle::match(pattern, text),
                  PathFilterPrivate::match(pattern.c_str(), text.c_str()))
            << size << " [" << pattern << "] on [" << text << "]";
      }
    }
  }
}

// A pattern of more than one word on a text for which the stack has no room.
TEST(LongPatterns, MatchVeryLongTexts) {
  const std::string run(100, 'b');
  const std::string text = std::string(40000, 'a') + run + "/" + std::string(40000, 'c');
  EXPECT_EQ(1, PathFilterPrivate::match(("*" + run + "**c").c_str(), text.c_str()));
  EXPECT_EQ(1, PathFilterPrivate::match(("*" + run + "/*").c_str(), text.c_str()));
  EXPECT_EQ(-2, PathFilterPrivate::match(("*" + run + "c*").c_str(), text.c_str()));
  EXPECT_EQ(-1, PathFilterPrivate::match(("*" + run + "**d*").c_str(), text.c_str()));
}

class LongPaths : public testing::TestWithParam<std::string> {};

TEST_P(LongPaths, AreFilteredAsByThePlainWalk) {
  Inputs inputs(20240710, GetParam());
  std::size_t cases = 0;
  std::size_t leftOut = 0;
  for (int round = 0; round < 60; ++round) {
    std::vector<std::string> sources;
    Strings patterns;
    PathFilter filter;
    for (auto left = 1 + inputs.below(60); left > 0; --left) {
      sources.push_back(inputs.text(200 + inputs.below(300)));
      const std::string part = sources.back().substr(0, inputs.below(sources.back().size()));
      const std::string middle = part.substr(part.size() - inputs.below(part.size() + 1) / 8);
      patterns.push_back(inputs.below(3) == 0   ? inputs.patternOf(sources.back())
                         : inputs.below(2) == 0 ? inputs.patternOf(part) + "**"
                                                : "**" + inputs.patternOf(middle) + "*" +
                                                      sources.back().substr(part.size()));
      filter.addExcludePattern(patterns.back());
    }
    for (int path = 0; path < 20; ++path) {
      std::string text = sources[inputs.below(sources.size())];
      text[inputs.below(text.size())] = inputs.byte();
      const bool expected = Oracle::filterOut({}, patterns, text);
      ASSERT_EQ(expected, filter.filterOut(text))
          << "[" << text << "], " << testing::PrintToString(patterns);
      text[250 % text.size()] = '\0'; // the rest is not part of the path
      ASSERT_EQ(Oracle::filterOut({}, patterns, text.c_str()), filter.filterOut(text));
      ++cases;
      leftOut += expected ? 1 : 0;
    }
  }
  EXPECT_EQ(1200U, cases);
  EXPECT_LT(100U, leftOut);
}

INSTANTIATE_TEST_SUITE_P(Alphabets, LongPaths, testing::ValuesIn(kAlphabets));

} // namespace
