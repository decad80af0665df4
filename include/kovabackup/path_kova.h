#ifndef KOVABACKUP_PATH_KOVA_H
#define KOVABACKUP_PATH_KOVA_H

/// @file Paths as the storage platform sees them: shares and the folders of extended attributes.
///
///     Path::getShareName("/volume1/music/a/b");            // "music", asked of the platform
///     Path::isInKovaEaDir("/volume1/music/@eaDir/b");      // true
///
/// Failure:   by return value; nothing is thrown but std::bad_alloc.
/// errno:     not meaningful.
/// Log:       getShareName, under the module path "path/path_kova".
/// Threads:   any.
/// Process:   no process-wide state.

#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Path {

/// The name of the share that holds a path.
/// Returns: the name as the platform reports it, or "" when the path lies on no share or the
///          platform fails.
/// Log:     one LOG_ERR line, 35, when the platform answers with failure.
/// Blocks:  while the platform looks at the path's file system.
std::string getShareName(const std::string &path);

/// Whether a component of the path is exactly "@eaDir", the folder in which the platform keeps a
/// directory's extended attributes. The file system is not asked.
///     isInKovaEaDir("/v/@eaDir") == true            isInKovaEaDir("/v/x@eaDir") == false
///     isInKovaEaDir("@eaDir/x") == true             isInKovaEaDir("/v/@eaDirs") == false
///     isInKovaEaDir("/v/x@eaDir/@eaDir") == true    isInKovaEaDir("/v/@eadir") == false
bool isInKovaEaDir(const std::string &path);

} // namespace Path
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
