#include "tools/kovabackup/facts/catalogue.h"

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

std::string messageIdIn(const std::string &line) {
  for (std::size_t colon = line.find(':'); colon != std::string::npos;
       colon = line.find(':', colon + 1)) {
    std::string id = idAround(line, colon);
    if (!id.empty()) {
      return id;
    }
  }
  return "";
}

int platformCodeIn(const std::string &line) {
  static const std::string kBegin = "[0x";
  static const std::string kPrefix = "0x";
  const char *end = line.data() + line.size();
  int code = -1;
  if (line.rfind(kPrefix, 0) == 0) {
    const char *read = std::from_chars(line.data() + kPrefix.size(), end, code, 16).ptr;
    return read == end ? code : -1;
  }
  const std::size_t at = line.find(kBegin);
  if (at != std::string::npos) {
    (void)std::from_chars(line.data() + at + kBegin.size(), end, code, 16); // -1 without a number
  }
  return code;
}

} // namespace KOVA::Backup::Tool
