#include "tools/kovabackup/commands/option_diff.h"

#include "kovabackup/option_map.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/option_view.h"
#include "tools/kovabackup/facts/section_editor.h"

#include <filesystem>
#include <fmt/format.h>
#include <map>
#include <set>
#include <system_error>

namespace KOVA::Backup::Tool {
namespace {

struct DiffOptions {
  std::string file;
  std::optional<std::string> other;
  std::vector<std::string> sections;
  bool null = false;
};

// The options of a section as their texts in the file, read or not: an option that services skip
// may still be what makes two sections differ.
using Texts = std::map<std::string, std::string>;

// Which section of which file. The names differ when two sections of one file are compared.
struct Side {
  std::string file;
  std::string section;
};

Texts textsOf(const Side &side) {
  OptionMap map;
  loadSection(map, side.file, side.section);
  const Json::Value values = valuesOf(map);
  Texts texts = writtenOptions(side.file, side.section);
  for (const std::string &name : values.getMemberNames()) {
    texts[name] = compact(values[name]);
  }
  return texts;
}

// Collects the differences: rows for people, objects for the document.
class Report {
public:
  explicit Report(Context &context) : context_(&context) {
    rows_.column("").column("SECTION").column("OPTION");
    context.document["differences"] = Json::Value(Json::arrayValue);
  }

  /// text: the option as NAME=VALUE; "" for the section itself.
  void add(const char *mark, const std::string &section, const std::string &text) {
    rows_.add({mark, section, text});
    Json::Value entry(Json::objectValue);
    entry["side"] = *mark == '-' ? "first" : "second";
    entry["section"] = jsonName(section);
    entry["option"] = text.empty() ? Json::Value() : jsonName(text);
    context_->document["differences"].append(entry);
  }

  int finish(bool null) {
    context_->document["same"] = rows_.empty();
    if (!context_->json) {
      rows_.print(context_->out, null);
    }
    return rows_.empty() ? kDone : kNegative;
  }

private:
  Context *context_;
  Rows rows_;
};

void compareSections(Report &report, const Side &first, const Side &second) {
  const Texts left = textsOf(first);
  const Texts right = textsOf(second);
  Texts all = left;
  all.insert(right.begin(), right.end());
  for (const auto &[name, ignored] : all) {
    const auto a = left.find(name);
    const auto b = right.find(name);
    if (a != left.end() && b != right.end() && a->second == b->second) {
      continue;
    }
    if (a != left.end()) {
      report.add("-", first.section, fmt::format("{}={}", name, a->second));
    }
    if (b != right.end()) {
      report.add("+", second.section, fmt::format("{}={}", name, b->second));
    }
  }
}

void addSection(Report &report, const char *mark, const Side &side) {
  report.add(mark, side.section, "");
  for (const auto &[name, text] : textsOf(side)) {
    report.add(mark, side.section, fmt::format("{}={}", name, text));
  }
}

std::set<std::string> sectionsIn(const std::string &file) {
  const std::list<std::string> names = sectionsOf(file);
  return {names.begin(), names.end()};
}

void compareFiles(Report &report, const std::string &first, const std::string &second) {
  const std::set<std::string> left = sectionsIn(first);
  const std::set<std::string> right = sectionsIn(second);
  std::set<std::string> all = left;
  all.insert(right.begin(), right.end());
  for (const std::string &name : all) {
    if (right.count(name) == 0) {
      addSection(report, "-", {first, name});
    } else if (left.count(name) == 0) {
      addSection(report, "+", {second, name});
    } else {
      compareSections(report, {first, name}, {second, name});
    }
  }
}

// The names of sections are what comes to mind first as arguments.
void requireNoSectionAsFile(const DiffOptions &options) {
  std::error_code unknown;
  if (!options.other || std::filesystem::exists(*options.other, unknown) || unknown) {
    return;
  }
  const std::set<std::string> names = sectionsIn(options.file);
  if (names.count(*options.other) > 0) {
    throw Failure(kUsage, fmt::format("there is no file {}; to compare section '{}' of {} with "
                                      "another one, pass --section SECTION twice",
                                      *options.other, *options.other, options.file));
  }
}

int diff(Context &context, const DiffOptions &options) {
  const std::vector<std::string> &sections = options.sections;
  const bool oneFile = !options.other;
  if (sections.size() > 2 || (oneFile && sections.size() != 2)) {
    throw Failure(kUsage, oneFile
                              ? "one file: to compare two of its sections, pass --section SECTION "
                                "twice; else pass a second file"
                              : "--section can be given at most twice");
  }
  requireNoSectionAsFile(options);
  const std::string &other = options.other.value_or(options.file);
  Report report(context);
  if (sections.empty()) {
    compareFiles(report, options.file, other);
  } else {
    compareSections(report, {options.file, sections.front()}, {other, sections.back()});
  }
  return report.finish(options.null);
}

} // namespace

void registerDiff(CommandGroup &group) {
  auto options = std::make_shared<DiffOptions>();
  group.command("diff", "Compare the options of two files or of two sections")
      .argument(options->file, "FILE", "the first section file")
      .completes(Completes::Files)
      .optionalArgument(options->other, "OTHER", "the second one; by default the same")
      .completes(Completes::Files)
      .repeated(
          options->sections, "--section", "SECTION",
          "compare only this section; given twice: the first one in FILE, the second in OTHER")
      .completes(sectionNames)
      .surplusAdvice("to compare two sections of one file, pass --section SECTION twice")
      .nullFlag(options->null, "end each row with a NUL byte")
      .note(
          "A row is - for FILE or + for OTHER, the section, and the option as NAME=VALUE with the "
          "value as JSON. A section that only one file has gets a row without an option. The order "
          "of options and sections does not matter, nor do comments and white space. Ends with 0 "
          "when there is no difference, with 3 when there is one, or when a file or section does "
          "not exist.")
      .example("kovabackup option diff task.conf task.conf.backup")
      .example("kovabackup option diff task.conf --section task1 --section task2")
      .action([options](Context &c) { return diff(c, *options); });
}

} // namespace KOVA::Backup::Tool
