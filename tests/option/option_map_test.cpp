// Typed values in memory: getters, setters, copying, clearing. Only secrets call the platform; they
// are tested in secret_test.

#include "kovabackup/option_map.h"

#include "tests/option/fake_platform.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <climits>
#include <cstring>
#include <gmock/gmock.h>
#include <json/value.h>
#include <limits>
#include <type_traits>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using Strings = std::list<std::string>;

class OptionGet : public PlatformTest {};
class OptionSet : public PlatformTest {};
class OptionRemove : public PlatformTest {};
class OptionClear : public PlatformTest {};
class OptionCopy : public PlatformTest {};
class OptionConversion : public PlatformTest {};

OptionMap fromJson(const std::string &text) {
  OptionMap map;
  EXPECT_TRUE(map.optLoadJsonString(text)) << text;
  return map;
}

OptionMap loaded(const TestFolder &dir) {
  OptionMap map;
  EXPECT_TRUE(map.optSectionLoad(writeFile(dir / "conf", "[task12]\na=1\n"), "task", 12));
  return map;
}

} // namespace

TEST_F(OptionGet, AbsentKeysGiveTheDefault) {
  const OptionMap map;
  EXPECT_EQ("def", map.optString("key", "def"));
  EXPECT_EQ("def", map.optSecret("key", "def"));
  EXPECT_EQ(7, map.optInt("key", 7));
  EXPECT_TRUE(map.optBool("key", true));
  EXPECT_FALSE(map.optBool("key", false));
  EXPECT_THAT(platform.decrypted, IsEmpty());
}

TEST_F(OptionGet, AbsentKeysLeaveTheOutputAlone) {
  const OptionMap map;
  std::string text = "before";
  char buf[8] = "before";
  int number = 7;
  long long big = 8;
  bool flag = true;
  Strings list = {"before"};
  EXPECT_FALSE(map.optGet("key", text));
  EXPECT_FALSE(map.optGet("key", text, true));
  EXPECT_FALSE(map.optGet("key", buf, sizeof buf));
  EXPECT_FALSE(map.optGet("key", buf, sizeof buf, true));
  EXPECT_FALSE(map.optGet("key", number));
  EXPECT_FALSE(map.optGet("key", big));
  EXPECT_FALSE(map.optGet("key", flag));
  EXPECT_FALSE(map.optGet("key", list));
  EXPECT_EQ("before", text);
  EXPECT_STREQ("before", buf);
  EXPECT_EQ(7, number);
  EXPECT_EQ(8, big);
  EXPECT_TRUE(flag);
  EXPECT_THAT(list, ElementsAre("before"));
}

TEST_F(OptionSet, TextComesBackUnchanged) {
  OptionMap map;
  const std::string bytes("a\0b\xff \n", 6);
  EXPECT_TRUE(map.optSet("key", bytes));
  std::string out;
  EXPECT_TRUE(map.optGet("key", out));
  EXPECT_EQ(bytes, out);
  EXPECT_EQ(bytes, map.optString("key", "def"));
}

TEST_F(OptionSet, ALiteralIsTextNeverABool) {
  OptionMap map;
  EXPECT_TRUE(map.optSet("key", "text"));
  EXPECT_EQ(R"({"key":"text"})", map.optToJsonString());
}

TEST_F(OptionSet, EachTypeHasItsJsonType) {
  OptionMap map;
  EXPECT_TRUE(map.optSet("bool", true));
  EXPECT_TRUE(map.optSet("int", 5));
  EXPECT_TRUE(map.optSet("list", Strings{"x", "y"}));
  EXPECT_TRUE(map.optSet("long", 5000000000LL));
  EXPECT_TRUE(map.optSet("text", std::string("5")));
  EXPECT_EQ(R"({"bool":true,"int":5,"list":["x","y"],"long":5000000000,"text":"5"})",
            map.optToJsonString());
}

TEST_F(OptionSet, ReplacesAValueOfAnyType) {
  OptionMap map;
  map.optSet("key", Strings{"x"});
  map.optSet("key", 1);
  EXPECT_EQ(R"({"key":1})", map.optToJsonString());
  map.optSet("key", false);
  map.optSet("key", "text");
  EXPECT_EQ(R"({"key":"text"})", map.optToJsonString());
}

TEST_F(OptionSet, IntegersComeBackAtTheirExtremes) {
  OptionMap map;
  for (const int value : {0, -3, INT_MIN, INT_MAX}) {
    map.optSet("key", value);
    int out = 1;
    EXPECT_TRUE(map.optGet("key", out));
    EXPECT_EQ(value, out);
    EXPECT_EQ(value, map.optInt("key", 1));
  }
  for (const long long value : {0LL, LLONG_MIN, LLONG_MAX, 4294967296LL}) {
    map.optSet("key", value);
    long long out = 1;
    EXPECT_TRUE(map.optGet("key", out));
    EXPECT_EQ(value, out);
  }
}

TEST_F(OptionSet, BoolsComeBack) {
  OptionMap map;
  for (const bool value : {true, false}) {
    map.optSet("key", value);
    bool out = !value;
    EXPECT_TRUE(map.optGet("key", out));
    EXPECT_EQ(value, out);
    EXPECT_EQ(value, map.optBool("key", !value));
  }
}

TEST_F(OptionSet, ListsComeBackInOrderAndReplaceTheOutput) {
  OptionMap map;
  map.optSet("key", Strings{"b", "", std::string("a\0", 2), "b"});
  Strings out = {"before"};
  EXPECT_TRUE(map.optGet("key", out));
  EXPECT_THAT(out, ElementsAre("b", "", std::string("a\0", 2), "b"));
}

TEST_F(OptionSet, AnEmptyListIsAListWithNothingInIt) {
  OptionMap map;
  map.optSet("key", Strings());
  EXPECT_EQ(R"({"key":[]})", map.optToJsonString());
  Strings out = {"before"};
  EXPECT_TRUE(map.optGet("key", out));
  EXPECT_THAT(out, IsEmpty());
}

TEST_F(OptionSet, AnyBytesCanBeAKey) {
  OptionMap map;
  for (const std::string &key : {std::string(), std::string("a\0b", 3), std::string("=[#]\n"),
                                 std::string("a"), std::string("\xff")}) {
    map.optSet(key, key);
  }
  EXPECT_EQ(std::string("a\0b", 3), map.optString(std::string("a\0b", 3), ""));
  EXPECT_EQ("a", map.optString("a", ""));
  EXPECT_EQ("=[#]\n", map.optString("=[#]\n", ""));
  EXPECT_EQ("", map.optString("", "def"));
}

TEST_F(OptionGet, BuffersAreCutToTheirSize) {
  OptionMap map;
  map.optSet("key", "abcdef");
  char buf[8];
  std::memset(buf, '#', sizeof buf);
  EXPECT_TRUE(map.optGet("key", buf, 4));
  EXPECT_EQ(std::string("abc\0####", 8), std::string(buf, 8));
  EXPECT_TRUE(map.optGet("key", buf, 7));
  EXPECT_STREQ("abcdef", buf);
  EXPECT_TRUE(map.optGet("key", buf, 1));
  EXPECT_STREQ("", buf);
  std::memset(buf, '#', sizeof buf);
  EXPECT_TRUE(map.optGet("key", buf, 0));
  EXPECT_EQ("########", std::string(buf, 8));
}

TEST_F(OptionGet, TextInABufferEndsAtItsFirstNul) {
  OptionMap map;
  map.optSet("key", std::string("ab\0cd", 5));
  char buf[8] = "";
  EXPECT_TRUE(map.optGet("key", buf, sizeof buf));
  EXPECT_STREQ("ab", buf);
}

TEST_F(OptionConversion, AnIntAsTextIsItsDecimalForm) {
  OptionMap map;
  map.optSet("key", 5);
  EXPECT_EQ("5", map.optString("key", ""));
  std::string out;
  EXPECT_TRUE(map.optGet("key", out));
  EXPECT_EQ("5", out);
}

TEST_F(OptionConversion, FollowsTheTableOfTheHeader) {
  const OptionMap map = fromJson(
      R"({"int":-5,"zero":0,"true":true,"false":false,"null":null,"real":2.75,"text":"12"})");
  const auto text = [&](const char *key) { return map.optString(key, "def"); };
  EXPECT_EQ("-5", text("int"));
  EXPECT_EQ("true", text("true"));
  EXPECT_EQ("false", text("false"));
  EXPECT_EQ("", text("null"));
  EXPECT_EQ("2.75", text("real"));
  EXPECT_EQ(1, map.optInt("true", 9));
  EXPECT_EQ(0, map.optInt("false", 9));
  EXPECT_EQ(0, map.optInt("null", 9));
  EXPECT_EQ(2, map.optInt("real", 9));
  long long big = 9;
  EXPECT_TRUE(map.optGet("real", big));
  EXPECT_EQ(2, big);
  EXPECT_TRUE(map.optBool("int", false));
  EXPECT_FALSE(map.optBool("zero", true));
  EXPECT_FALSE(map.optBool("null", true));
  EXPECT_TRUE(map.optBool("real", false));
}

TEST_F(OptionConversion, WhatCannotBeConvertedThrowsAndChangesNothing) {
  const OptionMap map = fromJson(
      R"({"list":["x"],"object":{"a":1},"text":"5","big":5000000000,"huge":1e300,"mixed":["a",[]]})");
  std::string text = "before";
  char buf[8] = "before";
  int number = 7;
  long long big = 7;
  bool flag = true;
  Strings list = {"before"};
  for (const char *key : {"list", "object"}) {
    EXPECT_THROW(map.optString(key, ""), Json::LogicError);
    EXPECT_THROW(map.optSecret(key, ""), Json::LogicError);
    EXPECT_THROW(map.optGet(key, text), Json::LogicError);
    EXPECT_THROW(map.optGet(key, buf, sizeof buf), Json::LogicError);
    EXPECT_THROW(map.optInt(key, 0), Json::LogicError);
    EXPECT_THROW(map.optGet(key, big), Json::LogicError);
    EXPECT_THROW(map.optBool(key, true), Json::LogicError);
  }
  EXPECT_THROW(map.optGet("text", number), Json::LogicError);
  EXPECT_THROW(map.optGet("text", big), Json::LogicError);
  EXPECT_THROW(map.optGet("text", flag), Json::LogicError);
  EXPECT_THROW(map.optGet("big", number), Json::LogicError);
  EXPECT_THROW(map.optGet("huge", big), Json::LogicError);
  EXPECT_THROW(map.optGet("big", buf, sizeof buf), Json::LogicError) << "text only";
  EXPECT_THROW(map.optGet("mixed", list), Json::LogicError);
  EXPECT_EQ("before", text);
  EXPECT_STREQ("before", buf);
  EXPECT_EQ(7, number);
  EXPECT_EQ(7, big);
  EXPECT_TRUE(flag);
  EXPECT_THAT(list, ElementsAre("before"));
}

TEST_F(OptionConversion, ListElementsAreConvertedOneByOne) {
  const OptionMap map = fromJson(
      R"({"list":["x",1,true,null],"object":{"b":"B","a":"A"},"text":"x","null":null,"int":1})");
  Strings out;
  EXPECT_TRUE(map.optGet("list", out));
  EXPECT_THAT(out, ElementsAre("x", "1", "true", ""));
  EXPECT_TRUE(map.optGet("object", out));
  EXPECT_THAT(out, ElementsAre("A", "B"));
  for (const char *key : {"text", "null", "int"}) {
    out = {"before"};
    EXPECT_TRUE(map.optGet(key, out)) << key;
    EXPECT_THAT(out, IsEmpty()) << key;
  }
}

TEST_F(OptionGet, ANullValueIsPresent) {
  const OptionMap map = fromJson(R"({"key":null})");
  std::string out = "before";
  EXPECT_TRUE(map.optGet("key", out));
  EXPECT_EQ("", out);
}

TEST_F(OptionRemove, TellsWhetherThereWasAValue) {
  OptionMap map = fromJson(R"({"text":"x","null":null})");
  EXPECT_TRUE(map.optRemove("text"));
  EXPECT_FALSE(map.optRemove("text"));
  EXPECT_FALSE(map.optRemove("null")) << "null counts as nothing";
  EXPECT_FALSE(map.optRemove("absent"));
  EXPECT_EQ("{}", map.optToJsonString());
}

TEST_F(OptionRemove, LeavesTheBindingAlone) {
  const TestFolder dir;
  OptionMap map = loaded(dir);
  EXPECT_TRUE(map.optRemove("a"));
  EXPECT_TRUE(map.optIsLoaded());
  EXPECT_EQ(12, map.optSectionGetId());
  EXPECT_EQ("task12", map.optSectionGetName());
}

TEST_F(OptionClear, ANewMapIsUnboundAndNotLoaded) {
  const OptionMap map;
  EXPECT_FALSE(map.optIsLoaded());
  EXPECT_EQ(-1, map.optSectionGetId());
  EXPECT_EQ("", map.optSectionGetName());
}

TEST_F(OptionClear, EmptiesAndUnbinds) {
  const TestFolder dir;
  OptionMap map = loaded(dir);
  EXPECT_TRUE(map.optIsLoaded());
  EXPECT_TRUE(map.optClear());
  EXPECT_EQ("{}", map.optToJsonString());
  EXPECT_FALSE(map.optIsLoaded());
  EXPECT_EQ(-1, map.optSectionGetId());
  EXPECT_EQ("", map.optSectionGetName());
  EXPECT_TRUE(map.optClear());
}

TEST_F(OptionClear, KeepsTokenAndLock) {
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("clear"));
  ASSERT_TRUE(map.lock());
  map.optClear();
  LogCapture log;
  EXPECT_FALSE(map.setLockToken("other")) << "still held";
  log.take();
  EXPECT_TRUE(map.unlock());
  EXPECT_TRUE(map.lock()) << "still the same token";
  EXPECT_TRUE(map.unlock());
}

TEST_F(OptionCopy, CarriesValuesAndBinding) {
  const TestFolder dir;
  const OptionMap map = loaded(dir);
  const OptionMap copy(map);
  OptionMap assigned;
  assigned.optSet("other", 1);
  EXPECT_EQ(&assigned, &(assigned = map));
  OptionMap cloned;
  EXPECT_TRUE(map.optCloneTo(cloned));
  const OptionMap *const copies[] = {&copy, &assigned, &cloned};
  for (const OptionMap *each : copies) {
    EXPECT_EQ(R"({"a":1})", each->optToJsonString());
    EXPECT_TRUE(each->optIsLoaded());
    EXPECT_EQ(12, each->optSectionGetId());
    EXPECT_EQ("task12", each->optSectionGetName());
  }
}

TEST_F(OptionCopy, ChangesNothingInItsSource) {
  OptionMap map;
  map.optSet("list", Strings{"x"});
  OptionMap copy(map);
  copy.optSet("list", 1);
  copy.optSet("more", 2);
  EXPECT_EQ(R"({"list":["x"]})", map.optToJsonString());
}

TEST_F(OptionCopy, OfItselfChangesNothing) {
  const TestFolder dir;
  OptionMap map = loaded(dir);
  const OptionMap &same = map;
  map = same;
  EXPECT_TRUE(map.optCloneTo(map));
  EXPECT_EQ(R"({"a":1})", map.optToJsonString());
  EXPECT_TRUE(map.optIsLoaded());
  EXPECT_EQ("task12", map.optSectionGetName());
}

TEST_F(OptionCopy, HasTheSameLockDescriptor) {
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("copy"));
  ASSERT_TRUE(map.lock());
  OptionMap copy(map);
  EXPECT_TRUE(copy.unlock());
  OptionMap other;
  ASSERT_TRUE(other.setLockToken("copy"));
  EXPECT_TRUE(other.lock()) << "the one lock is released";
  EXPECT_TRUE(other.unlock());
}

// JSON that is not an object holds no options, and nothing throws.
class OptionTopLevelOf : public PlatformTest, public testing::WithParamInterface<const char *> {};

TEST_P(OptionTopLevelOf, HoldsNoOptions) {
  const OptionMap map = fromJson(GetParam());
  EXPECT_EQ(GetParam(), map.optToJsonString());
  EXPECT_EQ(7, map.optInt("key", 7));
  Strings out = {"before"};
  EXPECT_FALSE(map.optGet("key", out));
  EXPECT_THAT(out, ElementsAre("before"));
}

TEST_P(OptionTopLevelOf, HasNothingToRemove) {
  OptionMap map = fromJson(GetParam());
  EXPECT_FALSE(map.optRemove("key"));
  EXPECT_EQ(GetParam(), map.optToJsonString());
}

TEST_P(OptionTopLevelOf, CanBeCleared) {
  OptionMap map = fromJson(GetParam());
  EXPECT_TRUE(map.optClear());
  EXPECT_EQ(GetParam()[0] == '[' ? "[]" : "null", map.optToJsonString());
}

TEST_P(OptionTopLevelOf, GivesWayToTheFirstOptionSet) {
  OptionMap map = fromJson(GetParam());
  EXPECT_TRUE(map.optSet("key", 1));
  EXPECT_EQ(R"({"key":1})", map.optToJsonString());
}

TEST_P(OptionTopLevelOf, MergesAsAnEmptyMap) {
  OptionMap map = fromJson(GetParam());
  EXPECT_TRUE(map.optAppendJsonString("{}"));
  EXPECT_EQ(GetParam(), map.optToJsonString());
  EXPECT_TRUE(map.optAppendJsonString(R"({"key":1})"));
  EXPECT_EQ(R"({"key":1})", map.optToJsonString());
}

INSTANTIATE_TEST_SUITE_P(Values, OptionTopLevelOf,
                         testing::Values("[1,{\"key\":2}]", "5", "1.5", "\"key\"", "true", "null"));

TEST(OptionMapType, HoldsOnePointer) {
  EXPECT_EQ(sizeof(void *), sizeof(OptionMap));
  EXPECT_FALSE(std::is_polymorphic<OptionMap>::value);
}
