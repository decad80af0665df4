#ifndef KOVABACKUP_SERVICE_TOKEN_LOCK_H
#define KOVABACKUP_SERVICE_TOKEN_LOCK_H

/// @file Takes the lock of a token, the one that OptionMap::lock takes.
///
/// It differs from OptionMap::lock in four points. The descriptor is close-on-exec from the start.
/// A symbolic link in the place of the lock file is refused. The lock is on the file that has the
/// name: if a cleaner removed the file before the lock was granted, another process could lock a
/// new one at the same time. And the wait may be limited.
///
/// Errors: those of RunLock::take, except EALREADY.

#include "base/unique_fd.h"
#include "kovabackup/service/error.h"
#include "kovabackup/service/millis.h"

#include <string>

namespace KOVA::Backup::Service {

/// The path of the lock file; "" for a token that is refused. A token may come from outside the
/// program, so it cannot lead out of the lock directory.
std::string tokenPath(const std::string &token);

/// Opens and locks the lock file.
/// Returns: true with lock set; false with error set.
bool takeToken(const std::string &token, Millis limit, Base::UniqueFd &lock, Error &error);

} // namespace KOVA::Backup::Service

#endif
