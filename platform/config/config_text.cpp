// The text of the configuration file. One table lists the sections and keys; each key has a
// function that takes or refuses its value.

#include "platform/config/config.h"

#include "base/json_text.h"
#include "base/section_grammar.h"
#include "kovaplatform/kovasdk.h"

#include <algorithm>
#include <iterator>
#include <set>
#include <string_view>

namespace KovaPlatform {
namespace {

namespace Grammar = KOVA::Base::SectionGrammar;

enum class Section { None, Volume, Mounts, Secret };

constexpr std::string_view kVolumeWord = "volume";

// System calls would end the path at a NUL.
bool takePath(std::string &path, const Json::Value &value) {
  if (!value.isString()) {
    return false;
  }
  std::string text = value.asString();
  if (text.empty() || text.front() != '/' || Grammar::holdsNul(text)) {
    return false;
  }
  while (text.size() > 1 && text.back() == '/') {
    text.pop_back();
  }
  path = std::move(text);
  return true;
}

bool isInteger(const Json::Value &value) {
  return value.type() == Json::intValue || value.type() == Json::uintValue;
}

bool takeVolumePath(Config &config, const Json::Value &value) {
  return takePath(config.volumes.back().path, value);
}

bool takeFsType(Config &config, const Json::Value &value) {
  if (!isInteger(value) || !value.isInt() || value.asInt() < 0) {
    return false;
  }
  config.volumes.back().fsType = value.asInt();
  return true;
}

bool takeSize(Config &config, const Json::Value &value) {
  if (!isInteger(value) || !value.isUInt64()) {
    return false;
  }
  config.volumes.back().size = value.asUInt64();
  return true;
}

bool takeRemovable(Config &config, const Json::Value &value) {
  if (!value.isBool()) {
    return false;
  }
  config.volumes.back().removable = value.asBool();
  return true;
}

bool takeExclude(Config &config, const Json::Value &value) {
  if (!value.isArray()) {
    return false;
  }
  std::vector<std::string> paths(value.size());
  for (Json::ArrayIndex i = 0; i < value.size(); ++i) {
    if (!takePath(paths[i], value[i])) {
      return false;
    }
  }
  config.mountExcludes = std::move(paths);
  return true;
}

bool takeKeyFile(Config &config, const Json::Value &value) {
  return takePath(config.secretKeyFile, value);
}

struct Key {
  Section section;
  std::string_view name;
  bool (*take)(Config &, const Json::Value &);
  const char *expected;
};

constexpr Key kKeys[] = {
    {Section::Volume, "path", takeVolumePath, "an absolute path in double quotes"},
    {Section::Volume, "fsType", takeFsType, "an integer, 0 or more"},
    {Section::Volume, "size", takeSize, "a number of bytes"},
    {Section::Volume, "removable", takeRemovable, "true or false"},
    {Section::Mounts, "exclude", takeExclude, "a list of absolute paths, each in double quotes"},
    {Section::Secret, "keyFile", takeKeyFile, "an absolute path in double quotes"},
};

const Key *findKey(Section section, std::string_view name) {
  const auto *key = std::find_if(std::begin(kKeys), std::end(kKeys), [&](const Key &candidate) {
    return candidate.section == section && candidate.name == name;
  });
  return key == std::end(kKeys) ? nullptr : key;
}

// JsonText differs from the JSON library's strict mode in two points. It takes the last of equal
// members, which does not show, since no key takes an object. And it refuses a byte order mark,
// which has always been allowed before a value.
bool parseValue(std::string_view text, Json::Value &value) {
  constexpr std::string_view kByteOrderMark = "\xef\xbb\xbf";
  if (text.substr(0, kByteOrderMark.size()) == kByteOrderMark) {
    text.remove_prefix(kByteOrderMark.size());
  }
  return KOVA::Base::JsonText::fromText(text, value);
}

class Parser {
public:
  bool parse(std::string_view text);
  Config &config() { return config_; }
  ConfigError &error() { return error_; }

private:
  bool takeLine(const Grammar::Line &line);
  bool takeHeader(std::string_view name);
  bool takeOption(std::string_view key, std::string_view text);
  bool beginVolume(std::string_view name);
  bool endSection();
  bool fail(int code, int line, std::string what);

  Config config_;
  ConfigError error_;
  Section section_ = Section::None;
  std::set<std::string, std::less<>> seen_;
  int line_ = 0;
  int headerLine_ = 0;
};

bool Parser::fail(int code, int line, std::string what) {
  error_ = {code, line, std::move(what)};
  return false;
}

bool Parser::parse(std::string_view text) {
  while (!text.empty()) {
    ++line_;
    if (!takeLine(Grammar::parse(Grammar::takeLine(text)))) {
      return false;
    }
  }
  return endSection();
}

bool Parser::takeLine(const Grammar::Line &line) {
  switch (line.kind) {
  case Grammar::LineKind::Blank:
  case Grammar::LineKind::Comment:
    return true;
  case Grammar::LineKind::Header:
    return endSection() && takeHeader(line.name);
  case Grammar::LineKind::BrokenHeader:
    return fail(KOVA_CONF_ERR_SYNTAX, line_, "a section's header without ']' at its end");
  case Grammar::LineKind::Option:
    if (!Grammar::holdsNul(line.text)) {
      return takeOption(line.key, line.value);
    }
    break;
  case Grammar::LineKind::Other:
    break;
  }
  return fail(KOVA_CONF_ERR_SYNTAX, line_, "neither a section, an option nor a comment");
}

bool Parser::takeHeader(std::string_view name) {
  headerLine_ = line_;
  if (!seen_.emplace(name).second) {
    return fail(KOVA_CONF_ERR_TWICE, line_, "section [" + std::string(name) + "] occurs twice");
  }
  if (name == "mounts") {
    section_ = Section::Mounts;
    return true;
  }
  if (name == "secret") {
    section_ = Section::Secret;
    return true;
  }
  if (name.size() > kVolumeWord.size() && name.substr(0, kVolumeWord.size()) == kVolumeWord &&
      name[kVolumeWord.size()] == ' ') {
    return beginVolume(name.substr(kVolumeWord.size() + 1));
  }
  return fail(KOVA_CONF_ERR_SECTION, line_, "unknown section [" + std::string(name) + "]");
}

bool Parser::beginVolume(std::string_view name) {
  if (name.empty() || !Grammar::isTrimmed(name)) {
    return fail(KOVA_CONF_ERR_SECTION, line_,
                "a volume needs a name without white space at its ends");
  }
  section_ = Section::Volume;
  config_.volumes.emplace_back().name = name;
  return true;
}

bool Parser::endSection() {
  if (section_ == Section::Volume && config_.volumes.back().path.empty()) {
    return fail(KOVA_CONF_ERR_NO_PATH, headerLine_,
                "volume '" + config_.volumes.back().name + "' has no path");
  }
  section_ = Section::None;
  return true;
}

bool Parser::takeOption(std::string_view key, std::string_view text) {
  const Key *known = findKey(section_, key);
  if (known == nullptr) {
    return fail(KOVA_CONF_ERR_KEY, line_, "unknown key '" + std::string(key) + "'");
  }
  Json::Value value;
  if (!parseValue(text, value) || !known->take(config_, value)) {
    return fail(KOVA_CONF_ERR_VALUE, line_,
                "the value of '" + std::string(key) + "' must be " + known->expected);
  }
  return true;
}

} // namespace

bool parseConfig(const std::string &text, Config &config, ConfigError &error) {
  Parser parser;
  if (!parser.parse(text)) {
    error = std::move(parser.error());
    return false;
  }
  config = std::move(parser.config());
  return true;
}

} // namespace KovaPlatform
