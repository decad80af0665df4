#ifndef KOVABACKUP_SERVICE_LOCK_TABLE_H
#define KOVABACKUP_SERVICE_LOCK_TABLE_H

/// @file The kernel's list of locks, /proc/locks.

#include "kovabackup/service/run_lock.h"

#include <sys/stat.h>

namespace KOVA::Backup::Service {

/// Finds the flock(2) locks on the file at a path, which stat(2) reported as file, and who waits
/// for them, in the order of the list. Returns: true with out set; on false error is set and out is
/// untouched.
bool findLockUsers(const std::string &path, const struct stat &file, std::vector<LockUser> &out,
                   Error &error);

} // namespace KOVA::Backup::Service

#endif
