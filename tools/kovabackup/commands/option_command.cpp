#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/option_change.h"
#include "tools/kovabackup/commands/option_diff.h"
#include "tools/kovabackup/commands/option_edit.h"
#include "tools/kovabackup/commands/option_view.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/list_order.h"

#include <fmt/format.h>
#include <list>

namespace KOVA::Backup::Tool {
namespace {

struct FileOptions {
  std::string file;
  std::string section;
  std::string name;
  bool reveal = false;
  bool null = false;
};

int sections(Context &context, const FileOptions &options) {
  const std::list<std::string> names = sectionsOf(options.file);
  Rows rows;
  rows.column("SECTION");
  context.document["sections"] = Json::Value(Json::arrayValue);
  for (const std::string &name : names) {
    context.document["sections"].append(jsonName(name));
    rows.add({name});
  }
  if (!context.json && rows.empty()) {
    context.remark(fmt::format("{} has no sections", options.file));
  } else if (!context.json) {
    rows.print(context.out, options.null);
  }
  return kDone;
}

// Such an option is lost when a service saves the section, so the user should learn of it.
Json::Value reportUnread(Context &context, const FileOptions &options, const Json::Value &values) {
  Json::Value unread(Json::arrayValue);
  for (const std::string &name : unreadNames(options.file, options.section, values)) {
    unread.append(jsonName(name));
    context.remark(fmt::format("option '{}' is left out: its value is not JSON, so no service sees "
                               "it; set it again or unset it",
                               name));
  }
  return unread;
}

Json::Value valuesIn(const FileOptions &options) {
  OptionMap map;
  loadSection(map, options.file, options.section);
  return valuesOf(map);
}

std::string optionLine(const std::string &name, const Json::Value &value) {
  return fmt::format("{}={}", name, compact(value));
}

SortKeys sortKeys() {
  return {{"name", "name"}, {"type", "type"}};
}

int listSection(Context &context, const FileOptions &options, const ListOrder &order) {
  const Json::Value values = valuesIn(options);
  std::vector<Listed> entries;
  for (const std::string &name : values.getMemberNames()) {
    entries.push_back({jsonOption(name, values[name]), {{optionLine(name, values[name])}}});
  }
  order.apply(context, "options", entries);
  for (const Listed &option : entries) {
    if (!context.json) {
      context.out.name(option.rows.front().front(), options.null ? '\0' : '\n');
    }
  }
  context.document["unread"] = reportUnread(context, options, values);
  return kDone;
}

// All sections, each row with the name of its section, so that a script needs no state.
int listFile(Context &context, FileOptions options) {
  Rows rows;
  rows.column("SECTION").column("OPTION");
  context.document["sections"] = Json::Value(Json::arrayValue);
  for (const std::string &section : sectionsOf(options.file)) {
    options.section = section;
    const Json::Value values = valuesIn(options);
    Json::Value entry(Json::objectValue);
    entry["name"] = jsonName(section);
    entry["options"] = Json::Value(Json::arrayValue);
    for (const std::string &name : values.getMemberNames()) {
      entry["options"].append(jsonOption(name, values[name]));
      rows.add({section, optionLine(name, values[name])});
    }
    entry["unread"] = reportUnread(context, options, values);
    context.document["sections"].append(entry);
  }
  if (!context.json && context.document["sections"].empty()) {
    context.remark(fmt::format("{} has no sections", options.file));
  } else if (!context.json) {
    rows.print(context.out, options.null);
  }
  return kDone;
}

struct ListOptions {
  FileOptions of;
  std::optional<std::string> section;
  OrderOptions order;
};

int list(Context &context, const ListOptions &options) {
  const ListOrder order(options.order, sortKeys());
  if (!options.section) {
    if (options.order.sort || options.order.limit) {
      throw Failure(kUsage, "--sort and --limit require a SECTION");
    }
    return listFile(context, options.of);
  }
  FileOptions of = options.of;
  of.section = *options.section;
  return listSection(context, of, order);
}

// Nothing in the file marks a secret, so a value may turn out not to be one. An empty result alone
// is not a failure; the error record decides.
Json::Value revealed(const OptionMap &map, const std::string &name, const Json::Value &value) {
  if (!value.isString()) {
    throw Failure(kFailed, fmt::format("option '{}' is not a secret: its value is not text", name));
  }
  clearPlatformError();
  const std::string secret = map.optSecret(name, "");
  if (secret.empty() && hasPlatformError()) { // an empty secret is valid
    throw Failure(kFailed, fmt::format("cannot decrypt option '{}': {}", name, platformError()));
  }
  return secret;
}

int get(Context &context, const FileOptions &options) {
  OptionMap map;
  loadSection(map, options.file, options.section);
  const Json::Value values = valuesOf(map);
  if (!values.isMember(options.name)) {
    // An option that services skip is in the file nevertheless; "no such option" would mislead.
    if (unreadNames(options.file, options.section, values).count(options.name) > 0) {
      throw Failure(kFailed, fmt::format("the value of option '{}' is not JSON, so no service "
                                         "sees it; set it again or unset it",
                                         options.name));
    }
    throw Failure(kNegative, fmt::format("section '{}' of {} has no option '{}'", options.section,
                                         options.file, options.name));
  }
  const Json::Value &stored = values[options.name];
  const Json::Value value = options.reveal ? revealed(map, options.name, stored) : stored;
  context.document["option"] = jsonOption(options.name, value);
  if (context.json) {
    return kDone;
  }
  const char end = options.null ? '\0' : '\n';
  // One element per record, so that scripts need no JSON parser.
  if (value.isArray()) {
    for (const Json::Value &element : value) {
      context.out.name(bare(element), end);
    }
  } else {
    context.out.name(bare(value), end);
  }
  return kDone;
}

void registerQueries(CommandGroup &group) {
  auto of = std::make_shared<FileOptions>();
  group.command("sections", "List the sections of a file")
      .argument(of->file, "FILE", "the section file")
      .completes(Completes::Files)
      .nullFlag(of->null, "end each name with a NUL byte")
      .example("kovabackup option sections /etc/backup/task.conf")
      .action([of](Context &c) { return sections(c, *of); });
  auto listed = std::make_shared<ListOptions>();
  Command listing = group.command("list", "List the options of a section, or of all sections");
  listing.argument(listed->of.file, "FILE", "the section file")
      .completes(Completes::Files)
      .optionalArgument(listed->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .nullFlag(listed->of.null, "end each option with a NUL byte");
  declareOrder(listing, listed->order, sortKeys());
  listing
      .note("An option is printed as NAME=VALUE, with the value as JSON, as in the file. A secret "
            "appears as its cipher text; option get --reveal decrypts it. An option whose value is "
            "not JSON is left out, and a message names it. Without SECTION a row is the section, a "
            "tab and the option.")
      .example("kovabackup option list /etc/backup/task.conf task12")
      .action([listed](Context &c) { return list(c, *listed); });
  auto got = std::make_shared<FileOptions>();
  group.command("get", "Print the value of an option")
      .argument(got->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(got->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .argument(got->name, "NAME", "the option")
      .completes(optionNames)
      .flag(got->reveal, "--reveal", "decrypt a secret and show it")
      .nullFlag(got->null, "end the value, or each element of a list, with a NUL byte")
      .note("Text is printed without quotes, a list with one element per line. Ends with 3 when "
            "there is no such file, section or option. Only the service knows which options are "
            "secret: without --reveal a secret appears as its cipher text.")
      .example("kovabackup option get /etc/backup/task.conf task12 name")
      .example("kovabackup option get /etc/backup/task.conf task12 password --reveal")
      .action([got](Context &c) { return get(c, *got); });
}

} // namespace

void registerOption(CommandGroup &root) {
  CommandGroup group = root.group("option", "Read and change options in section files");
  group.example("kovabackup option list /etc/backup/task.conf task12")
      .example("kovabackup option set /etc/backup/task.conf task12 retries 3 --type int --lock "
               "task.conf");
  registerQueries(group);
  registerDiff(group);
  registerChangers(group);
  registerEdit(group);
}

} // namespace KOVA::Backup::Tool
