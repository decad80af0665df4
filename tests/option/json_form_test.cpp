// The JSON form: values to text and back, merging, streaming. The binding never changes.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/files.h"

#include <climits>
#include <gmock/gmock.h>
#include <sstream>

using namespace KOVA::Backup;
using namespace KovaTest;

namespace {

class JsonForm : public PlatformTest {
protected:
  OptionMap map_;
};
class JsonLoad : public JsonForm {};
class JsonAppend : public JsonForm {};

} // namespace

TEST_F(JsonForm, OfAMapThatNeverHeldAnythingIsNull) {
  EXPECT_EQ("null", map_.optToJsonString());
  map_.optClear();
  EXPECT_EQ("null", map_.optToJsonString());
}

TEST_F(JsonForm, OfAMapThatIsEmptyAgainIsAnObject) {
  map_.optSet("key", 1);
  map_.optRemove("key");
  EXPECT_EQ("{}", map_.optToJsonString());
}

TEST_F(JsonForm, IsOneCompactLine) {
  map_.optSet("b", "x\ny\xc3\xa9");
  map_.optSet("a", std::list<std::string>{"1", "2"});
  EXPECT_EQ("{\"a\":[\"1\",\"2\"],\"b\":\"x\\ny\xc3\xa9\"}", map_.optToJsonString());
}

TEST_F(JsonForm, CarriesThe64BitExtremes) {
  map_.optSet("max", LLONG_MAX);
  map_.optSet("min", LLONG_MIN);
  EXPECT_EQ(R"({"max":9223372036854775807,"min":-9223372036854775808})", map_.optToJsonString());
  OptionMap back;
  EXPECT_TRUE(back.optLoadJsonString(map_.optToJsonString()));
  long long out = 0;
  EXPECT_TRUE(back.optGet("max", out));
  EXPECT_EQ(LLONG_MAX, out);
  EXPECT_TRUE(back.optGet("min", out));
  EXPECT_EQ(LLONG_MIN, out);
}

TEST_F(JsonForm, BringsEveryByteStringBack) {
  std::string all;
  for (int byte = 0; byte < 256; ++byte) {
    all += static_cast<char>(byte);
  }
  map_.optSet(all, all);
  map_.optSet("list", std::list<std::string>{all, ""});
  OptionMap back;
  EXPECT_TRUE(back.optLoadJsonString(map_.optToJsonString()));
  EXPECT_EQ(all, back.optString(all, ""));
  EXPECT_EQ(map_.optToJsonString(), back.optToJsonString());
}

TEST_F(JsonForm, StreamsExactlyThatText) {
  map_.optSet("key", "x");
  std::ostringstream os;
  EXPECT_EQ(&os, &(os << map_));
  EXPECT_EQ(map_.optToJsonString(), os.str());
}

TEST_F(JsonForm, NeverShowsOrChangesTheBinding) {
  const TestFolder dir;
  ASSERT_TRUE(map_.optSectionLoad(writeFile(dir / "conf", "[task12]\na=1\n"), "task", 12));
  EXPECT_EQ(R"({"a":1})", map_.optToJsonString());
  EXPECT_TRUE(map_.optLoadJsonString(R"({"b":2})"));
  EXPECT_TRUE(map_.optAppendJsonString(R"({"c":3})"));
  EXPECT_EQ(R"({"b":2,"c":3})", map_.optToJsonString());
  EXPECT_TRUE(map_.optIsLoaded());
  EXPECT_EQ("task12", map_.optSectionGetName());
  EXPECT_EQ(12, map_.optSectionGetId());
}

TEST_F(JsonLoad, ReplacesAllOptions) {
  map_.optSet("gone", 1);
  EXPECT_TRUE(map_.optLoadJsonString(" {\"key\" : [ \"x\" ] } \n"));
  EXPECT_EQ(R"({"key":["x"]})", map_.optToJsonString());
}

TEST_F(JsonLoad, OfABadTextIsFalseAndChangesNothing) {
  map_.optSet("key", 1);
  for (const char *text : {"", "oops", "{\"key\":2", "{\"key\":2}x", "{\"key\":2,}"}) {
    EXPECT_FALSE(map_.optLoadJsonString(text)) << text;
    EXPECT_EQ(R"({"key":1})", map_.optToJsonString());
  }
}

TEST_F(JsonLoad, TakesAListWhichNoGetterLooksIntoAndASetterReplaces) {
  for (const std::string text : {"[\"name\",2]", "7", "\"name\""}) {
    map_.optSet("name", "x");
    EXPECT_TRUE(map_.optLoadJsonString(text));
    EXPECT_EQ(text, map_.optToJsonString());
    EXPECT_EQ("none", map_.optString("name", "none"));
    int out = 9;
    EXPECT_FALSE(map_.optGet("name", out));
    EXPECT_FALSE(map_.optRemove("name"));
    EXPECT_TRUE(map_.optSet("number", 5));
    EXPECT_EQ("{\"number\":5}", map_.optToJsonString());
  }
}

TEST_F(JsonLoad, OfEndlessNestingIsFalse) {
  EXPECT_FALSE(map_.optLoadJsonString(std::string(100000, '[')));
  EXPECT_EQ("null", map_.optToJsonString());
}

TEST_F(JsonAppend, ReplacesAddsAndKeeps) {
  map_.optSet("alpha", 5);
  map_.optSet("gamma", true);
  EXPECT_TRUE(map_.optAppendJsonString(R"({"alpha":1,"beta":"x"})"));
  EXPECT_EQ(R"({"alpha":1,"beta":"x","gamma":true})", map_.optToJsonString());
}

TEST_F(JsonAppend, DoesNotMergeDeeply) {
  ASSERT_TRUE(map_.optLoadJsonString(R"({"a":{"x":1,"y":2},"b":[1,2,3]})"));
  EXPECT_TRUE(map_.optAppendJsonString(R"({"a":{"x":9},"b":[4]})"));
  EXPECT_EQ(R"({"a":{"x":9},"b":[4]})", map_.optToJsonString());
}

TEST_F(JsonAppend, MergesANullMemberToo) {
  map_.optSet("key", 1);
  EXPECT_TRUE(map_.optAppendJsonString(R"({"key":null})"));
  EXPECT_EQ(R"({"key":null})", map_.optToJsonString());
}

TEST_F(JsonAppend, OfWhatHasNoMembersChangesNothing) {
  map_.optSet("key", 1);
  for (const char *text : {"", "oops", "{\"key\":2", "[2]", "5", "\"key\"", "null", "{}", "true"}) {
    EXPECT_TRUE(map_.optAppendJsonString(text)) << text;
    EXPECT_EQ(R"({"key":1})", map_.optToJsonString()) << text;
  }
}

TEST_F(JsonAppend, OfWhatHasNoMembersLeavesANewMapNew) {
  EXPECT_TRUE(map_.optAppendJsonString("oops"));
  EXPECT_TRUE(map_.optAppendJsonString("{}"));
  EXPECT_EQ("null", map_.optToJsonString());
}

TEST_F(JsonAppend, FillsANewMap) {
  EXPECT_TRUE(map_.optAppendJsonString(R"({"key":1})"));
  EXPECT_EQ(R"({"key":1})", map_.optToJsonString());
}
