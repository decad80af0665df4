#ifndef KOVABACKUP_SERVICE_SESSION_REMOVAL_H
#define KOVABACKUP_SERVICE_SESSION_REMOVAL_H

/// @file The removal of one session.
///
///     1  under the lock of the session root: examine it again, give it a fresh name, look for its
///        users and at its age; in case of a refusal give the old name back
///     2  still under the lock: open its directory, so that the look of every other store finds
///        this process in it
///     3  without the lock: remove the tree, and give the old name back if something is left
///     4  remove the links

#include "service/session_scan.h"

namespace KOVA::Backup::Service {

enum class Outcome {
  Removed,
  Gone, ///< there is no such session any more
  Failed
};

/// Removes a session that SessionStore::list returned. The session root exists and is trusted.
Outcome removeSession(const SessionInfo &session, const SessionRemoval &how, Error &error);

/// The same, after a look for its users under its present name. This finds a store that is removing
/// it.
Outcome removeUnused(const SessionInfo &session, const SessionRemoval &how, Error &error);

} // namespace KOVA::Backup::Service

#endif
