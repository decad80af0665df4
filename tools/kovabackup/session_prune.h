#ifndef KOVABACKUP_TOOLS_SESSION_PRUNE_H
#define KOVABACKUP_TOOLS_SESSION_PRUNE_H

/// @file The verb `session prune`.

#include "tools/kovabackup/cli.h"

namespace KOVA::Backup::Tool {

void registerPrune(Family &family);

} // namespace KOVA::Backup::Tool

#endif
