#ifndef KOVABACKUP_TOOLS_INVOCATION_H
#define KOVABACKUP_TOOLS_INVOCATION_H

/// @file From the command line to the action.

#include "tools/kovabackup/frame/context.h"
#include "tools/kovabackup/frame/declaration.h"

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// Runs the command that the words name; answers --help, --version and wrong usage itself.
/// Returns: the exit code. What was written may still be in the buffers of the context.
int invoke(const Declaration &root, const std::vector<std::string> &words, Context &context);

} // namespace KOVA::Backup::Tool

#endif
