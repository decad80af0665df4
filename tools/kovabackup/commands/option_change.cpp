#include "tools/kovabackup/commands/option_change.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/prompt.h"
#include "tools/kovabackup/frame/text.h"

#include <cstdint>
#include <cstring>
#include <fmt/format.h>
#include <list>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct ChangeOptions {
  std::string file;
  std::string section;
  std::string name;
  std::vector<std::string> values;
  std::optional<std::string> type;
  bool secret = false;
  std::optional<std::string> lock;
};

// A text that is overwritten when it is destroyed.
class Secret {
public:
  explicit Secret(std::string text) : text_(std::move(text)) {}
  ~Secret() { ::explicit_bzero(text_.data(), text_.size()); }
  Secret(const Secret &) = delete;
  Secret &operator=(const Secret &) = delete;
  const std::string &text() const { return text_; }

private:
  std::string text_;
};

// What is typed is not visible, so a slip would only be noticed when the service fails to log in.
std::string askTwice(Context &context, const std::string &name) {
  std::string first = askSecret(context, fmt::format("Secret for {}: ", name));
  const Secret again(askSecret(context, "Once more: "));
  if (first != again.text()) {
    throw Failure(kFailed, "the two entries differ; nothing was stored");
  }
  return first;
}

std::string readSecret(Context &context, const std::string &name) {
  if (::isatty(STDIN_FILENO) == 1) { // what is typed there must not be shown
    return askTwice(context, name);
  }
  std::string text = readAll("-");
  // A text editor or echo ends the line; one line end is therefore not part of the secret.
  if (!text.empty() && text.back() == '\n') {
    text.pop_back();
  }
  if (text.empty() || text.find('\0') != std::string::npos) {
    throw Failure(kFailed, text.empty() ? "standard input contains no secret"
                                        : "a secret cannot contain a NUL byte");
  }
  return text;
}

// The map does not report that encryption failed; it then holds an empty text.
void storeSecret(OptionMap &map, const std::string &name, const std::string &secret) {
  clearPlatformError();
  map.optSet(name, secret, true);
  if (map.optString(name, "").empty()) {
    throw Failure(kFailed, fmt::format("cannot encrypt: {}", platformError()));
  }
}

// The range that a section file can give back, wider than int at its upper end.
long long parsedInt(const std::string &text) {
  const auto number = parseNumber(text, INT32_MIN, UINT32_MAX);
  if (!number) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid int: expected an integer from {} to {}",
                                      text, INT32_MIN, UINT32_MAX));
  }
  return *number;
}

// Only the spelling of JSON, so that a value is written as it was typed.
bool parsedBool(const std::string &text) {
  if (text != "true" && text != "false") {
    throw Failure(kUsage, fmt::format("'{}' is not a valid bool: expected true or false", text));
  }
  return text == "true";
}

void store(OptionMap &map, const ChangeOptions &options) {
  const std::string type = options.type.value_or("string");
  if (type == "list") {
    map.optSet(options.name, std::list<std::string>(options.values.begin(), options.values.end()));
    return;
  }
  const std::string &value = options.values.front();
  if (type == "int") {
    map.optSet(options.name, parsedInt(value));
  } else if (type == "bool") {
    map.optSet(options.name, parsedBool(value));
  } else {
    map.optSet(options.name, value);
  }
}

// Everything that can be checked before the lock is taken and the file is read.
void validate(const ChangeOptions &options) {
  requireSectionName(options.section);
  requireOptionName(options.name);
  const std::string type = options.type.value_or("string");
  if (type != "string" && type != "int" && type != "bool" && type != "list") {
    throw Failure(
        kUsage, fmt::format("'{}' is not a valid type: expected string, int, bool or list", type));
  }
  if (options.secret) {
    if (!options.values.empty()) {
      throw Failure(kUsage, "a secret cannot be an argument, where other users could see it; it is "
                            "read from standard input or a prompt");
    }
    if (type != "string") {
      throw Failure(kUsage, "a secret is always a string");
    }
  } else if (type != "list" && options.values.size() != 1) {
    throw Failure(kUsage, options.values.empty()
                              ? "VALUE is required"
                              : "only a list has several values; quote text that "
                                "contains spaces");
  }
  // A value that does not fit its type is found here, before the lock is taken.
  OptionMap scratch;
  if (!options.secret) {
    store(scratch, options);
  }
}

// The value is left out: it may be a secret.
void documentChange(Context &context, const ChangeOptions &options) {
  context.document["file"] = jsonName(options.file);
  context.document["section"] = jsonName(options.section);
  context.document["name"] = jsonName(options.name);
}

int set(Context &context, const ChangeOptions &options) {
  validate(options);
  // The secret is read before the lock is taken: no service must wait for a user who types.
  const Secret secret(options.secret ? readSecret(context, options.name) : "");
  SectionEditor editor(context, options.file, options.section, options.lock, Missing::Make);
  if (options.secret) {
    storeSecret(editor.map(), options.name, secret.text());
  } else {
    store(editor.map(), options);
  }
  editor.save();
  documentChange(context, options);
  context.document["newSection"] = editor.isNew();
  if (!context.json && editor.isNew()) {
    context.remark(fmt::format("created section '{}' in {}", options.section, options.file));
  }
  return kDone;
}

int unset(Context &context, const ChangeOptions &options) {
  SectionEditor editor(context, options.file, options.section, options.lock, Missing::Refuse);
  if (!editor.remove(options.name)) {
    throw Failure(kNegative, fmt::format("section '{}' of {} has no option '{}'", options.section,
                                         options.file, options.name));
  }
  editor.save();
  documentChange(context, options);
  return kDone;
}

} // namespace

void registerChangers(CommandGroup &group) {
  const char *lockHelp = "hold this lock token while the file is read and written";
  auto setting = std::make_shared<ChangeOptions>();
  group.command("set", "Set an option; a missing file or section is created")
      .argument(setting->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(setting->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(setting->name, "NAME", "the option")
      .completes(optionNames)
      .arguments(setting->values, "VALUE", "its value; several for a list, none for a secret", true)
      .option(setting->type, "--type", "TYPE", "string (the default), int, bool or list")
      .completes(optionTypes)
      .flag(setting->secret, "--secret",
            "store it encrypted; the value comes from standard input or a prompt")
      .option(setting->lock, "--lock", "TOKEN", lockHelp)
      .completes(lockTokens)
      .note("Put -- before a value that begins with -.")
      .note("Without --lock, if a service writes the file at the same time, one of the two changes "
            "may be lost. The other options of the section are written back unchanged; if one of "
            "them cannot be, nothing is written.")
      .example("kovabackup option set task.conf task12 name 'my photos' --lock task.conf")
      .example("kovabackup option set task.conf task12 paths --type list /v/a /v/b")
      .example("kovabackup option set task.conf task12 password --secret < password.txt")
      .action([setting](Context &c) { return set(c, *setting); });
  auto unsetting = std::make_shared<ChangeOptions>();
  group.command("unset", "Remove an option")
      .argument(unsetting->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(unsetting->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(unsetting->name, "NAME", "the option")
      .completes(optionNames)
      .option(unsetting->lock, "--lock", "TOKEN", lockHelp)
      .completes(lockTokens)
      .note("Ends with 3 when there is no such file, section or option.")
      .example("kovabackup option unset task.conf task12 retries --lock task.conf")
      .action([unsetting](Context &c) { return unset(c, *unsetting); });
}

} // namespace KOVA::Backup::Tool
