#include "tools/kovabackup/facts/catalogue.h"

#include "base/trim.h"

#include <algorithm>
#include <cctype>
#include <charconv>

namespace KOVA::Backup::Tool {
namespace {

struct Field {
  const char *key;
  const char *value;
};

// Each entry begins with its "id"; the names of the modules come first.
constexpr Field kFields[] = {
#include "catalogue.inc"
};

void set(LogMessage &message, const std::string &key, const char *value) {
  message.plain = message.plain || key == "plain";
  std::string *target = key == "text"       ? &message.text
                        : key == "from"     ? &message.from
                        : key == "meaning"  ? &message.meaning
                        : key == "action"   ? &message.action
                        : key == "priority" ? &message.priority
                                            : nullptr;
  if (target != nullptr) {
    *target = value;
  }
}

std::vector<LogMessage> readMessages() {
  std::vector<LogMessage> messages;
  for (const Field &field : kFields) {
    const std::string key = field.key;
    if (key == "id") {
      messages.emplace_back().id = field.value;
    } else if (!messages.empty()) {
      set(messages.back(), key, field.value);
    }
  }
  return messages;
}

bool isModule(const std::string &name) {
  return std::any_of(std::begin(kFields), std::end(kFields), [&name](const Field &field) {
    return std::string(field.key) == "module" && field.value == name;
  });
}

bool isDigit(char byte) {
  return std::isdigit(static_cast<unsigned char>(byte)) != 0;
}

bool isModuleByte(char byte) {
  return std::isalnum(static_cast<unsigned char>(byte)) != 0 || byte == '_' || byte == '/';
}

// The id around the colon at that place; "" when there is none.
std::string idAround(const std::string &line, std::size_t colon) {
  std::size_t begin = colon;
  while (begin > 0 && isModuleByte(line[begin - 1])) {
    --begin;
  }
  std::size_t end = colon + 1;
  while (end < line.size() && isDigit(line[end])) {
    ++end;
  }
  return end > colon + 1 && isModule(line.substr(begin, colon - begin))
             ? line.substr(begin, end - begin)
             : "";
}

// The texts between the conversions of a printf format, such as %s and %zu.
std::vector<std::string> constantParts(const std::string &format) {
  static const std::string kLengths = "hlz";
  std::vector<std::string> parts(1);
  for (std::size_t i = 0; i < format.size(); ++i) {
    if (format[i] != '%') {
      parts.back() += format[i];
      continue;
    }
    do {
      ++i;
    } while (i < format.size() && kLengths.find(format[i]) != std::string::npos);
    parts.emplace_back();
  }
  return parts;
}

bool isEnd(const std::string &line, std::size_t at, const std::string &part) {
  return line.size() >= at + part.size() &&
         line.compare(line.size() - part.size(), part.size(), part) == 0;
}

// Whether a line is the format with any texts in place of its conversions.
bool isMadeFrom(const std::string &format, const std::string &line) {
  const std::vector<std::string> parts = constantParts(format);
  std::size_t at = 0;
  for (std::size_t i = 0; i + 1 < parts.size(); ++i) {
    const std::size_t found = line.find(parts[i], at);
    if (found == std::string::npos || (i == 0 && found > 0)) {
      return false;
    }
    at = found + parts[i].size();
  }
  return parts.size() == 1 ? line == format : isEnd(line, at, parts.back());
}

bool isOfStandIns(const LogMessage &message) {
  return message.text.rfind("kovasdk: ", 0) == 0 || message.text.rfind("kovaplatform: ", 0) == 0;
}

// Their lines have no numbers. What precedes the prefix is the system log's own.
std::string standInIdIn(const std::string &line) {
  for (const LogMessage &message : allMessages()) {
    const std::string prefix = message.text.substr(0, message.text.find(' '));
    const std::size_t begin = isOfStandIns(message) ? line.find(prefix) : std::string::npos;
    if (begin != std::string::npos && isMadeFrom(message.text, line.substr(begin))) {
      return message.id;
    }
  }
  return "";
}

} // namespace

const std::vector<LogMessage> &allMessages() {
  static const std::vector<LogMessage> messages = readMessages();
  return messages;
}

const LogMessage *findMessage(const std::string &id) {
  const std::vector<LogMessage> &all = allMessages();
  const auto found = std::find_if(all.begin(), all.end(),
                                  [&id](const LogMessage &message) { return message.id == id; });
  return found == all.end() ? nullptr : &*found;
}

std::string messageIdIn(const std::string &text) {
  const std::string line(Base::trim(text));
  if (findMessage(line) != nullptr) {
    return line;
  }
  for (std::size_t colon = line.find(':'); colon != std::string::npos;
       colon = line.find(':', colon + 1)) {
    std::string id = idAround(line, colon);
    if (!id.empty()) {
      return id;
    }
  }
  return standInIdIn(line);
}

int platformCodeIn(const std::string &line) {
  static const std::string kPrefix = "0x";
  const char *end = line.data() + line.size();
  int code = -1;
  if (line.rfind(kPrefix, 0) == 0) {
    const char *read = std::from_chars(line.data() + kPrefix.size(), end, code, 16).ptr;
    return read == end ? code : -1;
  }
  // In a log line, and in a message of this command.
  for (const std::string &begin : {"[" + kPrefix, "platform error " + kPrefix}) {
    const std::size_t at = line.find(begin);
    if (code < 0 && at != std::string::npos) {
      (void)std::from_chars(line.data() + at + begin.size(), end, code, 16); // -1 without a number
    }
  }
  return code;
}

} // namespace KOVA::Backup::Tool
