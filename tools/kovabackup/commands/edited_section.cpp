#include "tools/kovabackup/commands/edited_section.h"

#include "base/json_text.h"
#include "base/section_grammar.h"
#include "base/trim.h"
#include "tools/kovabackup/commands/option_view.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/context.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cstdint>
#include <fmt/format.h>
#include <map>
#include <set>

namespace KOVA::Backup::Tool {
namespace {

namespace Grammar = Base::SectionGrammar;

// Comments, with everything else that is neither blank nor an option, in their order.
std::vector<std::string> commentsOf(const std::vector<std::string> &lines) {
  std::vector<std::string> comments;
  for (const std::string &text : lines) {
    const Grammar::Line line = Grammar::parse(text);
    if (line.kind == Grammar::LineKind::Comment || line.kind == Grammar::LineKind::Other) {
      comments.emplace_back(line.text);
    }
  }
  return comments;
}

std::vector<std::string> linesOf(std::string_view text) {
  std::vector<std::string> lines;
  while (!text.empty()) {
    lines.emplace_back(Grammar::takeLine(text));
  }
  return lines;
}

bool isListOfTexts(const Json::Value &value) {
  return value.isArray() && std::all_of(value.begin(), value.end(),
                                        [](const Json::Value &each) { return each.isString(); });
}

/// Reads line by line; its messages name the number of the line.
class Reader {
public:
  Reader(const ShownSection &shown, bool retype)
      : shown_(&shown), comments_(commentsOf(shown.lines)), retype_(retype) {}

  void read(const std::string &text) {
    ++number_;
    const Grammar::Line line = Grammar::parse(text);
    switch (line.kind) {
    case Grammar::LineKind::Option:
      readOption(std::string(line.key), line.value);
      break;
    case Grammar::LineKind::Header:
    case Grammar::LineKind::BrokenHeader:
      refuse("a line that begins with [ would begin another section");
    case Grammar::LineKind::Other:
      requireKnown(std::string(line.text));
      break;
    case Grammar::LineKind::Blank:
    case Grammar::LineKind::Comment:
      break;
    }
  }

  const EditedSection &section() const { return section_; }

private:
  [[noreturn]] void refuse(const std::string &why) const {
    throw Failure(kFailed, fmt::format("line {}: {}", number_, why));
  }

  // A section may hold text that is not an option, and such a line may stay. A new one is a slip.
  void requireKnown(const std::string &text) const {
    if (std::find(comments_.begin(), comments_.end(), text) == comments_.end()) {
      refuse(
          fmt::format("'{}' is not an option: expected NAME=VALUE, or # before a comment", text));
    }
  }

  void readOption(const std::string &name, std::string_view text) {
    if (!Grammar::isStorableKey(name) || Grammar::holdsNul(name)) {
      refuse(name.empty() ? "there is no name before the ="
                          : fmt::format("'{}' cannot name an option", name));
    }
    const auto [before, isNew] = numbers_.emplace(name, number_);
    if (!isNew) {
      refuse(fmt::format("option '{}' is in line {} already", name, before->second));
    }
    Json::Value value;
    if (!Base::JsonText::fromText(text, value)) {
      refuse(fmt::format("the value of option '{}' is not JSON: text needs quotes, as in "
                         "{}=\"text\"",
                         name, name));
    }
    value = asWritten(value);
    validate(name, value);
    section_.values[name] = value;
  }

  void validate(const std::string &name, const Json::Value &value) {
    const Json::Value &old = shown_->values[name]; // null when there was none that can be read
    if (!canBeWritten(value)) {
      refuse(fmt::format("option '{}' is {}, which no section can hold: expected \"text\", an "
                         "integer from {} to {}, true, false or a list of texts",
                         name, describe(value), INT32_MIN, UINT32_MAX));
    }
    if (value.isArray() && value != old && !isListOfTexts(value)) {
      refuse(fmt::format("option '{}' is a list with an element that is not text", name));
    }
    const std::string type = typeNameOf(value);
    if (!shown_->values.isMember(name) || type == typeNameOf(old)) {
      return;
    }
    if (!retype_) {
      refuse(fmt::format("option '{}' was {} and would be {}, which the services may not expect; "
                         "--retype allows it",
                         name, withArticle(typeNameOf(old)), withArticle(type)));
    }
    section_.retyped.push_back(name);
  }

  static std::string describe(const Json::Value &value) {
    return value.isNull()       ? "null"
           : value.isIntegral() ? "an integer out of range"
                                : withArticle(typeNameOf(value));
  }

  const ShownSection *shown_;
  std::vector<std::string> comments_;
  bool retype_;
  std::size_t number_ = 0;
  std::map<std::string, std::size_t> numbers_; ///< the line of each option
  EditedSection section_;
};

} // namespace

std::string instructionsFor(const std::string &file, const std::string &section) {
  return fmt::format(
      "# Section '{}' of {}\n"
      "# An option is NAME=VALUE, on one line. A value is \"text\", an integer, true, "
      "false or [\"a\",\"b\"].\n"
      "# A secret is its cipher text: change it with 'kovabackup option set "
      "--secret'.\n"
      "# Comments are shown as they are in the file; changes to them are not "
      "saved.\n\n",
      escapeControls(section), escapeControls(file));
}

EditedSection readEdited(const std::string &text, const std::string &instructions,
                         const ShownSection &shown, bool retype) {
  if (Base::trim(text).empty()) {
    throw Failure(kFailed, "the text is empty; to remove all options leave a comment in it");
  }
  const std::vector<std::string> lines = linesOf(text);
  Reader reader(shown, retype);
  std::for_each(lines.begin(), lines.end(), [&reader](const auto &line) { reader.read(line); });
  EditedSection section = reader.section();
  const std::vector<std::string> ours = commentsOf(linesOf(instructions));
  std::vector<std::string> comments = commentsOf(lines);
  comments.erase(std::remove_if(comments.begin(), comments.end(),
                                [&ours](const std::string &each) {
                                  return std::find(ours.begin(), ours.end(), each) != ours.end();
                                }),
                 comments.end());
  section.commentsDiffer = comments != commentsOf(shown.lines);
  return section;
}

} // namespace KOVA::Backup::Tool
