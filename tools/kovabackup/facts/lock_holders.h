#ifndef KOVABACKUP_TOOLS_LOCK_HOLDERS_H
#define KOVABACKUP_TOOLS_LOCK_HOLDERS_H

/// @file The lock tokens that users name on the command line, and their users.

#include "kovabackup/service/run_lock.h"

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

using Service::LockUser;

/// The lock file of a token.
/// Errors: throws a Failure (wrong usage) when the token is empty or leads out of the lock
///         directory.
std::string lockFileOf(const std::string &token);

/// All lock tokens that were ever taken and whose files still exist, sorted.
/// Errors: throws a Failure when the lock directory cannot be read.
std::vector<std::string> allLockTokens();

/// The processes that hold the lock or wait for it; none for a lock that was never taken.
/// Errors: as lockFileOf; a Failure when they cannot be found out.
std::vector<LockUser> lockUsersOf(const std::string &token);

} // namespace KOVA::Backup::Tool

#endif
