#ifndef KOVABACKUP_PATH_KOVA_H
#define KOVABACKUP_PATH_KOVA_H

/// @file Paths as the storage platform sees them: shares, and the @eaDir folders that hold extended
/// attributes.
///
///     Path::getShareName("/volume1/music/a/b");            // "music", from the platform
///     Path::isInKovaEaDir("/volume1/music/@eaDir/b");      // true
///
/// Failure:   getShareName returns "", which it also does for a path that is in no share. Only
///            std::bad_alloc is thrown.
/// errno:     not meaningful.
/// Log:       getShareName logs under the module path "path/path_kova".
/// Threads:   any thread.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state.

#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Path {

/// Asks the platform for the share that holds a path. Only the part of path before its first NUL
/// byte is used. Returns: the share's name as the platform reports it, at most 492 bytes; "" if
/// path is in no share
///          or if the platform fails.
/// Log:     one LOG_ERR line, 35, if the platform reports failure. A platform may also do so for a
///          path that is in no share.
/// Blocks:  while the platform examines the path's file system.
std::string getShareName(const std::string &path);

/// Checks whether a component of path, the last one included, is exactly "@eaDir", the folder in
/// which the platform keeps extended attributes. Case matters. The file system is not accessed.
///     isInKovaEaDir("/v/@eaDir") == true            isInKovaEaDir("/v/x@eaDir") == false
///     isInKovaEaDir("@eaDir/x") == true             isInKovaEaDir("/v/@eaDirs") == false
///     isInKovaEaDir("/v/x@eaDir/@eaDir") == true    isInKovaEaDir("/v/@eadir") == false
/// Returns: true if one is.
bool isInKovaEaDir(const std::string &path);

} // namespace Path
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
