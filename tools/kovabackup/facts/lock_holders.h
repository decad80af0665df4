#ifndef KOVABACKUP_TOOLS_LOCK_HOLDERS_H
#define KOVABACKUP_TOOLS_LOCK_HOLDERS_H

/// @file Which processes hold a lock token and which wait for it, according to /proc/locks. Looking
/// neither opens nor creates the lock file, so it can neither take nor delay the lock.

#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup::Tool {

/// The lock file of a token.
/// Errors: throws a Failure (wrong usage) when the token is empty or leads out of the lock
///         directory.
std::string lockFileOf(const std::string &token);

struct LockUser {
  bool waits;          ///< waits for the lock rather than holding it
  pid_t pid;           ///< the process that asked for it
  std::string command; ///< its name; "" when it has ended and a child keeps the lock
};

/// Returns: false when the file does not exist. Errors: throws a Failure for any other reason.
bool findLockUsers(const std::string &file, std::vector<LockUser> &users);

} // namespace KOVA::Backup::Tool

#endif
