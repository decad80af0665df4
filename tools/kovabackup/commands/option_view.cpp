#include "tools/kovabackup/commands/option_view.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

// JSON text is UTF-8, but options may hold any bytes.
Json::Value documented(const Json::Value &value) {
  if (value.isString()) {
    return jsonName(value.asString());
  }
  if (!value.isArray()) {
    return value;
  }
  Json::Value list(Json::arrayValue);
  for (const Json::Value &element : value) {
    list.append(documented(element));
  }
  return list;
}

} // namespace

std::string compact(const Json::Value &value) {
  const std::string text = jsonText(value, false);
  return text.substr(0, text.size() - 1);
}

std::string bare(const Json::Value &value) {
  return value.isString() ? value.asString() : compact(value);
}

const char *typeNameOf(const Json::Value &value) {
  switch (value.type()) {
  case Json::stringValue:
    return "string";
  case Json::booleanValue:
    return "bool";
  case Json::intValue:
  case Json::uintValue:
    return "int";
  case Json::arrayValue:
    return "list";
  case Json::nullValue:
    return "null";
  case Json::realValue:
    return "real";
  case Json::objectValue:
    break;
  }
  return "object";
}

std::string withArticle(const std::string &type) {
  return (type == "int" || type == "object" ? "an " : "a ") + type;
}

std::string retypeRemark(const std::string &name, const Json::Value &old, const std::string &type) {
  return fmt::format("option '{}' was {} and is {} now", name, withArticle(typeNameOf(old)),
                     withArticle(type));
}

Json::Value jsonOption(const std::string &name, const Json::Value &value) {
  Json::Value entry(Json::objectValue);
  entry["name"] = jsonName(name);
  entry["type"] = typeNameOf(value);
  entry["value"] = documented(value);
  return entry;
}

} // namespace KOVA::Backup::Tool
