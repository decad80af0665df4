#ifndef KOVABACKUP_TOOLS_SESSION_VIEW_H
#define KOVABACKUP_TOOLS_SESSION_VIEW_H

/// @file How the session commands present a session and its users: as a table row, as text and as
/// JSON.

#include "tools/kovabackup/facts/sessions.h"
#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {

/// Where the data of the session is: "local" (in the session root) or "volume" (on a volume, to
/// which a link in the session root points).
const char *kindName(const SessionInfo &session);

/// The word for a state: "whole" (Complete), "dangling", "lost", "broken" or "foreign". Scripts
/// rely on these words, so they never change.
const char *stateName(SessionInfo::State state);

/// "4711 (tar)", or "4711 (tar) and 2 more"; "none" for an empty list, "unknown" without one.
std::string describeUsers(const SessionUsers &users);

/// A list of objects with "pid" and "command"; null when the users are unknown.
Json::Value jsonUsers(const SessionUsers &users);

/// The session as an object. "id", "problem" and "path" are null when there is none. "counted" is
/// false when a part of the directory could not be examined; "files" and "bytes" are then lower
/// bounds.
Json::Value jsonSession(const SessionInfo &session, const TreeSize &size);

/// An empty table with the columns of `session list`.
Rows sessionRows();

/// One row of that table. The id of a lost session is "-". Sizes and ages are rounded if the output
/// is a terminal, and exact otherwise.
std::vector<std::string> sessionRow(const Context &context, const SessionInfo &session,
                                    const TreeSize &size);

} // namespace KOVA::Backup::Tool

#endif
