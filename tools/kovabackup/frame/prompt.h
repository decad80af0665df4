#ifndef KOVABACKUP_TOOLS_PROMPT_H
#define KOVABACKUP_TOOLS_PROMPT_H

/// @file Questions to the user at the terminal.

#include "tools/kovabackup/frame/cli.h"

#include <string>

namespace KOVA::Backup::Tool {

/// True when the user can be asked: standard input and standard error are terminals.
bool canAsk(const Context &context);

/// Asks for a yes. Anything else is a no, even the end of the input.
bool confirm(Context &context, const std::string &question);

/// Asks for a secret, without showing what is typed.
/// Signals: one that ends or stops the process takes effect once the terminal is restored. After a
///          stop the question is asked again.
/// Errors:  throws a Failure when nothing is entered.
std::string askSecret(Context &context, const std::string &question);

} // namespace KOVA::Backup::Tool

#endif
