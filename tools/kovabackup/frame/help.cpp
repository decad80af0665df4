#include "tools/kovabackup/frame/help.h"

#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kWidest = 80; // longer lines are hard to read
constexpr std::size_t kNarrow = 72; // below it two columns leave no room for text

// Where text goes.
struct Layout {
  Style style;
  std::size_t width;
  std::size_t helpColumn;
};

Layout layoutFor(const Output &out) {
  const std::size_t width = out.width() == 0 ? kWidest : std::min(out.width(), kWidest);
  return {out.style(), width, width < kNarrow ? std::size_t{8} : std::size_t{28}};
}

std::string entry(const Layout &layout, const std::string &names, const std::string &help) {
  std::string line = "  " + names;
  if (line.size() + 2 > layout.helpColumn || layout.width < kNarrow) {
    line += "\n" + std::string(layout.helpColumn, ' ');
  } else {
    line.resize(layout.helpColumn, ' ');
  }
  return line + wrapped(help, layout.helpColumn, layout.width) + "\n";
}

std::string optionEntry(const Layout &layout, const Option &option) {
  // Without a letter the name is indented so that all names begin in the same column.
  const std::string letter = option.letter == '\0' ? "    " : fmt::format("-{}, ", option.letter);
  const std::string value = option.takesValue() ? " " + option.value : "";
  return entry(layout, letter + option.name + value, option.help);
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

std::string section(const Layout &layout, const char *heading, const std::string &entries) {
  return entries.empty() ? "" : "\n" + layout.style.bold(heading) + "\n" + entries;
}

std::string argumentEntries(const Layout &layout, const Declaration &at) {
  std::string entries;
  for (const Argument &argument : at.arguments) {
    entries += entry(layout, argument.name, argument.help);
  }
  return entries;
}

std::string commandEntries(const Layout &layout, const Declaration &at) {
  std::string entries;
  for (const Declaration *child : visibleChildren(at)) {
    entries += entry(layout, child->name, child->help);
  }
  return entries;
}

// The options of a command itself; those of the root are the common ones.
std::string ownOptionEntries(const Layout &layout, const Declaration &at) {
  std::string entries;
  for (const Option &option : at.options) {
    entries += at.parent == nullptr ? "" : optionEntry(layout, option);
  }
  return entries;
}

std::string commonOptionEntries(const Layout &layout, const Declaration &at) {
  std::string entries;
  for (const Option *option : commonOptions(at)) {
    entries += optionEntry(layout, *option);
  }
  return entries;
}

std::string notes(const Layout &layout, const Declaration &at) {
  std::string text;
  for (const std::string &note : at.notes) {
    text += "\n" + wrapped(note, 0, layout.width) + "\n";
  }
  return text;
}

// The parts of a shell line between which it may be continued: at spaces outside quotes.
std::vector<std::string> shellParts(const std::string &line) {
  std::vector<std::string> parts(1);
  char quote = '\0';
  for (const char c : line) {
    if (c == ' ' && quote == '\0') {
      parts.emplace_back();
      continue;
    }
    if (quote == '\0' && (c == '\'' || c == '"')) {
      quote = c;
    } else if (c == quote) {
      quote = '\0';
    }
    parts.back() += c;
  }
  return parts;
}

// With backslashes at the ends of its lines, so that it can be pasted.
std::string continued(const std::string &line, std::size_t indent, std::size_t width) {
  static const std::string kContinued = " \\";
  const std::vector<std::string> parts = shellParts(line);
  std::string text(indent, ' ');
  std::size_t column = indent;
  for (std::size_t i = 0; i < parts.size(); ++i) {
    const std::size_t after = i + 1 < parts.size() ? kContinued.size() : 0;
    const std::size_t wide = columns(parts[i]);
    if (i > 0 && column + 1 + wide + after > width) {
      text += kContinued + "\n" + std::string(2 * indent, ' ');
      column = 2 * indent;
    } else if (i > 0) {
      text += ' ';
      ++column;
    }
    text += parts[i];
    column += wide;
  }
  return text;
}

// A line that fits is never broken, and one that is not shown on a terminal fits.
std::string examples(const Declaration &at, std::size_t width) {
  constexpr std::size_t kIndent = 2;
  std::string text = at.examples.empty() ? "" : "\nExamples:\n";
  for (const std::string &example : at.examples) {
    const bool fits = width == 0 || kIndent + columns(example) <= width;
    text +=
        (fits ? std::string(kIndent, ' ') + example : continued(example, kIndent, width)) + "\n";
  }
  return text;
}

} // namespace

std::string helpText(const Declaration &at, const Output &out) {
  static const std::string kUsage = "Usage:";
  const Layout layout = layoutFor(out);
  return wrapped(at.help, 0, layout.width) + "\n\n" + layout.style.bold(kUsage) + " " +
         wrapped(usage(at), kUsage.size() + 1, layout.width) + "\n" +
         section(layout, "Arguments:", argumentEntries(layout, at)) +
         section(layout, "Commands:", commandEntries(layout, at)) +
         section(layout, "Options:", ownOptionEntries(layout, at)) +
         section(layout, "Common options:", commonOptionEntries(layout, at)) + notes(layout, at) +
         examples(at, out.width());
}

} // namespace KOVA::Backup::Tool
