#ifndef KOVABACKUP_TOOLS_SESSION_REMOVAL_H
#define KOVABACKUP_TOOLS_SESSION_REMOVAL_H

/// @file Removal of sessions, for `session destroy` and `session prune`.
///
///     requireTrustedRoot();              // once, before anything is removed
///     removeSession(findSession(id));

#include "tools/kovabackup/facts/session_store.h"

#include <functional>

namespace KOVA::Backup::Tool {

/// Checks that no other user could have placed what a removal would follow.
/// Errors: throws a Failure when the session root, or the directory above it, belongs to another
///         user or may be written by one.
void requireTrustedRoot();

/// Removes a session with everything in it.
/// Errors: throws a Failure when a part of it remains.
void removeSession(const SessionEntry &entry);

/// The same, part by part, so that progress can be shown within a large session. Called with the
/// bytes of each part that is gone.
void removeSession(const SessionEntry &entry, const std::vector<TreePart> &parts,
                   const std::function<void(std::uint64_t)> &removed);

} // namespace KOVA::Backup::Tool

#endif
