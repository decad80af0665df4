// JSON text as the JSON library itself reads and writes it: random texts and values, most of them
// at the borders of what is read without the library.

#include "tests/base/library_json.h"

#include "base/plain_json.h"

#include <cmath>
#include <gmock/gmock.h>
#include <iterator>
#include <limits>
#include <random>
#include <string>
#include <string_view>
#include <sys/mman.h>
#include <utility>
#include <vector>

using namespace KOVA::Base;
using namespace std::string_literals;
using Json::Value;
namespace LibraryJson = KovaTest::LibraryJson;

namespace {

class Random {
public:
  explicit Random(unsigned seed) : engine_(seed) {}

  std::size_t below(std::size_t limit) { return engine_() % limit; }
  bool oneIn(std::size_t count) { return below(count) == 0; }
  const std::string &pick(const std::vector<std::string> &from) { return from[below(from.size())]; }

private:
  std::mt19937 engine_;
};

using Texts = std::vector<std::string>;

const Texts kSpaces = {"", "", "", "", " ", "\t", "\r\n", " \n "};
const Texts kOddSpaces = {"\v", "\f", "/**/", "//x\n"};

const Texts kWords = {"true", "false", "null"};
const Texts kOddWords = {"tru",       "True",      "nulll", "NaN", "Infinity",
                         "-Infinity", "truefalse", "t",     ""};

const Texts kNumbers = {"0",
                        "1",
                        "-1",
                        "25",
                        "-0",
                        "00",
                        "01",
                        "-01",
                        "1.5",
                        "-2.5e-9",
                        "1e3",
                        "1E+2",
                        "-0.0",
                        "5.0",
                        "12345678901234567",
                        "999999999999999999",
                        "-99999999999999999",
                        "-999999999999999999",
                        "1000000000000000000",
                        "0000000000000000001",
                        "000000000000000001",
                        "9223372036854775806",
                        "9223372036854775807",
                        "9223372036854775808",
                        "-9223372036854775807",
                        "-9223372036854775808",
                        "-9223372036854775809",
                        "18446744073709551614",
                        "18446744073709551615",
                        "18446744073709551616",
                        "99999999999999999999999",
                        "2147483647",
                        "2147483648",
                        "-2147483648",
                        "-2147483649",
                        "4294967295",
                        "4294967296"};
const Texts kOddNumbers = {"+1", "+", "-", "--1", "1-2", "0x10", ".5", "5.", "1e", "1e999", "1_0"};

// Strings without their quotation marks.
const Texts kTexts = {"",
                      "",
                      "a",
                      "b",
                      "key",
                      "plain text",
                      "/a/b",
                      "\0"s,
                      "a\0b"s,
                      "\t",
                      "\n",
                      "\x1f",
                      "\x7f",
                      "\x80",
                      "\xff\xfe",
                      "gr\xc3\xbc\xc3\x9f",
                      "\xed\xa0\x80",
                      "\xf0\x9f\x98\x80",
                      "\xc3",
                      "[1]",
                      "{",
                      "// no",
                      "/*",
                      "1.5",
                      "true"};
const Texts kEscapes = {"\\/",     "\\n",     "\\\\",           "\\\"",
                        "\\u0000", "\\u00e9", "\\uD83D\\ude00", "\\b\\f\\r\\t"};
const Texts kOddEscapes = {"\\ud800", "\\udc00", "\\u12", "\\x", "\\", "\\ud83d\\u0041"};

// Mostly one of the usual ones.
const std::string &either(Random &random, const Texts &usual, const Texts &odd) {
  return random.pick(random.oneIn(50) ? odd : usual);
}

std::string randomString(Random &random) {
  std::string text = random.pick(kTexts) + (random.oneIn(4) ? random.pick(kTexts) : "");
  if (random.oneIn(8)) {
    text += either(random, kEscapes, kOddEscapes) + random.pick(kTexts);
  }
  return random.oneIn(200) ? "'" + text + "'" : "\"" + text + "\"";
}

std::string randomScalar(Random &random) {
  switch (random.below(4)) {
  case 0:
    return either(random, kWords, kOddWords);
  case 1:
    return either(random, kNumbers, kOddNumbers);
  default:
    return randomString(random);
  }
}

std::string randomText(Random &random, int depth);

std::string randomList(Random &random, int depth, bool object) {
  std::string text = object ? "{" : "[";
  for (std::size_t count = random.below(4), i = 0; i < count; ++i) {
    text += i == 0 ? "" : ",";
    text += either(random, kSpaces, kOddSpaces);
    if (object) {
      text += randomString(random) + either(random, kSpaces, kOddSpaces) + ":";
    }
    text += randomText(random, depth + 1);
  }
  text += random.oneIn(30) ? "," : "";
  return text + either(random, kSpaces, kOddSpaces) + (object ? "}" : "]");
}

// A JSON text, or something that is nearly one.
std::string randomText(Random &random, int depth) {
  const std::size_t kind = random.below(depth < 3 ? 4 : 2);
  const std::string value = kind < 2 ? randomScalar(random) : randomList(random, depth, kind == 2);
  return either(random, kSpaces, kOddSpaces) + value + either(random, kSpaces, kOddSpaces);
}

void damage(Random &random, std::string &text) {
  constexpr std::string_view kBytes = "\"\"\\\\{}[]:,,/* \t\n\x01-+.eE\xff";
  const char byte = random.oneIn(20) ? '\0' : kBytes[random.below(kBytes.size())];
  const std::size_t at = random.below(text.size() + 1);
  switch (random.below(4)) {
  case 0:
    text.insert(at, 1, byte);
    break;
  case 1:
    text.erase(at, 1);
    break;
  case 2:
    text.resize(at);
    break;
  default:
    text += byte;
  }
}

Value randomValue(Random &random, int depth) {
  const double reals[] = {0.0,
                          -0.0,
                          1.5,
                          0.1,
                          1e17,
                          -2.5e-9,
                          1e300,
                          5e-324,
                          std::numeric_limits<double>::infinity(),
                          -std::numeric_limits<double>::infinity(),
                          std::nan("")};
  std::string bytes;
  for (std::size_t length = random.below(8); length > 0; --length) {
    bytes += random.oneIn(2) ? random.pick(kTexts)
                             : std::string(1, static_cast<char>(random.below(256)));
  }
  Value list(random.oneIn(2) ? Json::arrayValue : Json::objectValue);
  switch (random.below(depth < 4 ? 11 : 9)) {
  case 0:
    return {};
  case 1:
    return random.oneIn(2);
  case 2:
    return static_cast<Json::Int64>(random.below(2000)) - 1000;
  case 3:
    return Value::minInt64 + static_cast<Json::Int64>(random.below(3));
  case 4:
    return Value::maxInt64 - static_cast<Json::Int64>(random.below(3));
  case 5:
    return Value::maxUInt64 - random.below(3);
  case 6:
    return reals[random.below(std::size(reals))];
  case 7:
  case 8:
    return bytes;
  default:
    for (std::size_t count = random.oneIn(10) ? 40 : random.below(5); count > 0; --count) {
      (list.isArray() ? list.append(Value()) : list[bytes + random.pick(kTexts)]) =
          randomValue(random, depth + 1);
    }
    return list;
  }
}

Texts joined(const std::vector<Texts> &lists) {
  Texts all;
  for (const Texts &list : lists) {
    all.insert(all.end(), list.begin(), list.end());
  }
  return all;
}

std::string nested(int depth, const std::string &opening, const std::string &inner,
                   const std::string &closing) {
  std::string text;
  for (int i = 0; i < depth; ++i) {
    text += opening;
  }
  text += inner;
  for (int i = 0; i < depth; ++i) {
    text += closing;
  }
  return text;
}

} // namespace

TEST(JsonLibrary, ReadsRandomTextsAlike) {
  constexpr unsigned kSeed = 4711;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Random random(kSeed);
  int accepted = 0;
  int plain = 0;
  for (int round = 0; round < 60000; ++round) {
    std::string text = randomText(random, 0);
    for (std::size_t times = random.oneIn(5) ? 1 + random.below(2) : 0; times > 0; --times) {
      damage(random, text);
    }
    ASSERT_TRUE(LibraryJson::readsAlike(text)) << testing::PrintToString(text);
    Value value;
    accepted += JsonText::fromText(text, value) ? 1 : 0;
    plain += readPlainJson(text, value) ? 1 : 0;
  }
  EXPECT_LT(10000, plain);
  EXPECT_LT(5000, accepted - plain);
  EXPECT_GT(50000, accepted);
}

// The library counts the length of a member name in 30 bits.
TEST(JsonLibrary, GetsATextOfAGigabyteUnread) {
  constexpr std::size_t kSize = std::size_t{1} << 30;
  void *const unreadable =
      ::mmap(nullptr, kSize, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  ASSERT_NE(MAP_FAILED, unreadable);
  Value value("before");
  EXPECT_FALSE(readPlainJson(std::string_view(static_cast<char *>(unreadable), kSize), value));
  EXPECT_EQ(Value("before"), value);
  EXPECT_EQ(0, ::munmap(unreadable, kSize));
}

TEST(JsonLibrary, ReadsEveryScalarAlikeWhereverItIs) {
  const std::pair<std::string, std::string> kPlaces[] = {
      {"", ""},         {"[", "]"},          {"[0,", "]"}, {"[", ",0]"},
      {"[", ",]"},      {"{\"a\":", "}"},    {"{", ":1}"}, {"{\"a\":[1],\"a\":", "}"},
      {"{\"\":", ",}"}, {"{\"a\":", ",}"},   {"", "\0"s},  {"[\0"s, "]"},
      {"", ","},        {"\xef\xbb\xbf", ""}};
  Texts scalars = joined({kWords, kOddWords, kNumbers, kOddNumbers});
  for (const std::string &text : joined({kTexts, kEscapes, kOddEscapes})) {
    scalars.push_back("\"" + text + "\"");
  }
  for (const std::string &scalar : scalars) {
    for (const std::string &space : joined({kSpaces, kOddSpaces})) {
      for (const auto &[before, after] : kPlaces) {
        std::string text = before;
        text.append(space).append(scalar).append(space).append(after);
        ASSERT_TRUE(LibraryJson::readsAlike(text)) << testing::PrintToString(text);
      }
    }
  }
}

TEST(JsonLibrary, ReadsNestedTextsAlike) {
  for (const int depth : {1, 62, 63, 64, 65, 66, 998, 999, 1000, 1001}) {
    for (const char *inner : {"", "1", "\"x\"", "[]", "{}"}) {
      EXPECT_TRUE(LibraryJson::readsAlike(nested(depth, "[", inner, "]"))) << depth << inner;
      EXPECT_TRUE(LibraryJson::readsAlike(nested(depth, "{\"a\":", inner, "}"))) << depth << inner;
      EXPECT_TRUE(LibraryJson::readsAlike(nested(depth, "[0,{\"a\":", inner, "}]")))
          << depth << inner;
    }
  }
}

TEST(JsonLibrary, ReadsALargeTextAlike) {
  std::string text = "[" + std::string(200, ' ');
  for (int i = 0; i < 20000; ++i) {
    text += "{\"key" + std::to_string(i % 70) + "\":\"" + std::string(40, 'x') + "\"},";
  }
  EXPECT_TRUE(LibraryJson::readsAlike(text + "0]"));
  EXPECT_TRUE(LibraryJson::readsAlike(text + "1.5]"));
  EXPECT_TRUE(LibraryJson::readsAlike(text + "]"));
}

TEST(JsonLibrary, WritesRandomValuesAlike) {
  constexpr unsigned kSeed = 815;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Random random(kSeed);
  for (int round = 0; round < 20000; ++round) {
    const Value value = randomValue(random, 0);
    ASSERT_TRUE(LibraryJson::writesAlike(value)) << LibraryJson::toText(value);
  }
}

TEST(JsonLibrary, WritesEveryByteAndRealAlike) {
  for (int byte = 0; byte < 256; ++byte) {
    const std::string bytes = "a"s + static_cast<char>(byte) + static_cast<char>(byte);
    Value value(Json::objectValue);
    value[bytes] = bytes;
    ASSERT_TRUE(LibraryJson::writesAlike(value)) << byte;
  }
  std::mt19937_64 random(42);
  for (int round = 0; round < 5000; ++round) {
    const double real =
        std::ldexp(static_cast<double>(random()), static_cast<int>(random() % 2000) - 1000);
    ASSERT_TRUE(LibraryJson::writesAlike(Value(real))) << real;
    ASSERT_TRUE(LibraryJson::writesAlike(Value(std::trunc(std::fmod(real, 1e6))))) << real;
  }
}

TEST(JsonLibrary, WritesUnusualValuesAlike) {
  for (const Value &value :
       {Value(Json::stringValue), Value(Json::intValue), Value(Json::uintValue),
        Value(Json::realValue), Value(Json::booleanValue), Value(Json::StaticString("static"))}) {
    EXPECT_TRUE(LibraryJson::writesAlike(value));
  }
  Value commented(Json::arrayValue);
  commented.append(1);
  commented[0].setComment("// a comment"s, Json::commentBefore);
  commented.setComment("/* another */"s, Json::commentAfter);
  EXPECT_TRUE(LibraryJson::writesAlike(commented));
  Value sparse(Json::arrayValue);
  sparse[3] = "x";
  EXPECT_TRUE(LibraryJson::writesAlike(sparse));
  sparse[70] = "y";
  EXPECT_TRUE(LibraryJson::writesAlike(sparse));
}

// A flat value may be stored without a second reading: neither its place nor its text changes it.
TEST(JsonLibrary, ReadsFlatValuesAgainAsTheyAre) {
  constexpr unsigned kSeed = 77;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Random random(kSeed);
  int flat = 0;
  for (int round = 0; round < 30000; ++round) {
    Value value;
    if (!JsonText::fromText(randomText(random, 2), value) || !JsonText::isFlat(value)) {
      continue;
    }
    ++flat;
    Value member(Json::objectValue);
    member["key"] = value;
    Value again;
    ASSERT_TRUE(LibraryJson::fromText(LibraryJson::toText(member), again));
    ASSERT_EQ(member, again) << LibraryJson::toText(member);
  }
  EXPECT_LT(5000, flat);
}

TEST(JsonLibrary, FlatIsWhatHasNoRealAndNoElementsOfElements) {
  const auto isFlat = [](const char *text) {
    Value value;
    return JsonText::fromText(text, value) && JsonText::isFlat(value);
  };
  for (const char *text :
       {"null", "true", "-7", "18446744073709551615", "\"x\"", "[]", "[1,\"x\",null,false]"}) {
    EXPECT_TRUE(isFlat(text)) << text;
  }
  for (const char *text : {"1.5", "[1.5]", "{}", "[[]]", "[{}]", "{\"a\":1}"}) {
    EXPECT_FALSE(isFlat(text)) << text;
  }
}
