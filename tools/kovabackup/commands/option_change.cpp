#include "tools/kovabackup/commands/option_change.h"

#include "base/json_text.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/lock_options.h"
#include "tools/kovabackup/commands/option_view.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/prompt.h"
#include "tools/kovabackup/frame/text.h"

#include <cstdint>
#include <cstring>
#include <fmt/format.h>
#include <list>
#include <map>
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
  LockOptions lock;
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
    throw Failure(kFailed, fmt::format("cannot encrypt option '{}': {}", name, platformError()));
  }
}

// The type in which a value is stored, and whether it is the one that the option has already.
struct Type {
  std::string name;
  bool kept = false;
};

// A value that does not fit a type that the user named is wrong usage; one that does not fit the
// type in the file is not, since the command line alone does not show it.
[[noreturn]] void refuseValue(const ChangeOptions &options, const Type &type,
                              const std::string &expected) {
  const std::string &value = options.values.front();
  throw type.kept
      ? Failure(kFailed, fmt::format("option '{}' is {}, but '{}' is not: expected {}; pass --type "
                                     "to change its type",
                                     options.name, withArticle(type.name), value, expected))
      : Failure(kUsage, fmt::format("option '{}': '{}' is not a valid {}: expected {}",
                                    options.name, value, type.name, expected));
}

// The range that a section file can give back is wider than int at its upper end. Of booleans only
// the spelling of JSON is taken, so that a value is written as it was typed.
void store(OptionMap &map, const ChangeOptions &options, const Type &type) {
  if (type.name == "list") {
    map.optSet(options.name, std::list<std::string>(options.values.begin(), options.values.end()));
    return;
  }
  const std::string &value = options.values.front();
  if (type.name == "int") {
    const auto number = parseNumber(value, INT32_MIN, UINT32_MAX);
    if (!number) {
      refuseValue(options, type, fmt::format("an integer from {} to {}", INT32_MIN, UINT32_MAX));
    }
    map.optSet(options.name, *number);
  } else if (type.name == "bool") {
    if (value != "true" && value != "false") {
      refuseValue(options, type, "true or false");
    }
    map.optSet(options.name, value == "true");
  } else {
    map.optSet(options.name, value);
  }
}

void validateSecret(const ChangeOptions &options) {
  if (!options.values.empty()) {
    throw Failure(kUsage, "a secret cannot be an argument, where other users could see it; it is "
                          "read from standard input or a prompt");
  }
  if (options.type.value_or("string") != "string") {
    throw Failure(kUsage, "a secret is always a string");
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
    validateSecret(options);
  } else if (type != "list" && options.values.size() != 1) {
    throw Failure(kUsage, options.values.empty()
                              ? "VALUE is required"
                              : "only a list has several values: pass --type list, or quote text "
                                "that contains spaces");
  }
  // A value that does not fit its type is found here, before the lock is taken.
  OptionMap scratch;
  if (options.type && !options.secret) {
    store(scratch, options, {type});
  }
}

// An option keeps its type unless the user names another: a service that expects a list gets none
// of its elements from a text, and reports nothing. Lists are never replaced silently, because a
// user who gives one value may have meant to add it.
Type typeOf(const ChangeOptions &options, const Json::Value &old) {
  if (options.type || options.secret || old.isNull()) {
    return {options.type.value_or("string")};
  }
  if (old.isString() || old.isInt() || old.isUInt() || old.isBool()) {
    return {typeNameOf(old), true};
  }
  const std::string type = withArticle(typeNameOf(old));
  throw Failure(kFailed, old.isArray()
                             ? fmt::format("option '{}' is a list: pass --type list and all its "
                                           "elements, or --type string to make it a string",
                                           options.name)
                             : fmt::format("option '{}' is {}: pass --type to change its type",
                                           options.name, type));
}

// The value is left out: it may be a secret.
void documentChange(Context &context, const ChangeOptions &options) {
  context.document["file"] = jsonName(options.file);
  context.document["section"] = jsonName(options.section);
  context.document["name"] = jsonName(options.name);
}

void reportTypes(Context &context, const ChangeOptions &options, const Json::Value &old,
                 const std::string &type) {
  context.document["type"] = type;
  context.document["previousType"] = old.isNull() ? Json::Value() : Json::Value(typeNameOf(old));
  if (!context.json && !old.isNull() && type != typeNameOf(old)) {
    context.remark(retypeRemark(options.name, old, type));
  }
}

// A service that reads an integer, a boolean or a list from a text gets its default or fails.
void remarkOnNewText(Context &context, const ChangeOptions &options) {
  static const std::map<std::string, const char *> kAdvice = {
      {"int", "--type int if a number is meant"},
      {"bool", "--type bool if true or false is meant"},
      {"list", "--type list and each element as an argument if a list is meant"}};
  Json::Value read;
  if (options.type || options.secret || !Base::JsonText::fromText(options.values.front(), read)) {
    return;
  }
  const std::string type = typeNameOf(read);
  if (const auto advice = kAdvice.find(type); advice != kAdvice.end()) {
    context.remark(
        fmt::format("option '{}' was stored as a string; pass {}", options.name, advice->second));
  }
}

// Users who know how a list looks in the file pass all of it as one argument.
void remarkOnListInElement(Context &context, const ChangeOptions &options, const Type &type) {
  Json::Value read;
  if (type.name == "list" && options.values.size() == 1 &&
      Base::JsonText::fromText(options.values.front(), read) && read.isArray()) {
    context.remark(fmt::format("option '{}' was stored as a list of one element, which reads as a "
                               "list itself; to store its elements, pass each as an argument",
                               options.name));
  }
}

int set(Context &context, const ChangeOptions &options) {
  validate(options);
  const LockRequest lock = lockRequest(options.lock);
  // The secret is read before the lock is taken: no service must wait for a user who types.
  const Secret secret(options.secret ? readSecret(context, options.name) : "");
  SectionEditor editor(context, options.file, options.section, lock, Missing::Make);
  const Json::Value values = valuesOf(editor.map());
  const Json::Value &old = values[options.name]; // null when there is no such option
  const Type type = typeOf(options, old);
  if (options.secret) {
    storeSecret(editor.map(), options.name, secret.text());
  } else {
    store(editor.map(), options, type);
  }
  editor.save();
  documentChange(context, options);
  context.document["newSection"] = editor.isNew();
  if (!context.json && editor.isNew()) {
    context.remark(fmt::format("created section '{}' in {}", options.section, options.file));
  }
  reportTypes(context, options, old, type.name);
  if (!context.json && old.isNull()) {
    remarkOnNewText(context, options);
  }
  if (!context.json) {
    remarkOnListInElement(context, options, type);
  }
  return kDone;
}

int unset(Context &context, const ChangeOptions &options) {
  SectionEditor editor(context, options.file, options.section, lockRequest(options.lock),
                       Missing::Refuse);
  if (!editor.remove(options.name)) {
    throw Failure(kNegative, fmt::format("section '{}' of {} has no option '{}'", options.section,
                                         options.file, options.name));
  }
  editor.save();
  documentChange(context, options);
  return kDone;
}

void registerSet(CommandGroup &group) {
  auto setting = std::make_shared<ChangeOptions>();
  Command command = group.command("set", "Set an option; a missing file or section is created");
  command.argument(setting->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(setting->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(setting->name, "NAME", "the option")
      .completes(optionNames)
      .arguments(setting->values, "VALUE", "its value; several for a list, none for a secret", true)
      .option(setting->type, "--type", "TYPE",
              "string, int, bool or list; by default the type that the option has, or string for a "
              "new one")
      .completes(optionTypes)
      .flag(setting->secret, "--secret",
            "store it encrypted; the value comes from standard input or a prompt");
  declareLock(command, setting->lock);
  command.note("Put -- before a value that begins with -.")
      .note(
          "An option keeps its type. A value that does not fit it is refused, and so is any value "
          "for a list, unless --type is given; a change of type is reported.")
      .note("Without --lock, if a service writes the file at the same time, one of the two changes "
            "may be lost. The other options of the section are written back unchanged; if one of "
            "them cannot be, nothing is written.")
      .example("kovabackup option set task.conf task12 name 'my photos' --lock task.conf")
      .example("kovabackup option set task.conf task12 paths --type list /v/a /v/b")
      .example("kovabackup option set task.conf task12 password --secret < password.txt")
      .action([setting](Context &c) { return set(c, *setting); });
}

void registerUnset(CommandGroup &group) {
  auto unsetting = std::make_shared<ChangeOptions>();
  Command command = group.command("unset", "Remove an option");
  command.argument(unsetting->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(unsetting->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(unsetting->name, "NAME", "the option")
      .completes(optionNames);
  declareLock(command, unsetting->lock);
  command.note("Ends with 3 when there is no such file, section or option.")
      .example("kovabackup option unset task.conf task12 retries --lock task.conf")
      .action([unsetting](Context &c) { return unset(c, *unsetting); });
}

} // namespace

void registerChangers(CommandGroup &group) {
  registerSet(group);
  registerUnset(group);
}

} // namespace KOVA::Backup::Tool
