#ifndef KOVABACKUP_TOOLS_LOCK_HOLDERS_H
#define KOVABACKUP_TOOLS_LOCK_HOLDERS_H

/// @file The lock tokens that users name on the command line, and their users.

#include "kovabackup/service/run_lock.h"
#include "tools/kovabackup/facts/lock_keepers.h"

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

/// Who has a lock and who waits for it.
struct LockState {
  std::vector<LockUser> users; ///< those that asked for it
  /// Those that keep it although they did not ask. Sought only where a process that asked has ended
  /// or may be out of sight.
  std::vector<LockKeeper> keepers;

  bool held() const;
};

/// Errors: as lockUsersOf.
LockState lockStateOf(const std::string &token);

/// A process for a message: "4711 (tar)", or that it has ended.
std::string describe(const LockUser &user);

} // namespace KOVA::Backup::Tool

#endif
