#ifndef KOVABACKUP_TOOLS_GROUPS_H
#define KOVABACKUP_TOOLS_GROUPS_H

/// @file The families of the command; each stands in a <family>_command.cpp of its own.

#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

void registerSession(CLI::App &app, Context &context);
void registerFilter(CLI::App &app, Context &context);
void registerOption(CLI::App &app, Context &context);
void registerVolume(CLI::App &app, Context &context);
void registerNet(CLI::App &app, Context &context);
void registerTemplate(CLI::App &app, Context &context);
void registerLock(CLI::App &app, Context &context);
void registerRun(CLI::App &app, Context &context);
void registerDoctor(CLI::App &app, Context &context);

} // namespace KOVA::Backup::Tool

#endif
