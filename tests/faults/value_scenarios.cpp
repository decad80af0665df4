// The options of a map in memory.

#include "kovabackup/option_map.h"
#include "tests/faults/allocations.h"
#include "tests/faults/attempt.h"

#include <array>
#include <list>
#include <sstream>
#include <string>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::OptionMap;

// Longer than any buffer for short texts.
const std::string kLong = "a text that is longer than what a string holds in itself";
constexpr const char *kBefore = R"({"flag":true,"name":"old","paths":["/a","/b"],"retries":3})";

OptionMap makeMap() {
  const UncountedAllocations pause;
  OptionMap map;
  (void)map.optLoadJsonString(kBefore);
  return map;
}

void sayLeft(const std::string &name, const OptionMap &map) {
  const UncountedAllocations pause;
  say((name + ", left").c_str(), map.optToJsonString());
}

// Changes a map, and says what is in it afterwards.
template <typename Operation>
void change(const char *name, const Operation &operation) {
  OptionMap map = makeMap();
  attempt(name, [&] { return operation(map); });
  sayLeft(name, map);
}

void changeValues() {
  change("set text", [](OptionMap &map) { return map.optSet("name", kLong); });
  change("set C text", [](OptionMap &map) { return map.optSet("name", kLong.c_str()); });
  change("set new", [](OptionMap &map) { return map.optSet(kLong, kLong); });
  change("set int", [](OptionMap &map) { return map.optSet("name", 5); });
  change("set long", [](OptionMap &map) { return map.optSet(kLong, 5000000000LL); });
  change("set bool", [](OptionMap &map) { return map.optSet(kLong, true); });
  change("set list", [](OptionMap &map) {
    return map.optSet("paths", std::list<std::string>{kLong, "/c"});
  });
  change("remove", [](OptionMap &map) { return map.optRemove("paths"); });
  change("clear", [](OptionMap &map) { return map.optClear(); });
  change("load JSON", [](OptionMap &map) { return map.optLoadJsonString(R"({"new":["x",1]})"); });
  change("append JSON", [](OptionMap &map) {
    return map.optAppendJsonString(R"({"name":{"deep":"value"},"new":"x"})");
  });
}

void copyValues() {
  const OptionMap source = makeMap();
  change("clone", [&](OptionMap &map) { return source.optCloneTo(map); });
  change("assign", [&](OptionMap &map) {
    map = source;
    return true;
  });
  attempt("copy", [&] {
    const OptionMap copy(source);
    return copy.optInt("retries", 0);
  });
  attempt("written", [&] {
    std::ostringstream out;
    out << source;
    return out.good() ? out.str() : std::string(kBadAlloc); // a stream keeps the exception
  });
}

// Says what it read, or what was there before if it threw.
template <typename Value>
void read(const char *name, const OptionMap &map, const char *key, Value value) {
  const Value before = value;
  attempt(name, [&] { return map.optGet(key, value); });
  say((std::string(name) + ", read").c_str(), std::string_view(value == before ? "before" : "new"));
}

void readValues() {
  const OptionMap map = makeMap();
  attempt("text", [&] { return map.optString("name", kLong) + map.optString("none", kLong); });
  attempt("secret", [&] { return map.optSecret("none", kLong); });
  attempt("int", [&] { return map.optInt("retries", 0); });
  attempt("bool", [&] { return map.optBool("flag", false); });
  attempt("JSON", [&] { return map.optToJsonString(); });
  read("get text", map, "name", std::string("before"));
  read("get int", map, "retries", 1);
  read("get long", map, "retries", 1LL);
  read("get bool", map, "flag", false);
  read("get list", map, "paths", std::list<std::string>{"before"});
  attempt("get buffer", [&] {
    std::array<char, 3> buffer{};
    return map.optGet("name", buffer.data(), buffer.size()) ? std::string(buffer.data())
                                                            : std::string("false");
  });
}

// What a change leaves is the new content if it succeeded, and the old or the new one otherwise.
// The members of a JSON object are stored one by one.
void checkLeft(const Seen &seen, Findings &findings) {
  const std::string suffix = ", left";
  for (const auto &[key, value] : seen.said) {
    const std::size_t at = key.rfind(suffix);
    if (seen.clean == nullptr || at == std::string::npos) {
      continue;
    }
    const std::string name = key.substr(0, at);
    checkAttempt(seen, findings, name);
    const bool isNew = value == seen.clean->valueOf(key);
    const bool isOld = value == kBefore || name == "append JSON";
    findings.expect(isNew || (isOld && seen.valueOf(name) == kBadAlloc), name + " leaves " + value);
  }
}

// A list that could not be read to its end may hold its beginning.
void checkRead(const Seen &seen, Findings &findings) {
  for (const auto &[key, value] : seen.said) {
    const std::size_t at = key.rfind(", read");
    if (at == std::string::npos) {
      checkAttempt(seen, findings, key);
    } else {
      const bool read = seen.isTrue(key.substr(0, at));
      findings.expect(value == (read ? "new" : "before") || key == "get list, read",
                      key + " is " + value);
    }
  }
}

} // namespace

void addValueScenarios(Scenarios &all) {
  all.push_back({"options changed", [] {}, changeValues, checkLeft, {}});
  all.push_back({"options copied", [] {}, copyValues, checkLeft, {}});
  all.push_back({"options read", [] {}, readValues, checkRead, {}});
}

} // namespace KovaTest::Faults
