#ifndef KOVABACKUP_TOOLS_OPTION_CHANGE_H
#define KOVABACKUP_TOOLS_OPTION_CHANGE_H

/// @file The commands that change options: `option set` and `option unset`.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerChangers(CommandGroup &group);

} // namespace KOVA::Backup::Tool

#endif
