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

// A text that is wiped when it goes.
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

std::string askTwice(Context &context, const std::string &name) {
  std::string first = askSecret(context, fmt::format("Secret for {}: ", name));
  const Secret again(askSecret(context, "Once more: "));
  if (first != again.text()) {
    throw Failure(kFailed, "the two are not the same: nothing was stored");
  }
  return first;
}

std::string readSecret(Context &context, const std::string &name) {
  if (::isatty(STDIN_FILENO) == 1) { // never read it in clear from a terminal
    return askTwice(context, name);
  }
  std::string text = readAll("-");
  if (!text.empty() && text.back() == '\n') {
    text.pop_back();
  }
  if (text.empty() || text.find('\0') != std::string::npos) {
    throw Failure(kFailed, text.empty() ? "standard input holds no secret"
                                        : "a secret cannot hold a NUL byte");
  }
  return text;
}

void storeSecret(OptionMap &map, const std::string &name, const std::string &secret) {
  clearPlatformError();
  map.optSet(name, secret, true);
  if (map.optString(name, "").empty()) { // what the map keeps when it could not encrypt
    throw Failure(kFailed, fmt::format("cannot encrypt: {}", platformError()));
  }
}

long long parsedInt(const std::string &text) {
  const auto number = parseNumber(text, INT32_MIN, UINT32_MAX);
  if (!number) {
    throw Failure(kUsage, fmt::format("'{}' is no int that a section can hold: {} to {}", text,
                                      INT32_MIN, UINT32_MAX));
  }
  return *number;
}

bool parsedBool(const std::string &text) {
  if (text != "true" && text != "false") {
    throw Failure(kUsage, fmt::format("'{}' is no bool: true or false", text));
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

// All that can be said before anything is locked or read.
void requireSense(const ChangeOptions &options) {
  requireSectionName(options.section);
  requireOptionName(options.name);
  const std::string type = options.type.value_or("string");
  if (type != "string" && type != "int" && type != "bool" && type != "list") {
    throw Failure(kUsage, fmt::format("'{}' is no type: string, int, bool or list", type));
  }
  if (options.secret) {
    if (!options.values.empty()) {
      throw Failure(kUsage, "a secret is never given as an argument, where others can see it: it "
                            "comes from standard input or a prompt");
    }
    if (type != "string") {
      throw Failure(kUsage, "a secret is a string");
    }
  } else if (type != "list" && options.values.size() != 1) {
    throw Failure(kUsage, options.values.empty() ? "VALUE is required"
                                                 : fmt::format("only a list has several values; "
                                                               "for text with blanks use quotes"));
  }
  OptionMap scratch;
  if (!options.secret) {
    store(scratch, options); // refuses values that are not of their type
  }
}

void documentChange(Context &context, const ChangeOptions &options) {
  context.document["file"] = jsonName(options.file);
  context.document["section"] = jsonName(options.section);
  context.document["name"] = jsonName(options.name);
}

int set(Context &context, const ChangeOptions &options) {
  requireSense(options);
  // Nobody else is kept waiting while a person thinks.
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
    context.remark(fmt::format("made section '{}' in {}", options.section, options.file));
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

void registerChangers(CommandGroup &family) {
  const char *lockHelp = "hold this lock token from before reading until after writing";
  auto setting = std::make_shared<ChangeOptions>();
  family.command("set", "Set an option; file and section are made when missing")
      .argument(setting->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(setting->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(setting->name, "NAME", "the option")
      .completes(optionNames)
      .arguments(setting->values, "VALUE", "its value; several for a list, none for a secret", true)
      .option(setting->type, "--type", "TYPE", "string (if not given), int, bool or list")
      .completes(optionTypes)
      .flag(setting->secret, "--secret",
            "store it encrypted; the value comes from standard input or a prompt")
      .option(setting->lock, "--lock", "TOKEN", lockHelp)
      .completes(lockTokens)
      .note("A value that begins with - stands after --.")
      .note("Without --lock a service that writes the file at the same moment may lose its change, "
            "or this one. The other options of the section are written back as they are; when one "
            "of them could not be, nothing is written.")
      .example("kovabackup option set task.conf task12 name 'my photos' --lock task.conf")
      .example("kovabackup option set task.conf task12 paths --type list /v/a /v/b")
      .example("kovabackup option set task.conf task12 password --secret < password.txt")
      .action([setting](Context &c) { return set(c, *setting); });
  auto unsetting = std::make_shared<ChangeOptions>();
  family.command("unset", "Remove an option")
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
