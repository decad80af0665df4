#ifndef KOVABACKUP_TOOLS_OPTION_DIFF_H
#define KOVABACKUP_TOOLS_OPTION_DIFF_H

/// @file `option diff`, which compares files or sections.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerDiff(CommandGroup &group);

} // namespace KOVA::Backup::Tool

#endif
