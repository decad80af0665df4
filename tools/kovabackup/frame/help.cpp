#include "tools/kovabackup/frame/help.h"

#include <CLI/CLI.hpp>
#include <fmt/format.h>
#include <sstream>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kWidth = 80;
constexpr std::size_t kHelpColumn = 28;

const CLI::App &rootOf(const CLI::App &app) {
  const CLI::App *root = &app;
  while (root->get_parent() != nullptr) {
    root = root->get_parent();
  }
  return *root;
}

bool takesValue(const CLI::Option &option) {
  return option.get_expected_max() > 0;
}

bool repeats(const CLI::Option &option) {
  return option.get_expected_max() > 1;
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

std::string optionEntry(const CLI::Option &option) {
  std::string names;
  for (const std::string &name : option.get_snames()) {
    names += "-" + name + ", ";
  }
  if (names.empty()) {
    names = "    "; // long names stand below each other
  }
  for (const std::string &name : option.get_lnames()) {
    names += "--" + name;
  }
  if (takesValue(option)) {
    names += " " + option.get_type_name();
  }
  return entry(names, option.get_description());
}

std::string usage(const CLI::App &app) {
  std::string line = commandName(app);
  const bool family = !app.get_subcommands([](const CLI::App *) { return true; }).empty();
  line += family ? " COMMAND" : "";
  line += " [OPTIONS]";
  for (const CLI::Option *option : app.get_options()) {
    if (option->get_positional()) {
      const std::string name = option->get_name(true) + (repeats(*option) ? "..." : "");
      line += option->get_required() ? " " + name : " [" + name + "]";
    } else if (option->get_required()) {
      line += fmt::format(" {} {}", option->get_name(), option->get_type_name());
    }
  }
  return line;
}

std::string argumentsPart(const CLI::App &app, const Style &style) {
  std::string part;
  for (const CLI::Option *option : app.get_options()) {
    if (option->get_positional()) {
      part += entry(option->get_name(true), option->get_description());
    }
  }
  return part.empty() ? "" : "\n" + style.bold("Arguments:") + "\n" + part;
}

std::string commandsPart(const CLI::App &app, const Style &style) {
  std::string part;
  for (const CLI::App *child : app.get_subcommands([](const CLI::App *) { return true; })) {
    part += entry(child->get_name(), child->get_description());
  }
  return part.empty() ? "" : "\n" + style.bold("Commands:") + "\n" + part;
}

std::string optionsPart(const CLI::App &app, const std::string &heading, const Style &style) {
  std::string part;
  for (const CLI::Option *option : app.get_options()) {
    if (!option->get_positional() && option != app.get_help_ptr()) {
      part += optionEntry(*option);
    }
  }
  return part.empty() ? "" : "\n" + style.bold(heading) + "\n" + part;
}

// What every verb understands, unless it has an option of that name itself.
std::string commonPart(const CLI::App &app, const Style &style) {
  const CLI::App &root = rootOf(app);
  std::string part;
  for (const CLI::Option *option : root.get_options()) {
    const bool hidden =
        &app != &root &&
        (option == root.get_version_ptr() ||
         (option != root.get_help_ptr() && app.get_option_no_throw(option->get_name()) != nullptr));
    part += hidden ? "" : optionEntry(*option);
  }
  return "\n" + style.bold("Common options:") + "\n" + part;
}

} // namespace

std::string commandName(const CLI::App &app) {
  const CLI::App *parent = app.get_parent();
  return parent == nullptr ? app.get_name() : commandName(*parent) + " " + app.get_name();
}

std::string helpText(const CLI::App &app, const Style &style) {
  const bool root = app.get_parent() == nullptr;
  return app.get_description() + "\n\n" + style.bold("Usage:") + " " + usage(app) + "\n" +
         argumentsPart(app, style) + commandsPart(app, style) +
         (root ? "" : optionsPart(app, "Options:", style)) + commonPart(app, style) +
         app.get_footer();
}

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

} // namespace KOVA::Backup::Tool
