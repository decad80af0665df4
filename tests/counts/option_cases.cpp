// Options in memory, and secrets. The size is the number of options unless a comment says
// otherwise.

#include "kovabackup/option_map.h"

#include "tests/counts/counted.h"

namespace KovaCounts {
namespace {

using KOVA::Backup::OptionMap;
using Strings = std::list<std::string>;

std::string keyOf(std::size_t index) {
  return "option" + std::to_string(100000 + index);
}

void fill(OptionMap &map, std::size_t options) {
  for (std::size_t i = 0; i < options; ++i) {
    require(map.optSet(keyOf(i), "value"), "an option");
  }
}

void set(std::size_t options) {
  count([&] {
    OptionMap map;
    fill(map, options);
    return true;
  });
}

void get(std::size_t options) {
  OptionMap map;
  fill(map, options);
  count([&] {
    std::string value;
    for (std::size_t i = 0; i < options; ++i) {
      if (!map.optGet(keyOf(i), value)) {
        return false;
      }
    }
    return value == "value";
  });
}

// One of each type.
void types(std::size_t) {
  count([] {
    OptionMap map;
    int number = 0;
    bool flag = false;
    return map.optSet("number", 42) && map.optSet("flag", true) && map.optGet("number", number) &&
           map.optGet("flag", flag) && map.optInt("none", 7) == 7 && map.optRemove("flag") &&
           number == 42 && flag;
  });
}

// The size is the number of entries.
void list(std::size_t entries) {
  const Strings value(entries, "entry");
  count([&] {
    OptionMap map;
    Strings back;
    return map.optSet("list", value) && map.optGet("list", back) && back == value;
  });
}

void copy(std::size_t options) {
  OptionMap map;
  fill(map, options);
  count([&] {
    const OptionMap other(map);
    OptionMap assigned;
    assigned = other;
    return assigned.optString(keyOf(options - 1), "") == "value";
  });
}

void toJson(std::size_t options) {
  OptionMap map;
  fill(map, options);
  count([&] { return map.optToJsonString().size() > options; });
}

void fromJson(std::size_t options) {
  OptionMap map;
  fill(map, options);
  const std::string text = map.optToJsonString();
  count([&] {
    OptionMap other;
    return other.optLoadJsonString(text) && other.optAppendJsonString(text);
  });
}

// The size is that of the secret in bytes.
void secret(std::size_t bytes) {
  (void)scratchFolder(); // which has the key
  const std::string clear(bytes, 's');
  count([&] {
    OptionMap map;
    return map.optSet("secret", clear, true) && map.optSecret("secret", "") == clear;
  });
}

constexpr Case kCases[] = {
    {"OptionMap.optSet", set, {10, 500}, 500, kLinearLog},
    {"OptionMap.optGet", get, {10, 500}, 500, kLinearLog},
    {"OptionMap.types", types},
    {"OptionMap.list", list, {10, 500}, 500, kLinearLog},
    {"OptionMap.copy", copy, {10, 500}, 500, kLinearLog},
    {"OptionMap.optToJsonString", toJson, {10, 500}, 500},
    {"OptionMap.optLoadJsonString", fromJson, {10, 500}, 500, kLinearLog},
    {"OptionMap.secret", secret, {16, 1024}, 8192},
};

} // namespace

Cases optionCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
