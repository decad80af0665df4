#include "tools/kovabackup/frame/help.h"

#include <fmt/format.h>
#include <sstream>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kWidth = 80;
constexpr std::size_t kHelpColumn = 28;

// Breaks text into lines of at most kWidth columns; all but the first are indented.
std::string wrapText(const std::string &text, std::size_t indent) {
  std::istringstream words(text);
  std::string out;
  std::string word;
  std::size_t column = indent;
  while (words >> word) {
    if (column > indent && column + 1 + word.size() > kWidth) {
      out += "\n" + std::string(indent, ' ');
      column = indent;
    } else if (column > indent) {
      out += " ";
      ++column;
    }
    out += word;
    column += word.size();
  }
  return out;
}

std::string entry(const std::string &names, const std::string &help) {
  std::string line = "  " + names;
  if (line.size() + 2 > kHelpColumn) {
    line += "\n" + std::string(kHelpColumn, ' ');
  } else {
    line.resize(kHelpColumn, ' ');
  }
  return line + wrapText(help, kHelpColumn) + "\n";
}

std::string optionEntry(const Option &option) {
  // Without a letter the name is indented so that all names begin in the same column.
  const std::string letter = option.letter == '\0' ? "    " : fmt::format("-{}, ", option.letter);
  const std::string value = option.takesValue() ? " " + option.value : "";
  return entry(letter + option.name + value, option.help);
}

std::string usage(const Declaration &at) {
  std::string line = commandName(at) + (at.isGroup() ? " COMMAND" : "") + " [OPTIONS]";
  for (const Option &option : at.options) {
    line += option.required ? fmt::format(" {} {}", option.name, option.value) : "";
  }
  for (const Argument &argument : at.arguments) {
    const std::string name = argument.name + (argument.repeats ? "..." : "");
    line += argument.required ? " " + name : " [" + name + "]";
  }
  return line;
}

std::string section(const char *heading, const std::string &entries, const Style &style) {
  return entries.empty() ? "" : "\n" + style.bold(heading) + "\n" + entries;
}

std::string argumentEntries(const Declaration &at) {
  std::string entries;
  for (const Argument &argument : at.arguments) {
    entries += entry(argument.name, argument.help);
  }
  return entries;
}

std::string commandEntries(const Declaration &at) {
  std::string entries;
  for (const Declaration *child : visibleChildren(at)) {
    entries += entry(child->name, child->help);
  }
  return entries;
}

// The options of a command itself; those of the root are the common ones.
std::string ownOptionEntries(const Declaration &at) {
  std::string entries;
  for (const Option &option : at.options) {
    entries += at.parent == nullptr ? "" : optionEntry(option);
  }
  return entries;
}

std::string commonOptionEntries(const Declaration &at) {
  std::string entries;
  for (const Option *option : commonOptions(at)) {
    entries += optionEntry(*option);
  }
  return entries;
}

std::string notes(const Declaration &at) {
  std::string text;
  for (const std::string &note : at.notes) {
    text += "\n" + wrapText(note, 0) + "\n";
  }
  return text;
}

// Never wrapped, so that examples can be copied.
std::string examples(const Declaration &at) {
  std::string text = at.examples.empty() ? "" : "\nExamples:\n";
  for (const std::string &example : at.examples) {
    text += "  " + example + "\n";
  }
  return text;
}

} // namespace

std::string helpText(const Declaration &at, const Style &style) {
  return at.help + "\n\n" + style.bold("Usage:") + " " + usage(at) + "\n" +
         section("Arguments:", argumentEntries(at), style) +
         section("Commands:", commandEntries(at), style) +
         section("Options:", ownOptionEntries(at), style) +
         section("Common options:", commonOptionEntries(at), style) + notes(at) + examples(at);
}

} // namespace KOVA::Backup::Tool
