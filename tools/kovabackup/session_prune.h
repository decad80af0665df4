#ifndef KOVABACKUP_TOOLS_SESSION_PRUNE_H
#define KOVABACKUP_TOOLS_SESSION_PRUNE_H

/// @file The verb `session prune`, and what it shares with the other verbs on sessions.

#include "tools/kovabackup/cli.h"
#include "tools/kovabackup/session_store.h"

namespace KOVA::Backup::Tool {

const char *kindName(const SessionEntry &entry);
Json::Value jsonSession(const SessionEntry &entry, const TreeSize &size);
Rows sessionRows();
std::vector<std::string> sessionRow(const Context &context, const SessionEntry &entry,
                                    const TreeSize &size);

/// Errors: throws a Failure when a part of it stays.
void removeSession(const SessionEntry &entry);

void registerPrune(Family &family);

} // namespace KOVA::Backup::Tool

#endif
