#ifndef KOVABACKUP_TOOLS_LOCK_HOLDERS_H
#define KOVABACKUP_TOOLS_LOCK_HOLDERS_H

/// @file Who holds a lock token, and who waits for it, as the kernel's list of locks tells. Looking
/// neither opens nor makes the lock file.

#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup::Tool {

/// The lock file of a token.
/// Errors: a token that is empty or leads out of the lock directory throws a Failure (wrong usage).
std::string lockFileOf(const std::string &token);

struct LockUser {
  bool waits;          ///< waits for the lock rather than holding it
  pid_t pid;           ///< the process that asked for it
  std::string command; ///< its name; "" when it has ended and a child keeps the lock
};

/// Returns: false when the file does not exist. Other failures throw a Failure.
bool findLockUsers(const std::string &file, std::vector<LockUser> &users);

} // namespace KOVA::Backup::Tool

#endif
