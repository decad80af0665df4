#ifndef KOVABACKUP_TOOLS_SESSION_PRUNE_H
#define KOVABACKUP_TOOLS_SESSION_PRUNE_H

/// @file `session prune`, which removes what crashed services left behind.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerPrune(CommandGroup &group);

} // namespace KOVA::Backup::Tool

#endif
