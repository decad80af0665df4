#ifndef KOVABACKUP_PATH_KOVA_H
#define KOVABACKUP_PATH_KOVA_H

/// @file Paths as the storage platform sees them: shares and the folders of extended attributes.
///
///     Path::getShareName("/volume1/music/a/b");            // "music", from the platform
///     Path::isInKovaEaDir("/volume1/music/@eaDir/b");      // true
///
/// Failure:   by return value; only std::bad_alloc is thrown.
/// errno:     not meaningful.
/// Log:       getShareName, under the module path "path/path_kova".
/// Threads:   any thread.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state.

#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Path {

/// Asks the platform for the share that holds a path. path ends at its first NUL byte.
/// Returns: the share's name as the platform reports it, at most 492 bytes; "" when path is not on
///          a share or the platform fails.
/// Log:     one LOG_ERR line, 35, when the platform reports failure.
/// Blocks:  while the platform examines the path's file system.
std::string getShareName(const std::string &path);

/// Checks whether a component of path is exactly "@eaDir", the folder in which the platform keeps
/// the extended attributes of a directory. The comparison is case-sensitive and does not access the
/// file system.
///     isInKovaEaDir("/v/@eaDir") == true            isInKovaEaDir("/v/x@eaDir") == false
///     isInKovaEaDir("@eaDir/x") == true             isInKovaEaDir("/v/@eaDirs") == false
///     isInKovaEaDir("/v/x@eaDir/@eaDir") == true    isInKovaEaDir("/v/@eadir") == false
/// Returns: true when there is such a component.
bool isInKovaEaDir(const std::string &path);

} // namespace Path
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
