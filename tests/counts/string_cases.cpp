// Formatting and templates.

#include "kovabackup/string_util.h"

#include "tests/counts/counted.h"

namespace KovaCounts {
namespace {

using KOVA::Backup::replaceMustache;
using KOVA::Backup::stringf;
using Vars = std::map<std::string, std::string>;

constexpr int kNames = 20;

void format(std::size_t bytes) {
  const std::string text(bytes, 'x');
  count([&] {
    return stringf("%s: task %d of %lld", text.c_str(), 7, 123456789012LL).size() == bytes + 24;
  });
}

std::string valueOf(int name) {
  return "the value of name " + std::to_string(name);
}

Vars makeVars() {
  Vars vars;
  for (int i = 0; i < kNames; ++i) {
    vars["name" + std::to_string(i)] = valueOf(i);
  }
  return vars;
}

Json::Value makeJson() {
  Json::Value vars(Json::objectValue);
  for (int i = 0; i < kNames; ++i) {
    vars["name" + std::to_string(i)] = valueOf(i);
  }
  return vars;
}

// A sentence for each placeholder, cut to the size.
std::string makeTemplate(std::size_t bytes) {
  std::string text;
  for (int i = 0; text.size() < bytes; ++i) {
    text += "The task reported this about the {{name" + std::to_string(i % kNames) + "}}. ";
  }
  text.resize(bytes);
  return text;
}

void mustacheOfMap(std::size_t bytes) {
  const Vars vars = makeVars();
  const std::string text = makeTemplate(bytes);
  count([&] { return replaceMustache(text, vars).size() > bytes; });
}

void mustacheOfJson(std::size_t bytes) {
  const Json::Value vars = makeJson();
  const std::string text = makeTemplate(bytes);
  count([&] { return replaceMustache(text, vars, false).size() > bytes; });
}

void mustacheOfJsonTexts(std::size_t bytes) {
  const Json::Value vars = makeJson();
  const std::string text = makeTemplate(bytes);
  count([&] { return replaceMustache(text, vars, true).size() > bytes; });
}

void unchanged(const std::string &text) {
  const Vars vars = makeVars();
  count([&] { return replaceMustache(text, vars) == text; });
}

void mustachePlainText(std::size_t bytes) {
  unchanged(std::string(bytes, 'x'));
}

void mustacheOpenBraces(std::size_t bytes) {
  unchanged(std::string(bytes, '{'));
}

void mustacheUnclosed(std::size_t bytes) {
  unchanged(repeated("{{name1 ", bytes / 8));
}

void mustacheClosingBraces(std::size_t bytes) {
  unchanged(repeated("}} {", bytes / 4));
}

// All placeholders open before the first one closes, so only the innermost is one.
void mustacheNested(std::size_t bytes) {
  const Vars vars = makeVars();
  const std::string text = repeated("{{a", bytes / 6) + repeated("}}b", bytes / 6);
  count([&] { return replaceMustache(text, vars).size() == text.size() - 5; });
}

void mustacheLongName(std::size_t bytes) {
  const std::string name(bytes, 'n');
  const Vars vars = {{name, "value"}};
  const std::string text = "{{" + name + "}}";
  count([&] { return replaceMustache(text, vars) == "value"; });
}

// Each placeholder has a name of its own.
void mustacheManyNames(std::size_t names) {
  Vars vars;
  std::string text;
  for (std::size_t i = 0; i < names; ++i) {
    vars["name" + std::to_string(i)] = "value";
    text += "{{name" + std::to_string(i) + "}}";
  }
  count([&] { return replaceMustache(text, vars).size() == names * 5; });
}

constexpr Case kCases[] = {
    {"stringf", format, {10, 40, 300, 3000}, 16000},
    {"replaceMustache.map", mustacheOfMap, {2048, 65536}, 16384},
    {"replaceMustache.json", mustacheOfJson, {2048, 65536}, 16384},
    {"replaceMustache.jsonTexts", mustacheOfJsonTexts, {2048}, 16384},
    {"replaceMustache.plainText", mustachePlainText, {65536}, 16384},
    {"replaceMustache.openBraces", mustacheOpenBraces, {65536}, 16384},
    {"replaceMustache.unclosed", mustacheUnclosed, {65536}, 16384},
    {"replaceMustache.closingBraces", mustacheClosingBraces, {65536}, 16384},
    {"replaceMustache.nested", mustacheNested, {65536}, 16384},
    {"replaceMustache.longName", mustacheLongName, {65536}, 65536},
    {"replaceMustache.manyNames", mustacheManyNames, {1000}, 1000, kLinearLog},
};

} // namespace

Cases stringCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
