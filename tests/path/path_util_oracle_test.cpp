// The path algebra against a literal transcription of its rules, on every small path.

#include "kovabackup/path_util.h"

#include <boost/algorithm/string/classification.hpp>
#include <boost/algorithm/string/split.hpp>
#include <functional>
#include <gtest/gtest.h>
#include <random>

namespace {

namespace Path = KOVA::Backup::Path;
using Parts = std::vector<std::string>;

// The letters that the rules distinguish, and two that they do not.
constexpr char kLetters[] = {'/', '.', 'a', 'b'};

// All paths up to that length.
Parts allPaths(std::size_t letters) {
  Parts paths = {""};
  if (letters > 0) {
    for (const std::string &shorter : allPaths(letters - 1)) {
      for (const char letter : kLetters) {
        paths.push_back(shorter + letter);
      }
    }
  }
  return paths;
}

std::string stripped(std::string text) {
  while (!text.empty() && text.back() == '/') {
    text.pop_back();
  }
  return text;
}

std::string plainJoin(const std::string &a, const std::string &b) {
  const std::string head = stripped(a);
  std::string tail = b;
  while (!tail.empty() && tail.front() == '/') {
    tail.erase(0, 1);
  }
  if (tail == ".") {
    tail = "";
  }
  if (!head.empty()) {
    if (head == ".") {
      return tail;
    }
    return tail.empty() ? head : head + "/" + tail;
  }
  return !a.empty() && a.front() == '/' ? "/" + tail : tail;
}

Parts plainSplit(const std::string &path) {
  if (path.empty()) {
    return {};
  }
  Parts out;
  boost::algorithm::split(out, path, boost::algorithm::is_any_of("/"),
                          boost::algorithm::token_compress_on);
  if (out[0].empty()) {
    out[0] = "/";
  }
  if (out.size() == 2 && out[0] == "/") {
    if (out[1].empty()) {
      out.pop_back();
    }
    return out;
  }
  if (out.back().empty()) {
    out.pop_back();
    out.back() += "/";
  }
  return out;
}

std::string plainToken(const std::string &path, unsigned int index) {
  if (path.empty()) {
    return "";
  }
  if (index > 0) {
    const Parts parts = plainSplit(path);
    return index < parts.size() ? parts[index] : "";
  }
  if (path.front() == '/') {
    return "/";
  }
  const std::size_t p = path.find('/');
  if (p == std::string::npos || p + 1 == path.size()) {
    return path;
  }
  const bool onlySlashes = path.substr(p).find_first_not_of('/') == std::string::npos;
  return path.substr(0, onlySlashes ? p + 1 : p);
}

std::string plainCommon(const std::string &a, const std::string &b) {
  Parts ours = plainSplit(a);
  Parts theirs = plainSplit(b);
  std::string result;
  std::size_t i = 0;
  for (; i < ours.size() && i < theirs.size(); ++i) {
    if (i + 1 == ours.size()) {
      ours[i] = stripped(ours[i]);
    }
    if (i + 1 == theirs.size()) {
      theirs[i] = stripped(theirs[i]);
    }
    if (ours[i] != theirs[i]) {
      break;
    }
    result = i == 0 ? ours[i] : plainJoin(result, ours[i]);
  }
  return result;
}

std::string plainRelative(const std::string &path, const std::string &base) {
  const std::string prefix = stripped(base) + "/";
  if (base.empty() || path.substr(0, prefix.size()) != prefix) {
    return "";
  }
  return path.substr(prefix.size());
}

void comparePair(const std::string &a, const std::string &b) {
  ASSERT_EQ(plainJoin(a, b), Path::join(a, b)) << '"' << a << "\" with \"" << b << '"';
  ASSERT_EQ(plainCommon(a, b), Path::common(a, b)) << '"' << a << "\" with \"" << b << '"';
  ASSERT_EQ(plainRelative(a, b), Path::relative(a, b)) << '"' << a << "\" with \"" << b << '"';
}

void compareOne(const std::string &path) {
  Parts out = {"left", "over"};
  ASSERT_TRUE(Path::split(path, out)) << '"' << path << '"';
  ASSERT_EQ(plainSplit(path), out) << '"' << path << '"';
  for (unsigned int index = 0; index <= out.size() + 1; ++index) {
    ASSERT_EQ(plainToken(path, index), Path::token(path, index)) << '"' << path << "\" " << index;
  }
}

TEST(PathAlgebra, AgreesWithThePlainRulesOnEverySmallPath) {
  for (const std::string &path : allPaths(7)) {
    ASSERT_NO_FATAL_FAILURE(compareOne(path));
  }
}

TEST(PathAlgebra, AgreesWithThePlainRulesOnEveryPairOfSmallPaths) {
  const Parts paths = allPaths(4);
  for (const std::string &a : paths) {
    for (const std::string &b : paths) {
      ASSERT_NO_FATAL_FAILURE(comparePair(a, b));
    }
  }
}

std::string randomPath(std::mt19937 &random) {
  const std::string pieces[] = {"/", "/", "//", ".", "..", "a", "ab", std::string(1, '\0'), "\xff"};
  std::string path;
  for (std::size_t count = random() % 12; count > 0; --count) {
    path += pieces[random() % std::size(pieces)];
  }
  return path;
}

TEST(PathAlgebra, AgreesWithThePlainRulesOnRandomPaths) {
  constexpr unsigned kSeed = 91101;
  std::printf("seed %u\n", kSeed);
  std::mt19937 random(kSeed);
  for (int round = 0; round < 20000; ++round) {
    const std::string a = randomPath(random);
    // Half of the pairs have a common prefix, since random ones rarely do.
    const std::string b =
        random() % 2 == 0 ? a.substr(0, random() % 12) + randomPath(random) : randomPath(random);
    ASSERT_NO_FATAL_FAILURE(compareOne(a));
    ASSERT_NO_FATAL_FAILURE(comparePair(a, b));
    ASSERT_NO_FATAL_FAILURE(comparePair(b, a));
  }
}

// The seven-part form folds the two-part one, except for its third argument.
TEST(PathAlgebra, JoinsSevenAsTheTwoPartFormDoes) {
  const Parts some = {"", "/", ".", "a", "a/", "/a", "//"};
  constexpr unsigned kSeed = 4711;
  std::printf("seed %u\n", kSeed);
  std::mt19937 random(kSeed);
  for (int round = 0; round < 20000; ++round) {
    Parts parts(7);
    for (std::string &part : parts) {
      part = some[random() % some.size()];
    }
    std::string expected = plainJoin(plainJoin(parts[0], parts[1]), parts[2]);
    for (std::size_t i = 3; i < 7; ++i) {
      expected = parts[i].empty() ? expected : plainJoin(expected, parts[i]);
    }
    ASSERT_EQ(expected,
              Path::join(parts[0], parts[1], parts[2], parts[3], parts[4], parts[5], parts[6]))
        << testing::PrintToString(parts);
  }
}

TEST(PathAlgebra, JoinsWhatSplitHasTakenApart) {
  for (const std::string &path : allPaths(7)) {
    Parts parts;
    Path::split(path, parts);
    const std::string again = Path::join(parts);
    Parts partsAgain;
    Path::split(again, partsAgain);
    if (path.find('.') == std::string::npos) { // a lone "." is lost
      ASSERT_EQ(parts, partsAgain) << path;
    }
  }
}

} // namespace
