#include "base/json_text.h"

#include "tests/base/library_json.h"
#include "tests/support/alloc_failure.h"

#include <cstdlib>
#include <gmock/gmock.h>
#include <limits>
#include <locale>
#include <random>
#include <string>
#include <thread>
#include <unistd.h>

using namespace KOVA::Base;
using Json::Value;
using KovaTest::forEachAllocation;
using KovaTest::forEachMalloc;

namespace {

std::string text(const Value &value) {
  return JsonText::toText(value);
}

Value parsed(const std::string &json) {
  Value value;
  EXPECT_TRUE(JsonText::fromText(json, value)) << json;
  return value;
}

// A byte string as a string, as an array element and as a member name.
Value everywhere(const std::string &bytes) {
  Value value(Json::objectValue);
  value["string"] = bytes;
  value["array"].append(bytes);
  value["object"][bytes] = 1;
  return value;
}

std::string nested(int depth) {
  const auto count = static_cast<std::size_t>(depth);
  return std::string(count, '[') + std::string(count, ']');
}

struct CommaLocale : std::numpunct<char> {
  char do_thousands_sep() const override { return '.'; }
  std::string do_grouping() const override { return "\3"; }
  char do_decimal_point() const override { return ','; }
};

// The global C++ locale has a decimal comma while an object of this class exists.
class ScopedCommaLocale {
public:
  ScopedCommaLocale() : before_(std::locale::global({std::locale(), new CommaLocale})) {}
  ~ScopedCommaLocale() { std::locale::global(before_); }
  ScopedCommaLocale(const ScopedCommaLocale &) = delete;
  ScopedCommaLocale &operator=(const ScopedCommaLocale &) = delete;

private:
  std::locale before_;
};

} // namespace

TEST(JsonToText, IsCompactOnOneLine) {
  Value value(Json::objectValue);
  value["b"] = true;
  value["a"].append(1);
  value["a"].append("x");
  value["c"]["d"] = Value();
  EXPECT_EQ(R"({"a":[1,"x"],"b":true,"c":{"d":null}})", text(value));
}

TEST(JsonToText, NeverBreaksALongValue) {
  Value value(Json::objectValue);
  for (int i = 0; i < 200; ++i) {
    value["list"].append(std::string(50, 'x'));
    value["lists"].append(Value(Json::arrayValue)).append(i);
  }
  EXPECT_EQ(std::string::npos, text(value).find('\n'));
  EXPECT_EQ(value, parsed(text(value)));
}

TEST(JsonToText, EmptyValues) {
  EXPECT_EQ("null", text(Value()));
  EXPECT_EQ("{}", text(Value(Json::objectValue)));
  EXPECT_EQ("[]", text(Value(Json::arrayValue)));
  EXPECT_EQ("\"\"", text(Value("")));
}

TEST(JsonToText, EscapesWhatJsonMustAndNothingElse) {
  EXPECT_EQ(R"("\"\\/\b\f\n\r\t\u0000\u0001\u001f)"
            "\x7f\"",
            text(Value(std::string("\"\\/\b\f\n\r\t\0\x01\x1f\x7f", 12))));
}

TEST(JsonToText, BytesPastAsciiStayAsTheyAre) {
  EXPECT_EQ("\"gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80 \xff\xfe\"",
            text(Value("gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80 \xff\xfe")));
}

TEST(JsonToText, ExtremeIntegersInDecimal) {
  EXPECT_EQ("-9223372036854775808", text(Value(Value::minInt64)));
  EXPECT_EQ("9223372036854775807", text(Value(Value::maxInt64)));
  EXPECT_EQ("18446744073709551615", text(Value(Value::maxUInt64)));
  EXPECT_EQ("-2147483648", text(Value(Value::minInt)));
}

// Numbers are written the same under every locale that the host process may have set.
TEST(JsonToText, DoesNotGroupDigits) {
  const ScopedCommaLocale locale;
  EXPECT_EQ("1234567", text(Value(1234567)));
  EXPECT_EQ("1234.5", text(Value(1234.5)));
}

TEST(JsonFromText, ReadsNumbersUnderEveryLocaleAlike) {
  const ScopedCommaLocale locale;
  for (const char *number : {"1.5", "-1.5", "1234.5", "1e+100", "0.125", "-0.0", "1234567"}) {
    EXPECT_EQ(number, text(parsed(number)));
  }
  EXPECT_EQ("1.5", text(parsed("1.500")));
  EXPECT_EQ("1234.567", text(parsed(" 1234.567 ")));
  EXPECT_EQ("1000.0", text(parsed("1e3")));
  EXPECT_EQ("1.8446744073709552e+19", text(parsed("18446744073709551616")));
  EXPECT_EQ("-9.2233720368547758e+18", text(parsed("-9223372036854775809")));
  EXPECT_EQ(R"({"a":[1.5,"1.5",2,{"b":-0.5}],"c":1500.0})",
            text(parsed(R"({ "a" : [1.500,"1.5",2,{"b":-5e-1}], "c":0.25, "c":1.5e3})")));
  EXPECT_EQ(R"(["\"1.5",1.5])", text(parsed(R"(["\"1.5",1.5])")));
  EXPECT_EQ(R"(["1.5\\",1.5])", text(parsed(R"(["1.5\\",1.5])")));
  // The library allows comments here. Quotation marks in them do not begin a string.
  for (const char *commented : {"{/*\"*/\"a\":1.500}", "{/*/\"*/\"a\":1.500}",
                                "{//\"\r\"a\":1.500}", "{//\"\n\"a\":1.500}"}) {
    EXPECT_EQ(R"({"a":1.5})", text(parsed(commented))) << commented;
  }
  Value value;
  for (const char *refused : {"1,5", "1e", "1e999", "[1.5 2.5]", "1.5.5", "1.5x", "\"1.5"}) {
    EXPECT_FALSE(JsonText::fromText(refused, value)) << refused;
  }
}

// Reals are removed from the text before the library reads it, which must not make a difference.
TEST(JsonFromText, AcceptsAndRefusesWhatTheLibraryDoes) {
  constexpr unsigned kSeed = 1187;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  const std::string pieces[] = {"1",
                                "0",
                                "25",
                                "9223372036854775808",
                                "18446744073709551615",
                                ".",
                                ".",
                                "e",
                                "E",
                                "+",
                                "-",
                                "[",
                                "]",
                                ",",
                                " ",
                                "\"",
                                "\\",
                                "/",
                                "*",
                                "/*\"*/",
                                "\n",
                                "//",
                                "e-3",
                                "{\"a\":",
                                "}"};
  int taken = 0;
  for (int round = 0; round < 200000; ++round) {
    std::string json = round % 2 == 0 ? "[" : "";
    for (auto count = random() % 9; count > 0; --count) {
      json += pieces[random() % std::size(pieces)];
    }
    json += round % 2 == 0 ? "]" : "";
    Value value;
    ASSERT_TRUE(KovaTest::LibraryJson::readsAlike(json)) << json;
    taken += JsonText::fromText(json, value) ? 1 : 0;
  }
  EXPECT_LT(1000, taken);
}

TEST(JsonText, RestoresEveryByteAndEveryPairOfBytes) {
  for (int first = 0; first < 256; ++first) {
    const std::string one(1, static_cast<char>(first));
    ASSERT_EQ(everywhere(one), parsed(text(everywhere(one)))) << first;
    for (int second = 0; second < 256; ++second) {
      const std::string two = one + static_cast<char>(second);
      Value value(Json::objectValue);
      value[two] = two;
      ASSERT_EQ(value, parsed(text(value))) << first << ' ' << second;
    }
  }
}

TEST(JsonText, RestoresRandomByteStrings) {
  constexpr unsigned kSeed = 20240607;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  // Bytes with a meaning in JSON or UTF-8 are frequent.
  const std::string often("\"\\u{}[]:,/\0\n\xc3\xed\xa0\x80\xf0\x9f\xff", 18);
  for (int round = 0; round < 20000; ++round) {
    std::string bytes;
    for (auto length = random() % 24; length > 0; --length) {
      bytes +=
          (random() % 2) != 0 ? often[random() % often.size()] : static_cast<char>(random() % 256);
    }
    ASSERT_EQ(everywhere(bytes), parsed(text(everywhere(bytes)))) << testing::PrintToString(bytes);
  }
}

TEST(JsonText, RestoresIntegersWithTheirSign) {
  for (const Value &value :
       {Value(0), Value(-1), Value(Value::minInt64), Value(Value::maxInt64),
        Value(Value::maxUInt64), Value(Value::minInt), Value(Value::maxUInt)}) {
    EXPECT_EQ(value.asString(), parsed(text(value)).asString());
    EXPECT_TRUE(parsed(text(value)).isIntegral());
  }
}

TEST(JsonText, RestoresFiniteReals) {
  using Limits = std::numeric_limits<double>;
  for (const double real : {0.1, 1.5, -2.5e-9, 1.0 / 3, 5.0, -0.0, 1e17, Limits::max(),
                            Limits::lowest(), Limits::min(), Limits::denorm_min()}) {
    const Value back = parsed(text(Value(real)));
    EXPECT_EQ(Json::realValue, back.type()) << real;
    EXPECT_EQ(real, back.asDouble());
  }
}

TEST(JsonText, NumbersThatAreNotFiniteHaveNoText) {
  EXPECT_EQ("null", text(Value(std::numeric_limits<double>::quiet_NaN())));
  Value value;
  EXPECT_FALSE(JsonText::fromText(text(Value(std::numeric_limits<double>::infinity())), value));
}

TEST(JsonFromText, ReadsEveryType) {
  EXPECT_EQ(Value(), parsed("null"));
  EXPECT_EQ(Value(true), parsed("true"));
  EXPECT_EQ(Value(false), parsed("false"));
  EXPECT_EQ(Value(-3), parsed("-3"));
  EXPECT_EQ(Value(1.5), parsed("1.5"));
  EXPECT_EQ(Value("a b"), parsed("\"a b\""));
  EXPECT_EQ(Value(Json::arrayValue), parsed("[]"));
  EXPECT_EQ(Value(Json::objectValue), parsed("{}"));
}

TEST(JsonFromText, AllowsWhiteSpaceAroundTheValue) {
  EXPECT_EQ(Value(1), parsed(" \t\r\n1 \t\r\n"));
}

TEST(JsonFromText, DecodesUnicodeEscapes) {
  EXPECT_EQ(Value("\xc3\xa9"), parsed(R"("\u00e9")"));
  EXPECT_EQ(Value("\xe2\x82\xac"), parsed(R"("\u20AC")"));
  EXPECT_EQ(Value("\xf0\x9f\x98\x80"), parsed(R"("\ud83d\ude00")"));
  EXPECT_EQ(Value(std::string("\0", 1)), parsed(R"("\u0000")"));
}

TEST(JsonFromText, RawControlCharactersRepresentThemselves) {
  EXPECT_EQ(Value("a\tb\nc"), parsed("\"a\tb\nc\""));
  EXPECT_EQ(Value(std::string("a\0b", 3)), parsed(std::string("\"a\0b\"", 5)));
}

TEST(JsonFromText, TheLastOfEqualMembersCounts) {
  EXPECT_EQ(R"({"a":2})", text(parsed(R"({"a":1,"a":2})")));
  EXPECT_EQ(R"({"a":{"y":2}})", text(parsed(R"({"a":{"x":1},"a":{"y":2}})")));
}

class JsonRefused : public testing::TestWithParam<std::string> {};

TEST_P(JsonRefused, AndTheValueIsUnchanged) {
  Value value("before");
  EXPECT_FALSE(JsonText::fromText(GetParam(), value));
  EXPECT_EQ(Value("before"), value);
}

INSTANTIATE_TEST_SUITE_P(NoValue, JsonRefused,
                         testing::Values("", " ", "oops", "tru", "nul", "'a'", "NaN", "Infinity",
                                         "0x10", "--1", "1e", ".5", "1e999"));
INSTANTIATE_TEST_SUITE_P(Unfinished, JsonRefused,
                         testing::Values("\"abc", "\"\\", "\"\\u12", R"("\ud800")", R"("\x")", "[1",
                                         "{\"a\":1", "{\"a\"", "{\"a\":}"));
INSTANTIATE_TEST_SUITE_P(MoreText, JsonRefused,
                         testing::Values("1 2", "1,2", "\"a\" \"b\"", "{}{}", "[1]]", "{\"a\":1}}",
                                         "1 // no", "/* no */ 1", "1 /* no */",
                                         "\xef\xbb\xbf"
                                         "1"));
INSTANTIATE_TEST_SUITE_P(NulBytes, JsonRefused,
                         testing::Values(std::string("1\0", 2),
                                         std::string("\0"
                                                     "1",
                                                     2),
                                         std::string("[1]\0", 4), std::string("\"a\" \n\0", 6),
                                         std::string("[1\0]", 4), std::string("{}\0{}", 5)));
INSTANTIATE_TEST_SUITE_P(Commas, JsonRefused,
                         testing::Values("[1,]", "{\"a\":1,}", "[,1]", "[,]", "[1 2]"));
INSTANTIATE_TEST_SUITE_P(Comments, JsonRefused,
                         testing::Values("[1,/*no*/2]", "[/*no*/1]", "{\"a\":/*no*/1}",
                                         "{\"a\"/*no*/:1}"));

TEST(JsonFromText, NestingPastTheLimitIsRefusedNotThrown) {
  Value value("before");
  EXPECT_TRUE(JsonText::fromText(nested(1000), value));
  EXPECT_FALSE(JsonText::fromText(nested(1001), value));
  EXPECT_FALSE(JsonText::fromText(nested(100000), value));
  EXPECT_FALSE(JsonText::fromText(std::string(1000000, '['), value));
  EXPECT_EQ(nested(1000), text(value));
  EXPECT_EQ(Value(1), parsed("1")); // the reader works after a refusal
}

// A text that is truncated when memory runs out would be saved as if it were complete.
TEST(JsonToText, IsCompleteOrThrowsWhenMemoryRunsOut) {
  Value value = everywhere(std::string(300, 'x') + "\n\xff");
  value["numbers"].append(1.5);
  value["numbers"].append(-12345678);
  const std::string complete = text(value);
  std::string got;
  forEachAllocation(
      [&] {
        got.clear();
        got = text(value);
      },
      [&](bool threw) {
        EXPECT_EQ(threw ? std::string() : complete, got);
        EXPECT_EQ(complete, text(value)) << "the writer works after a failure";
      });
}

TEST(JsonFromText, IsReadOrThrowsWhenMemoryRunsOut) {
  Value original = everywhere(std::string(300, 'x') + "\n\xff");
  original["reals"].append(1.5);
  original["reals"].append(2e19);
  const std::string json = text(original);
  Value value;
  bool read = false;
  forEachAllocation(
      [&] {
        value = Value("before");
        read = JsonText::fromText(json, value);
      },
      [&](bool threw) {
        EXPECT_TRUE(threw || read);
        EXPECT_EQ(Value(7), parsed("7")) << "the reader works after a failure";
      });
  EXPECT_EQ(json, text(value));
  for (const char *real : {"1.5", "18446744073709551616", "-9223372036854775809"}) {
    forEachAllocation([&] { read = JsonText::fromText("[" + std::string(real) + "]", value); },
                      [&](bool threw) { EXPECT_TRUE(threw || read) << real; });
  }
}

// The JSON library reports it with the same type of exception as a text that is nested too deeply.
TEST(JsonFromText, IsReadOrThrowsWhenMemoryRunsOutInTheLibrary) {
  for (const char *json : {R"({"a":"text","b":["text"]})", R"({"a":"text\n","b":["text",1.5]})"}) {
    Value value;
    bool read = false;
    forEachMalloc([&] { read = JsonText::fromText(json, value); },
                  [&](bool threw) {
                    EXPECT_TRUE(threw || read);
                    EXPECT_EQ(Value(7.5), parsed("7.5")) << "the reader works after a failure";
                  });
    EXPECT_EQ(json, text(value));
  }
}

TEST(JsonText, EachThreadHasItsOwnReaderAndWriter) {
  const auto work = [](int number) {
    for (int round = 0; round < 2000; ++round) {
      const Value value = everywhere(std::to_string(number) + "\xff" + std::to_string(round));
      ASSERT_EQ(value, parsed(text(value)));
    }
  };
  std::thread other(work, 1);
  work(2);
  other.join();
}

// Static objects are destroyed after the reader and writer of the main thread.
TEST(JsonTextDeathTest, ServesTheDestructorsOfStaticObjects) {
  const auto useBoth = [] { return text(parsed(R"({"a":[1.5,"x"]})")) == R"({"a":[1.5,"x"]})"; };
  EXPECT_TRUE(useBoth());
  EXPECT_EXIT(
      {
        (void)useBoth();
        (void)std::atexit([] {
          Value value;
          const bool read = JsonText::fromText("[1.5,2]", value);
          ::_exit(read && JsonText::toText(value) == "[1.5,2]" ? 42 : 1);
        });
        std::exit(0);
      },
      testing::ExitedWithCode(42), "");
}
