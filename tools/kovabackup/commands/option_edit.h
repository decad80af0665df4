#ifndef KOVABACKUP_TOOLS_OPTION_EDIT_H
#define KOVABACKUP_TOOLS_OPTION_EDIT_H

/// @file The command that opens an editor on a section: `option edit`.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerEdit(CommandGroup &group);

} // namespace KOVA::Backup::Tool

#endif
