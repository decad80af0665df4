#ifndef KOVABACKUP_TOOLS_SESSION_VIEW_H
#define KOVABACKUP_TOOLS_SESSION_VIEW_H

/// @file How the commands on sessions show a session and its users: as a row, in words, as JSON.

#include "tools/kovabackup/facts/session_store.h"
#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

/// "local" or "volume".
const char *kindName(const SessionEntry &entry);

/// "whole", "dangling", "broken" or "foreign". Scripts rely on these words.
const char *stateName(SessionState state);

/// "4711 (tar)", or "4711 (tar) and 2 more"; "none" for an empty list.
std::string describeUsers(const std::vector<Process> &users);

Json::Value jsonUsers(const std::vector<Process> &users);
Json::Value jsonSession(const SessionEntry &entry, const TreeSize &size);

/// An empty table with the columns of `session list`.
Rows sessionRows();

/// One row of that table. Sizes and ages are rounded for people on a terminal, exact elsewhere.
std::vector<std::string> sessionRow(const Context &context, const SessionEntry &entry,
                                    const TreeSize &size);

} // namespace KOVA::Backup::Tool

#endif
