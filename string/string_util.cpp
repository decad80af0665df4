#include "kovabackup/string_util.h"

#include "base/json_text.h"

#include <cstdio>

namespace KOVA::Backup {
namespace {

constexpr std::size_t kShortBytes = 128; // with the NUL
constexpr char kOpen[] = "{{";
constexpr char kClose[] = "}}";
constexpr std::size_t kDelimiterBytes = 2;
constexpr std::size_t kNone = std::string::npos;

__attribute__((format(printf, 2, 0))) std::string formatLong(std::size_t bytes, const char *format,
                                                             va_list args) {
  std::string text(bytes + 1, '\0');
  const int length = std::vsnprintf(text.data(), text.size(), format, args);
  // When an argument has changed meanwhile, the second pass can fail although the first did not.
  // Its -1 means a text that cannot be formatted; taken as a size, it would request all memory.
  text.resize(length < 0 ? 0 : static_cast<std::size_t>(length));
  return text;
}

// The position of the first delimiter at or after begin. When begin is kNone, so is the result.
std::size_t findFrom(const std::string &text, const char *delimiter, std::size_t begin) {
  return begin == kNone ? kNone : text.find(delimiter, begin, kDelimiterBytes);
}

std::size_t findCloseOf(const std::string &text, std::size_t open) {
  return open == kNone ? kNone : findFrom(text, kClose, open + kDelimiterBytes);
}

} // namespace

std::string stringf(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::string text = vstringf(format, args);
  va_end(args);
  return text;
}

std::string vstringf(const char *format, va_list args) {
  char buffer[kShortBytes] = "";
  va_list again;
  va_copy(again, args);
  const int length = std::vsnprintf(buffer, sizeof buffer, format, args);
  std::string text;
  if (length >= 0) {
    const auto bytes = static_cast<std::size_t>(length);
    text = bytes < sizeof buffer ? std::string(buffer, bytes) : formatLong(bytes, format, again);
  }
  va_end(again);
  return text;
}

bool _VarsMapperMapString::operator()(const std::string &name, std::string &value) const {
  const auto found = vars_.find(name);
  if (found == vars_.end()) {
    return false;
  }
  value = found->second;
  return true;
}

bool _VarsMapperJson::operator()(const std::string &name, std::string &value) const {
  // The JSON library throws when a value that is not an object is asked for a member.
  if (!vars_.isObject()) {
    return false;
  }
  const Json::Value *member = vars_.find(name.data(), name.data() + name.size());
  if (member == nullptr) {
    return false;
  }
  if (!asJson_ && member->isNull()) {
    value.clear();
  } else if (!asJson_ && member->isString()) {
    value = member->asString();
  } else {
    value = Base::JsonText::toText(*member);
  }
  return true;
}

// NOLINTBEGIN(performance-unnecessary-value-param): the interface takes the mapper by value
std::string
replaceMustache(const std::string &text,
                boost::function<bool(const std::string &name, std::string &value)> mapper) {
  // NOLINTEND(performance-unnecessary-value-param)
  std::string out;
  std::size_t copied = 0;
  std::size_t open = findFrom(text, kOpen, 0);
  std::size_t close = findCloseOf(text, open);
  while (open != kNone && close != kNone) {
    const std::size_t next = findFrom(text, kOpen, open + 1);
    if (next < close) { // kNone is past every position
      open = next;
      continue;
    }
    out.append(text, copied, open - copied);
    const std::size_t nameAt = open + kDelimiterBytes;
    const std::string name(text, nameAt, close - nameAt);
    std::string value;
    if (mapper(name, value)) {
      out += value;
    }
    copied = close + kDelimiterBytes;
    open = next; // no placeholder opens between the start of this one and next
    close = findCloseOf(text, open);
  }
  return out.append(text, copied, kNone);
}

std::string replaceMustache(const std::string &text,
                            const std::map<std::string, std::string> &vars) {
  return replaceMustache(text, _VarsMapperMapString(vars));
}

std::string replaceMustache(const std::string &text, const Json::Value &vars, bool asJson) {
  return replaceMustache(text, _VarsMapperJson(vars, asJson));
}

} // namespace KOVA::Backup
