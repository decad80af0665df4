#ifndef KOVABACKUP_SERVICE_SESSION_SCAN_H
#define KOVABACKUP_SERVICE_SESSION_SCAN_H

/// @file What sessions exist. Nothing here changes a session.

#include "kovabackup/service/session_store.h"

#include <functional>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KOVA::Backup::Service {

struct FoundSession {
  SessionInfo info;
  struct stat status = {}; ///< of its directory if it has one, otherwise of the entry in the root
  Error failure;           ///< why it counts as foreign although it may not be
};

enum class Search { Found, Absent, Failed };

/// Whether a session in this state has a directory.
inline bool hasDirectory(SessionInfo::State state) {
  return state == SessionInfo::State::Complete || state == SessionInfo::State::Lost;
}

/// Examines one name of a folder. Failed: the Error is set.
using Examine = std::function<Search(const char *name, FoundSession &found, Error &error)>;

/// Appends what examine finds among the names in a folder.
/// Returns: true when all were examined. On false error is set to the first failure.
bool findIn(const std::string &folder, const Examine &examine, std::vector<FoundSession> &out,
            Error &error);

/// Examines an entry of the session root.
Search findEntry(const std::string &id, FoundSession &found, Error &error);

/// Examines a lost directory once more: whether it is still there and still lost.
Search findLost(const std::string &path, FoundSession &found, Error &error);

/// Lists what SessionStore::list lists, in its order.
/// Returns: as SessionStore::list.
bool findAll(std::vector<FoundSession> &out, Error &error);

/// Checks that no other user could have placed what a change would follow.
/// Returns: as SessionStore::trusted.
bool isRootTrusted(Error &error);

} // namespace KOVA::Backup::Service

#endif
