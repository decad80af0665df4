#ifndef KOVABACKUP_TOOLS_BOOT_HEALTH_H
#define KOVABACKUP_TOOLS_BOOT_HEALTH_H

/// @file Whether something creates the directory /tmp/kovabackup before users can log in.

#include "tools/kovabackup/facts/health.h"

namespace KOVA::Backup::Tool {

/// Adds what creates the IPC root at boot, or that nothing does.
void checkBoot(Findings &findings);

} // namespace KOVA::Backup::Tool

#endif
