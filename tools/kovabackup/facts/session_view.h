#ifndef KOVABACKUP_TOOLS_SESSION_VIEW_H
#define KOVABACKUP_TOOLS_SESSION_VIEW_H

/// @file What the verbs on sessions share: how a session is shown, who uses it, how it goes.

#include "tools/kovabackup/facts/processes.h"
#include "tools/kovabackup/facts/session_store.h"
#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

/// The processes that have something of a session open or work in it.
std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry);
Json::Value jsonUsers(const std::vector<Process> &users);

const char *kindName(const SessionEntry &entry);
Json::Value jsonSession(const SessionEntry &entry, const TreeSize &size);
Rows sessionRows();
std::vector<std::string> sessionRow(const Context &context, const SessionEntry &entry,
                                    const TreeSize &size);

/// Errors: throws a Failure when a part of it stays.
void removeSession(const SessionEntry &entry);

} // namespace KOVA::Backup::Tool

#endif
