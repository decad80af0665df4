#ifndef KOVABACKUP_TOOLS_GROUPS_H
#define KOVABACKUP_TOOLS_GROUPS_H

/// @file The groups of commands. Each is declared in its own <group>_command.cpp.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerSession(CommandGroup &root);
void registerFilter(CommandGroup &root);
void registerOption(CommandGroup &root);
void registerVolume(CommandGroup &root);
void registerNet(CommandGroup &root);
void registerTemplate(CommandGroup &root);
void registerLock(CommandGroup &root);
void registerRun(CommandGroup &root);
void registerDoctor(CommandGroup &root);
void registerExplain(CommandGroup &root);

} // namespace KOVA::Backup::Tool

#endif
