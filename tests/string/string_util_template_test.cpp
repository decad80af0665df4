// {{name}} templates: the rules by example, the mappers, and every small text against a plain
// oracle.

#include "kovabackup/string_util.h"

#include "tests/string/plain_replace.h"

#include <boost/bind/bind.hpp>
#include <climits>
#include <gmock/gmock.h>
#include <json/value.h>
#include <random>
#include <stdexcept>

namespace {

using KOVA::Backup::_VarsMapperJson;
using KOVA::Backup::_VarsMapperMapString;
using KOVA::Backup::replaceMustache;
using KovaTest::plainReplace;
using KovaTest::tellNames;
using testing::ElementsAre;
using Vars = std::map<std::string, std::string>;
using Mapper = boost::function<bool(const std::string &, std::string &)>;

struct One {
  const char *text;
  const char *expected;
};

const Vars &vars() {
  static const Vars map = {{"a", "1"},       {"b", "22"},    {"", "empty"},  {" a ", "blanks"},
                           {"x{y", "brace"}, {"A", "upper"}, {"p", "{{a}}"}, {"none", ""}};
  return map;
}

TEST(ReplaceMustache, KeepsATextWithoutPlaceholders) {
  for (const char *text : {"", "plain", "{", "}", "{ {a} }", "{a}", "}}", "a}}b", "{{", "{{a",
                           "{{a}", "{{a} }", "}}{{", "x}}y{{z", "{{{{{{", "}}}}"}) {
    EXPECT_EQ(text, replaceMustache(text, vars()));
  }
}

TEST(ReplaceMustache, PutsTheValueInThePlaceholdersPlace) {
  const One cases[] = {
      {"{{a}}", "1"},
      {"x{{a}}y", "x1y"},
      {"{{a}}{{b}}", "122"},
      {"{{a}} {{b}}!", "1 22!"},
      {"{{a}}{{a}}{{a}}", "111"},
      {"x{{none}}y", "xy"},
      {"{{a}}}}", "1}}"},
      {"{{a}}{{", "1{{"},
  };
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, vars())) << one.text;
  }
}

TEST(ReplaceMustache, GivesTheResultsThatItsHeaderShows) {
  EXPECT_EQ("Backup of photos ended. ",
            replaceMustache("Backup of {{task}} ended. {{why}}", Vars{{"task", "photos"}}));
  const Vars one = {{"x", "1"}};
  EXPECT_EQ("a1b", replaceMustache("a{{x}}b", one));
  EXPECT_EQ("ab", replaceMustache("a{{y}}b", one));
  EXPECT_EQ("", replaceMustache("{{ x }}", one));
  Json::Value json(Json::objectValue);
  json["n"] = 5;
  json["s"] = "t";
  json["z"] = Json::Value();
  EXPECT_EQ("5,t,,", replaceMustache("{{n}},{{s}},{{z}},{{missing}}", json, false));
  EXPECT_EQ("5,\"t\",null,", replaceMustache("{{n}},{{s}},{{z}},{{missing}}", json, true));
}

TEST(ReplaceMustache, DropsAPlaceholderWithoutValue) {
  const One cases[] = {{"a{{x}}b", "ab"}, {"{{x}}", ""}, {"{{x}}{{a}}{{y}}", "1"}};
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, vars())) << one.text;
  }
}

TEST(ReplaceMustache, TakesTheNameExactlyAsItStands) {
  const One cases[] = {
      {"{{ a }}", "blanks"}, {"{{a }}", ""},       {"{{}}", "empty"},
      {"{{A}}", "upper"},    {"{{x{y}}", "brace"},
  };
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, vars())) << one.text;
  }
}

TEST(ReplaceMustache, OpensAtTheLastTwoBracesBeforeTheClosingOnes) {
  const One cases[] = {
      {"{{a {{b}}", "{{a 22"},
      {"{{{a}}", "{1"},
      {"{{{{a}}", "{{1"},
      {"{{{{{a}}", "{{{1"},
      {"{{a}}}", "1}"},
      {"{{{a}}}", "{1}"},
      {"{{a{{b}}c}}", "{{a22c}}"},
      {"{{x {{b}} {{a", "{{x 22 {{a"},
  };
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, vars())) << one.text;
  }
}

TEST(ReplaceMustache, NeverExpandsAValue) {
  EXPECT_EQ("{{a}}1", replaceMustache("{{p}}{{a}}", vars()));
  // A value may complete nothing either.
  const Vars halves = {{"open", "{{"}, {"close", "}}"}, {"a", "1"}};
  EXPECT_EQ("{{a}}", replaceMustache("{{open}}a{{close}}", halves));
}

TEST(ReplaceMustache, TakesTextNamesAndValuesOfAnyBytes) {
  const std::string nul(1, '\0');
  const std::string name = "n" + nul + "\xff";
  const Vars map = {{name, nul + "v"}, {"n", "short"}};
  EXPECT_EQ(nul + "[" + nul + "v]" + nul, replaceMustache(nul + "[{{" + name + "}}]" + nul, map));
}

TEST(ReplaceMustache, AsksTheMapperInOrderWithAnEmptyValueEachTime) {
  std::vector<std::string> names;
  const Mapper mapper = [&names](const std::string &name, std::string &value) {
    EXPECT_EQ("", value);
    names.push_back(name);
    value = "left over";
    return name != "b";
  };
  EXPECT_EQ("left over|left over", replaceMustache("{{a}}|{{b}}{{a}}", mapper));
  EXPECT_THAT(names, ElementsAre("a", "b", "a"));
}

bool shout(const std::string &name, std::string &value, const std::string &mark) {
  value = name + mark;
  return true;
}

TEST(ReplaceMustache, TakesAnyFunctionObject) {
  using namespace boost::placeholders;
  EXPECT_EQ("a!", replaceMustache("{{a}}", Mapper(boost::bind(&shout, _1, _2, "!"))));
  EXPECT_EQ("1", replaceMustache("{{a}}", _VarsMapperMapString(vars())));
}

TEST(ReplaceMustache, ThrowsForAnEmptyMapperOnlyAtAPlaceholder) {
  const Mapper empty;
  for (const char *text : {"", "plain", "{{a", "}}", "{{a}"}) {
    EXPECT_EQ(text, replaceMustache(text, empty));
  }
  try {
    replaceMustache("x{{a}}", empty);
    FAIL() << "nothing was thrown";
  } catch (const boost::bad_function_call &error) {
    EXPECT_STREQ("call to empty boost::function", error.what());
  }
}

TEST(ReplaceMustache, LetsTheMappersExceptionThrough) {
  const Mapper thrower = [](const std::string &, std::string &) -> bool {
    throw std::runtime_error("from the mapper");
  };
  EXPECT_THROW(replaceMustache("{{a}}", thrower), std::runtime_error);
}

// Far beyond the time limit if every brace started a search through the rest of the text.
TEST(ReplaceMustache, GoesThroughLongTextsOnce) {
  const std::size_t count = 2000000;
  std::string opens;
  std::string placeholders;
  for (std::size_t i = 0; i < count; ++i) {
    opens += "{{";
    placeholders += "{{a}}";
  }
  const std::string closes(2 * count, '}');
  EXPECT_EQ(opens, replaceMustache(opens, vars()));
  EXPECT_EQ(closes, replaceMustache(closes, vars()));
  EXPECT_EQ(opens.substr(2) + "empty" + closes.substr(2), replaceMustache(opens + closes, vars()));
  EXPECT_EQ(std::string(count, '1'), replaceMustache(placeholders, vars()));
  EXPECT_EQ(std::string(count, '1') + closes, replaceMustache(placeholders + closes, vars()));
}

// All texts of up to this many letters more than text has.
void compareFrom(const std::string &text, std::size_t letters) {
  const Mapper mapper = &tellNames;
  ASSERT_EQ(plainReplace(text, mapper), replaceMustache(text, mapper))
      << testing::PrintToString(text);
  for (const char letter : {'{', '}', 'a', ' ', '\0'}) {
    if (letters > 0 && !testing::Test::HasFatalFailure()) {
      compareFrom(text + letter, letters - 1);
    }
  }
}

TEST(ReplaceMustache, AgreesWithThePlainRulesOnEverySmallText) {
  compareFrom("", 7);
  compareFrom("{{", 6);
}

TEST(ReplaceMustache, AgreesWithThePlainRulesOnRandomTexts) {
  constexpr unsigned kSeed = 20240611;
  std::printf("seed %u\n", kSeed);
  std::mt19937 random(kSeed);
  const Mapper mapper = &tellNames;
  // Braces three times as often as other letters; otherwise placeholders would be rare.
  const char letters[] = {'{', '{', '{', '}', '}', '}', 'a', ' ', '\0'};
  for (int round = 0; round < 50000; ++round) {
    std::string text(random() % 80, ' ');
    for (char &letter : text) {
      letter = letters[random() % sizeof letters];
    }
    ASSERT_EQ(plainReplace(text, mapper), replaceMustache(text, mapper))
        << testing::PrintToString(text);
  }
}

TEST(VarsMapperMapString, RefersToTheMapAndCopiesNothing) {
  Vars map;
  const _VarsMapperMapString mapper(map);
  map["late"] = "1";
  std::string value;
  EXPECT_TRUE(mapper("late", value));
  EXPECT_EQ("1", value);
}

TEST(VarsMapperMapString, LeavesTheValueOfAnAbsentNameAlone) {
  const _VarsMapperMapString mapper(vars());
  std::string value = "before";
  EXPECT_FALSE(mapper("missing", value));
  EXPECT_EQ("before", value);
  EXPECT_TRUE(mapper("none", value));
  EXPECT_EQ("", value);
}

Json::Value oneOfEachType() {
  Json::Value value(Json::objectValue);
  value["n"] = 5;
  value["negative"] = -1;
  value["long"] = static_cast<Json::Int64>(LLONG_MAX);
  value["unsigned"] = static_cast<Json::UInt64>(ULLONG_MAX);
  value["real"] = 0.5;
  value["yes"] = true;
  value["s"] = "t \"q\"\n\xc3\xa9";
  value["z"] = Json::Value();
  value["list"].append("x");
  value["list"].append(Json::Value());
  value["object"]["k"] = "v";
  value["empty"] = "";
  return value;
}

TEST(ReplaceMustacheFromJson, PutsInBareStringsNothingForNullAndJsonForTheRest) {
  const One cases[] = {
      {"{{n}}", "5"},
      {"{{negative}}", "-1"},
      {"{{long}}", "9223372036854775807"},
      {"{{unsigned}}", "18446744073709551615"},
      {"{{real}}", "0.5"},
      {"{{yes}}", "true"},
      {"{{s}}", "t \"q\"\n\xc3\xa9"},
      {"[{{z}}]", "[]"},
      {"[{{empty}}]", "[]"},
      {"{{list}}", "[\"x\",null]"},
      {"{{object}}", "{\"k\":\"v\"}"},
      {"[{{missing}}]", "[]"},
  };
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, oneOfEachType(), false)) << one.text;
  }
}

TEST(ReplaceMustacheFromJson, PutsInTheJsonTextOfEveryTypeWhenAsked) {
  const One cases[] = {
      {"{{n}}", "5"},          {"{{yes}}", "true"},   {"{{s}}", "\"t \\\"q\\\"\\n\xc3\xa9\""},
      {"[{{z}}]", "[null]"},   {"{{empty}}", "\"\""}, {"{{list}}", "[\"x\",null]"},
      {"[{{missing}}]", "[]"},
  };
  for (const One &one : cases) {
    EXPECT_EQ(one.expected, replaceMustache(one.text, oneOfEachType(), true)) << one.text;
  }
}

TEST(ReplaceMustacheFromJson, TakesNamesAndTextsWithNulBytes) {
  const std::string name("n\0m", 3);
  Json::Value value(Json::objectValue);
  value[name] = std::string("v\0w", 3);
  value["n"] = "short";
  EXPECT_EQ(std::string("v\0w", 3), replaceMustache("{{" + name + "}}", value, false));
  EXPECT_EQ("short", replaceMustache("{{n}}", value, false));
}

TEST(ReplaceMustacheFromJson, FindsNoMembersInWhatIsNoObject) {
  Json::Value array(Json::arrayValue);
  array.append("a");
  for (const Json::Value &value : {Json::Value(), array, Json::Value("a"), Json::Value(1),
                                   Json::Value(1.5), Json::Value(true)}) {
    EXPECT_EQ("[]", replaceMustache("[{{a}}{{0}}{{}}]", value, false)) << value.toStyledString();
    EXPECT_EQ("[]", replaceMustache("[{{a}}{{0}}{{}}]", value, true)) << value.toStyledString();
  }
}

TEST(VarsMapperJson, RefersToTheObjectAndCopiesNothing) {
  Json::Value json(Json::objectValue);
  const _VarsMapperJson mapper(json, false);
  json["late"] = "1";
  std::string value;
  EXPECT_TRUE(mapper("late", value));
  EXPECT_EQ("1", value);
}

TEST(VarsMapperJson, LeavesTheValueOfAnAbsentNameAlone) {
  const Json::Value json = oneOfEachType();
  const _VarsMapperJson mapper(json, false);
  std::string value = "before";
  EXPECT_FALSE(mapper("missing", value));
  EXPECT_EQ("before", value);
  EXPECT_TRUE(mapper("z", value));
  EXPECT_EQ("", value);
}

TEST(VarsMapperJson, FindsNothingInWhatIsNotAnObject) {
  const Json::Value json("text");
  std::string value = "before";
  EXPECT_FALSE(_VarsMapperJson(json, false)("text", value));
  EXPECT_EQ("before", value);
}

TEST(VarsMapperJson, GivesStringsBareUnlessJsonIsAskedFor) {
  Json::Value json(Json::objectValue);
  json["name"] = "photos";
  std::string value;
  EXPECT_TRUE(_VarsMapperJson(json, false)("name", value));
  EXPECT_EQ("photos", value);
  EXPECT_TRUE(_VarsMapperJson(json, true)("name", value));
  EXPECT_EQ("\"photos\"", value);
}

TEST(VarsMapperJson, GivesTheJsonTextOfWhatIsNotAString) {
  Json::Value json(Json::objectValue);
  json["list"].append(1);
  std::string value;
  EXPECT_TRUE(_VarsMapperJson(json, false)("list", value));
  EXPECT_EQ("[1]", value);
}

} // namespace
