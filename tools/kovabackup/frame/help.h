#ifndef KOVABACKUP_TOOLS_HELP_H
#define KOVABACKUP_TOOLS_HELP_H

/// @file The help of a command, its families and verbs.

#include "tools/kovabackup/frame/output.h"

#include <string>

namespace CLI {
class App;
}

namespace KOVA::Backup::Tool {

/// The words that call it: "kovabackup session list".
std::string commandName(const CLI::App &app);

std::string helpText(const CLI::App &app, const Style &style);

/// Breaks text into lines that fit 80 columns, all but the first indented.
std::string wrapText(const std::string &text, std::size_t indent);

} // namespace KOVA::Backup::Tool

#endif
