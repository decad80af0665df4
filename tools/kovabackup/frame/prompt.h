#ifndef KOVABACKUP_TOOLS_PROMPT_H
#define KOVABACKUP_TOOLS_PROMPT_H

/// @file Questions to the person at the terminal.

#include "tools/kovabackup/frame/cli.h"

#include <string>

namespace KOVA::Backup::Tool {

/// True when there is somebody to ask: standard input and standard error are a terminal.
bool canAsk(const Context &context);

/// Asks for a yes; all else, the end of the input included, is a no.
bool confirm(Context &context, const std::string &question);

/// Asks for a secret, without showing what is typed.
/// Signals: those that end or stop the process put the terminal back first.
/// Errors:  throws a Failure when nothing is entered.
std::string askSecret(Context &context, const std::string &question);

} // namespace KOVA::Backup::Tool

#endif
