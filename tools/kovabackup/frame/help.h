#ifndef KOVABACKUP_TOOLS_HELP_H
#define KOVABACKUP_TOOLS_HELP_H

/// @file The help of a group or command, made from its declaration.

#include "tools/kovabackup/frame/declaration.h"
#include "tools/kovabackup/frame/output.h"

#include <string>

namespace KOVA::Backup::Tool {

/// The help as it is written to out: in its colours and, on a terminal, within its width.
std::string helpText(const Declaration &at, const Output &out);

} // namespace KOVA::Backup::Tool

#endif
