// Which values the configuration takes: those that the JSON library reads in its strict mode and
// that have the right type.

#include "platform/config/config.h"

#include <gmock/gmock.h>
#include <json/json.h>
#include <memory>
#include <optional>
#include <random>
#include <string>

using namespace KovaPlatform;

namespace {

// The text without the white space around it, which belongs to the line.
std::string trimmed(const std::string &text) {
  const std::size_t first = text.find_first_not_of(" \t\r");
  return first == std::string::npos
             ? ""
             : text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

std::optional<Json::Value> readStrictly(const std::string &text) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false; // any value, not only lists and objects
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &value, nullptr)) {
      return std::nullopt;
    }
  } catch (const Json::Exception &) {
    return std::nullopt; // nested past the limit
  }
  return value;
}

bool isPath(const Json::Value &value) {
  return value.isString() && value.asString().substr(0, 1) == "/" &&
         value.asString().find('\0') == std::string::npos;
}

bool isPathList(const Json::Value &value) {
  bool all = value.isArray();
  for (Json::ArrayIndex i = 0; all && i < value.size(); ++i) {
    all = isPath(value[i]);
  }
  return all;
}

bool isInteger(const Json::Value &value) {
  return value.type() == Json::intValue || value.type() == Json::uintValue;
}

std::optional<Config> parsed(const std::string &key, const std::string &text) {
  Config config;
  ConfigError error;
  const std::string section = key == "exclude" ? "[mounts]\n" : "[volume v]\npath=\"/v\"\n";
  if (!parseConfig(section + key + "=" + text + "\n", config, error)) {
    EXPECT_EQ("the value of '" + key + "' must be ",
              error.what.substr(0, error.what.find(" be ") + 4));
    return std::nullopt;
  }
  return config;
}

// Returns: whether the value is accepted for one of the keys.
bool expectAsStrictlyRead(const std::string &text) {
  SCOPED_TRACE(testing::PrintToString(text));
  const std::optional<Json::Value> value = readStrictly(trimmed(text));

  const std::optional<Config> path = parsed("path", text);
  EXPECT_EQ(value && isPath(*value), path.has_value());

  const std::optional<Config> exclude = parsed("exclude", text);
  EXPECT_EQ(value && isPathList(*value), exclude.has_value());

  const std::optional<Config> type = parsed("fsType", text);
  EXPECT_EQ(value && isInteger(*value) && value->isInt() && value->asInt() >= 0, type.has_value());
  EXPECT_TRUE(!type || type->volumes[0].fsType == value->asInt());

  const std::optional<Config> size = parsed("size", text);
  EXPECT_EQ(value && isInteger(*value) && value->isUInt64(), size.has_value());
  EXPECT_TRUE(!size || size->volumes[0].size == value->asUInt64());

  const std::optional<Config> removable = parsed("removable", text);
  EXPECT_EQ(value && value->isBool(), removable.has_value());
  EXPECT_TRUE(!removable || removable->volumes[0].removable == value->asBool());

  return path || exclude || size || removable;
}

const char *const kMark = "\xef\xbb\xbf"; // a byte order mark

} // namespace

TEST(ConfigValue, IsTakenAsTheStrictReaderTakesIt) {
  for (const std::string text : {R"("/a")", R"("\/a")", R"("/\u00e9")", "\"/\xff\"", "\"/\t\"",
                                 "[]", "[ ]", R"(["/a"])", R"([ "/a" , "/b" ])", "0", "1", "-0",
                                 "01", "2147483647", "18446744073709551615", "true", "false"}) {
    EXPECT_TRUE(expectAsStrictlyRead(text));
    EXPECT_TRUE(expectAsStrictlyRead(kMark + text)) << "one mark before a value is passed over";
    EXPECT_TRUE(expectAsStrictlyRead(std::string(kMark) + " " + text));
  }
}

TEST(ConfigValue, IsRefusedAsTheStrictReaderRefusesIt) {
  for (const std::string text : {"",
                                 "/a",
                                 "'/a'",
                                 "\"/a",
                                 "\"a\"",
                                 "\"\"",
                                 "\"/\\u0000\"",
                                 "\"/a\" \"/b\"",
                                 "\"/a\",",
                                 "[,]",
                                 "[\"/a\",]",
                                 "[,\"/a\"]",
                                 "[\"/a\" \"/b\"]",
                                 "[\"/a\",null]",
                                 "[[\"/a\"]]",
                                 "[/*c*/]",
                                 "[] // c",
                                 "// c",
                                 "/*c*/ 1",
                                 "1 /*c*/",
                                 "# c",
                                 "1 2",
                                 "-1",
                                 "+",
                                 "1.0",
                                 "1e2",
                                 "1.5",
                                 "1,5",
                                 "2e999",
                                 "18446744073709551616",
                                 "-9223372036854775809",
                                 "NaN",
                                 "Infinity",
                                 "-Infinity",
                                 "nul",
                                 "null",
                                 "True",
                                 "yes",
                                 "{}",
                                 R"({"a":1})",
                                 R"({"a":1,"a":2})",
                                 R"([{"a":1,"a":2}])",
                                 "{1:2}",
                                 "{/*c*/}"}) {
    EXPECT_FALSE(expectAsStrictlyRead(text));
    EXPECT_FALSE(expectAsStrictlyRead(kMark + text));
  }
  for (const std::string text : {"1", "\"/a\"", "[]", "true"}) {
    EXPECT_FALSE(expectAsStrictlyRead(kMark + (kMark + text))) << "two marks";
    EXPECT_FALSE(expectAsStrictlyRead(text + kMark)) << "a mark after the value";
    EXPECT_FALSE(expectAsStrictlyRead("\xef\xbb" + text)) << "half a mark";
  }
}

TEST(ConfigValue, NestingHasTheStrictReadersLimit) {
  for (const std::size_t depth : {999U, 1000U, 1001U, 5000U}) {
    EXPECT_FALSE(expectAsStrictlyRead(std::string(depth, '[') + std::string(depth, ']')));
    EXPECT_FALSE(expectAsStrictlyRead(std::string(depth, '[')));
  }
}

TEST(ConfigValue, AgreesWithTheStrictReaderOnRandomTexts) {
  constexpr unsigned kSeed = 4117;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  const std::string pieces[] = {"\"/a\"", "\"/", "\"", "\\", "/", "[", "]",  ",",    "{", "}",
                                ":",      "0",   "7",  "-",  ".", "e", "\r", "true", " ", "\t",
                                "null",   "//",  "/*", "*/", "#", "=", "+",  kMark,  "'", "\"a\":"};
  int taken = 0;
  for (int round = 0; round < 20000 && !testing::Test::HasFailure(); ++round) {
    std::string text = round % 4 == 0 ? "[" : "";
    for (auto count = random() % 5; count > 0; --count) {
      text += pieces[random() % std::size(pieces)];
    }
    taken += expectAsStrictlyRead(text + (round % 4 == 0 ? "]" : "")) ? 1 : 0;
  }
  EXPECT_LT(500, taken);
}
