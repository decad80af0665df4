// The path algebra against a literal transcription of its rules, on every small path.

#include "kovabackup/path_kova.h"
#include "kovabackup/path_util.h"

#include "tests/path/plain_path.h"

#include <gtest/gtest.h>
#include <random>

namespace {

namespace ConfigPath = KOVA::Backup::ConfigPath;
namespace Path = KOVA::Backup::Path;
namespace PlainPath = KovaTest::PlainPath;
using PlainPath::Parts;

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

void comparePair(const std::string &a, const std::string &b) {
  ASSERT_EQ(PlainPath::join(a, b), Path::join(a, b)) << '"' << a << "\" with \"" << b << '"';
  ASSERT_EQ(PlainPath::common(a, b), Path::common(a, b)) << '"' << a << "\" with \"" << b << '"';
  ASSERT_EQ(PlainPath::relative(a, b), Path::relative(a, b))
      << '"' << a << "\" with \"" << b << '"';
}

void compareOne(const std::string &path) {
  Parts out = {"left", "over"};
  ASSERT_TRUE(Path::split(path, out)) << '"' << path << '"';
  ASSERT_EQ(PlainPath::split(path), out) << '"' << path << '"';
  for (unsigned int index = 0; index <= out.size() + 1; ++index) {
    ASSERT_EQ(PlainPath::token(path, index), Path::token(path, index))
        << '"' << path << "\" " << index;
  }
  ASSERT_EQ(PlainPath::dirname(path), Path::dirname(path)) << '"' << path << '"';
  ASSERT_EQ(PlainPath::basename(path), Path::basename(path)) << '"' << path << '"';
  ASSERT_EQ(PlainPath::shareName(path), ConfigPath::shareName(path)) << '"' << path << '"';
  ASSERT_EQ(PlainPath::shareRelativePath(path), ConfigPath::shareRelativePath(path))
      << '"' << path << '"';
  ASSERT_EQ(PlainPath::isInEaDir(path), Path::isInKovaEaDir(path)) << '"' << path << '"';
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
  const std::string pieces[] = {
      "/", "/", "//", ".", "..", "a", "ab", "@eaDir", std::string(1, '\0'), "\xff"};
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
    ASSERT_EQ(PlainPath::joinSeven(parts),
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
