// Random templates with maps and JSON objects of odd names and values, against a plain oracle that
// looks each name up in the container.

#include "kovabackup/string_util.h"

#include "base/json_text.h"
#include "tests/string/plain_replace.h"

#include <gtest/gtest.h>
#include <limits>
#include <random>

namespace {

using KOVA::Backup::replaceMustache;
using KovaTest::plainReplace;
using Vars = std::map<std::string, std::string>;

constexpr unsigned kSeed = 20261122;

class Random {
public:
  std::size_t below(std::size_t limit) { return engine_() % limit; }

  // Of any length, mostly short. Names must collide now and then, so there are few letters.
  std::string name() {
    const std::string letters("ab\0 {}\xff", 7);
    std::string made(below(8) == 0 ? below(40) : below(6), ' ');
    for (char &letter : made) {
      letter = letters[below(2) == 0 ? below(2) : below(letters.size())];
    }
    return made;
  }

  // Some longer than what is gathered before it is appended to the result.
  std::string value() {
    const char *const odd[] = {"", "{{", "}}", "{{a}}", "{", "}"};
    switch (below(40)) {
    case 0:
      return std::string(3000 + below(3000), 'v');
    case 1:
      return std::string("\0v", 2);
    default:
      return below(3) == 0 ? odd[below(6)] : "value" + std::to_string(below(1000));
    }
  }

  // Known, unknown and nested names between texts with braces of their own.
  std::string text(const std::vector<std::string> &names) {
    const char *const odd[] = {"{{", "}}", "{", "}", " ", "text", "{{{", "}}}", "{{}}", "x\ny"};
    std::string made;
    for (std::size_t pieces = below(below(10) == 0 ? 2000 : 20); pieces > 0; --pieces) {
      switch (below(8)) {
      case 0:
      case 1:
        made += odd[below(10)];
        break;
      case 2:
        made += "{{" + name() + "}}";
        break;
      default:
        made += "{{" + (names.empty() ? "" : names[below(names.size())]) + "}}";
      }
    }
    return made + (below(50) == 0 ? std::string(10000, ' ') : "");
  }

private:
  std::mt19937 engine_{kSeed};
};

// So many that both an index and plain lookups occur.
std::vector<std::string> makeNames(Random &random) {
  const std::size_t sizes[] = {0, 1, 2, 5, 40, 300, 1365};
  std::vector<std::string> names(sizes[random.below(7)]);
  for (std::string &name : names) {
    name = random.name() + (random.below(3) == 0 ? std::to_string(random.below(2000)) : "");
  }
  return names;
}

TEST(ReplaceMustacheRandom, AgreesWithPlainLookupsInAMap) {
  std::printf("seed %u\n", kSeed);
  Random random;
  for (int round = 0; round < 300; ++round) {
    const std::vector<std::string> names = makeNames(random);
    Vars vars;
    for (const std::string &name : names) {
      vars[name] = random.value();
    }
    const auto mapper = [&vars](const std::string &name, std::string &value) {
      const auto found = vars.find(name);
      value = found == vars.end() ? "" : found->second;
      return found != vars.end();
    };
    for (int texts = 0; texts < 5; ++texts) {
      const std::string text = random.text(names);
      ASSERT_EQ(plainReplace(text, mapper), replaceMustache(text, vars))
          << round << ": " << testing::PrintToString(text);
    }
  }
}

Json::Value makeJson(Random &random) {
  const Json::Value numbers[] = {0,
                                 -1,
                                 true,
                                 false,
                                 0.1,
                                 -0.0,
                                 1e300,
                                 5e-324,
                                 std::numeric_limits<double>::infinity(),
                                 std::numeric_limits<double>::quiet_NaN(),
                                 Json::Value::maxLargestUInt,
                                 Json::Value::minLargestInt};
  Json::Value made;
  switch (random.below(10)) {
  case 0:
    return Json::Value();
  case 1:
    return numbers[random.below(12)];
  case 2:
    return Json::Value(Json::objectValue);
  case 3:
    made.append(random.value());
    made.append(Json::Value());
    return made;
  case 4:
    made = Json::Value(Json::objectValue);
    made["k"] = random.value();
    return made;
  case 5:
    return Json::StaticString("static\0cut");
  case 6:
    return Json::Value(Json::stringValue);
  default:
    return random.value();
  }
}

// What a member's text is, said with the JSON library's plain calls.
bool plainMember(const Json::Value &vars, bool asJson, const std::string &name,
                 std::string &value) {
  if (!vars.isMember(name)) {
    return false;
  }
  const Json::Value &member = vars[name];
  if (!asJson && member.isNull()) {
    value = "";
  } else if (!asJson && member.isString()) {
    value = member.asString();
  } else {
    value = KOVA::Base::JsonText::toText(member);
  }
  return true;
}

TEST(ReplaceMustacheRandom, AgreesWithPlainLookupsInAJsonObject) {
  std::printf("seed %u\n", kSeed);
  Random random;
  for (int round = 0; round < 150; ++round) {
    const std::vector<std::string> names = makeNames(random);
    Json::Value vars(Json::objectValue);
    for (const std::string &name : names) {
      vars[name] = makeJson(random);
    }
    for (int texts = 0; texts < 5; ++texts) {
      const bool asJson = random.below(2) == 0;
      const auto mapper = [&](const std::string &name, std::string &value) {
        return plainMember(vars, asJson, name, value);
      };
      const std::string text = random.text(names);
      ASSERT_EQ(plainReplace(text, mapper), replaceMustache(text, vars, asJson))
          << round << ": " << testing::PrintToString(text);
    }
  }
}

} // namespace
