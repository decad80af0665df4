#include "temp_manager/temp_name.h"

#include "kovabackup/path_util.h"
#include "tests/temp_manager/path_hash.h"

#include <gtest/gtest.h>
#include <random>
#include <vector>

using namespace KOVA::Backup;

namespace {

std::string times(std::size_t count, const std::string &text) {
  std::string result;
  for (std::size_t i = 0; i < count; ++i) {
    result += text;
  }
  return result;
}

// The rule step by step, with signed numbers and without shortcuts.
std::string plainCut(const std::string &base, long position) {
  while (position > 0) {
    const int byte = static_cast<unsigned char>(base.at(static_cast<std::size_t>(position)));
    if (byte < 0x80 || byte > 0xbf) {
      break;
    }
    position = position - 1;
  }
  return std::string(base, 0, static_cast<std::size_t>(position));
}

std::string plainShortened(const std::string &name) {
  if (name.size() > 0 && name[name.size() - 1] == '/') {
    return name;
  }
  std::string base = Path::basename(name);
  const std::string dir = Path::dirname(name);
  if (base.size() >= 249) {
    base = plainCut(base, 248);
  }
  std::string joined = Path::join(dir, base);
  if (joined.size() >= 4089) {
    const long excess = static_cast<long>(joined.size()) - 4088;
    const long keep = static_cast<long>(base.size()) - excess;
    if (keep >= 0) {
      base = plainCut(base, keep);
      joined = Path::join(dir, base);
    }
  }
  return joined;
}

using Random = std::mt19937;

std::size_t below(Random &random, std::size_t limit) {
  return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random);
}

const std::vector<std::string> kCharacters = {"a", ".", "\u00e9", "\u20ac", "\U0001f600"};

// Complete characters, with about as many bytes as requested.
std::string randomText(Random &random, std::size_t bytes) {
  std::string text;
  while (text.size() < bytes) {
    text += kCharacters[below(random, kCharacters.size())];
  }
  return text;
}

std::string randomBytes(Random &random, std::size_t bytes) {
  std::string text;
  for (std::size_t i = 0; i < bytes; ++i) {
    text += static_cast<char>(below(random, 255) + 1);
  }
  return text;
}

std::string randomDir(Random &random) {
  // Empty, short, and around the length limit of a path.
  const std::size_t lengths[] = {0, 5, 3800 + below(random, 340)};
  const std::size_t length = lengths[below(random, 3)];
  std::string dir = below(random, 2) == 0 ? "/" : "";
  while (dir.size() < length) {
    dir += randomText(random, 1 + below(random, 250)) + times(1 + below(random, 2), "/");
  }
  return dir;
}

bool isPrefix(const std::string &prefix, const std::string &text) {
  return text.compare(0, prefix.size(), prefix) == 0;
}

bool startsCharacter(const std::string &text, std::size_t position) {
  return position >= text.size() || (static_cast<unsigned char>(text[position]) & 0xc0) != 0x80;
}

} // namespace

TEST(TempTemplate, FollowsTheName) {
  struct Case {
    const char *name, *expected;
  };
  const Case cases[] = {
      {"", "/tmp/default.XXXXXX"},
      {"abc", "abc.XXXXXX"},
      {"abcXXXXXX", "abcXXXXXX"},
      {"XXXXXX", "XXXXXX"},
      {"XXXXX", "XXXXX.XXXXXX"},
      {"X", "X.XXXXXX"},
      {"abcXXXXX", "abcXXXXX.XXXXXX"},
      {"abcxxxxxx", "abcxxxxxx.XXXXXX"},
      {"XXXXXXa", "XXXXXXa.XXXXXX"},
      {"XXXXXXX", "XXXXXXX"},
      {"/d/", "/d/.XXXXXX"},
      {"/d/XXXXXX", "/d/XXXXXX"},
      {"/var/x/job", "/var/x/job.XXXXXX"},
      {".XXXXXX", ".XXXXXX"},
      {"XXXXXX/", "XXXXXX/.XXXXXX"},
  };
  for (const Case &one : cases) {
    EXPECT_EQ(one.expected, TempName::templateFor(one.name, "/tmp/default.XXXXXX")) << one.name;
  }
}

TEST(TempTemplate, KeepsBytesOfAllKinds) {
  const std::string name("a\0b\xff", 4);
  EXPECT_EQ(name + ".XXXXXX", TempName::templateFor(name, "unused"));
}

TEST(TempPathHash, IsTheAdditiveDjb2) {
  EXPECT_EQ(5381U, TempName::hashOf(""));
  EXPECT_EQ(177670U, TempName::hashOf("a")); // 5381 * 33 + 97
  EXPECT_EQ(5863208U, TempName::hashOf("ab"));
  EXPECT_EQ(177828U, TempName::hashOf("\xff")) << "bytes are unsigned";
  EXPECT_EQ(5381U * 33U, TempName::hashOf(std::string(1, '\0')));
}

TEST(TempPathHash, WrapsAt32Bits) {
  const std::string text = "/tmp/scoped_temp_file.AbCdEf";
  EXPECT_EQ(KovaTest::plainHashOf(text), TempName::hashOf(text));
}

TEST(TempNameShortening, CutsTheLastComponentTo248Bytes) {
  EXPECT_EQ("/d/" + times(248, "e"), TempName::shortened("/d/" + times(300, "e")));
  EXPECT_EQ(times(248, "e"), TempName::shortened(times(249, "e")));
  EXPECT_EQ(times(248, "e"), TempName::shortened(times(248, "e")));
  EXPECT_EQ(times(247, "e"), TempName::shortened(times(247, "e")));
}

TEST(TempNameShortening, NeverSplitsACharacter) {
  EXPECT_EQ(times(124, "\u00e9"), TempName::shortened(times(300, "\u00e9"))); // 2 bytes: 248
  EXPECT_EQ(times(82, "\u20ac"), TempName::shortened(times(300, "\u20ac")));  // 3 bytes: 246
  EXPECT_EQ(times(62, "\U0001f600"), TempName::shortened(times(300, "\U0001f600")));
  EXPECT_EQ("a" + times(123, "\u00e9"), TempName::shortened("a" + times(300, "\u00e9")));
}

TEST(TempNameShortening, OfContinuationBytesOnlyLeavesNothing) {
  EXPECT_EQ("", TempName::shortened(times(300, "\x80")));
  EXPECT_EQ("/d", TempName::shortened("/d/" + times(300, "\x80")));
}

TEST(TempNameShortening, LeavesANameThatEndsInASlash) {
  const std::string name = "/d/" + times(300, "e") + "/";
  EXPECT_EQ(name, TempName::shortened(name));
  EXPECT_EQ("/", TempName::shortened("/"));
}

TEST(TempNameShortening, LeavesNothingOfADot) {
  EXPECT_EQ("", TempName::shortened("."));
}

TEST(TempNameShortening, CutsThePathTo4088Bytes) {
  const std::string dir = times(16, "/" + times(249, "d")); // 4000 bytes
  EXPECT_EQ(dir + "/" + times(87, "e"), TempName::shortened(dir + "/" + times(88, "e")));
  EXPECT_EQ(dir + "/" + times(87, "e"), TempName::shortened(dir + "/" + times(87, "e")));
  EXPECT_EQ(dir + "/" + times(87, "e"), TempName::shortened(dir + "/" + times(300, "e")));
  EXPECT_EQ(dir + "/" + times(43, "\u00e9"), TempName::shortened(dir + "/" + times(300, "\u00e9")));
}

TEST(TempNameShortening, MayUseUpTheWholeName) {
  const std::string dir = times(16, "/" + times(249, "d")) + "/" + times(86, "d"); // 4087 bytes
  EXPECT_EQ(dir, TempName::shortened(dir + "/e"));
  EXPECT_EQ(dir, TempName::shortened(dir + "/" + times(300, "e")));
}

TEST(TempNameShortening, LeavesAPathWhoseDirectoryIsTooLong) {
  const std::string dir = times(16, "/" + times(249, "d")) + "/" + times(87, "d"); // 4088 bytes
  EXPECT_EQ(dir + "/e", TempName::shortened(dir + "/e"));
  EXPECT_EQ(dir + "/" + times(248, "e"), TempName::shortened(dir + "/" + times(300, "e")))
      << "only the name is cut to its own limit";
}

TEST(TempNameShortening, AgreesWithAPlainTranscription) {
  constexpr unsigned kSeed = 20260530;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Random random(kSeed);
  for (int round = 0; round < 20000; ++round) {
    const std::size_t bytes = below(random, 4) == 0 ? below(random, 400) : 240 + below(random, 20);
    const std::string base =
        below(random, 4) == 0 ? randomBytes(random, bytes) : randomText(random, bytes);
    const std::string name = randomDir(random) + base;
    ASSERT_EQ(plainShortened(name), TempName::shortened(name)) << "round " << round;
  }
}

TEST(TempNameShortening, KeepsWithinTheLimitsAndWholeCharacters) {
  constexpr unsigned kSeed = 53;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Random random(kSeed);
  for (int round = 0; round < 20000; ++round) {
    const std::string name = randomDir(random) + randomText(random, 1 + below(random, 600));
    const std::string result = TempName::shortened(name);
    const std::string dir = Path::dirname(name);
    const std::string base = Path::basename(name);
    if (dir.size() > 4087 || base == ".") {
      continue; // too long even without a name, or no name at all
    }
    SCOPED_TRACE(testing::Message() << "round " << round);
    ASSERT_LE(result.size() + 7, 4095U);
    const std::string front = dir == "/" ? dir : dir == "." ? "" : dir + "/";
    if (result == dir) {
      continue; // nothing of the name was left
    }
    ASSERT_TRUE(isPrefix(front, result));
    const std::string kept = result.substr(front.size());
    ASSERT_LE(kept.size() + 7, 255U);
    ASSERT_TRUE(isPrefix(kept, base));
    ASSERT_TRUE(startsCharacter(base, kept.size()));
  }
}
