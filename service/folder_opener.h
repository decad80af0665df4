#ifndef KOVABACKUP_SERVICE_FOLDER_OPENER_H
#define KOVABACKUP_SERVICE_FOLDER_OPENER_H

/// @file Opens folders below an open folder: never through a link, and never on another mount.
///
/// openat2 does this in one call. Where a sandbox refuses it, each name of the path is opened by
/// openat, which cannot leave the folder with a single name that is neither "..", nor a link, and
/// the mounts of both folders are compared. The upper one is open meanwhile, so the id of its mount
/// cannot be given to another mount.

#include "base/unique_fd.h"

#include "service/folder_id.h"

#include <string>

namespace KOVA::Backup::Service {

class FolderOpener {
public:
  enum class Mount { Same, Any };

  /// Opens the folder at path, names without ".." and with one "/" between two of them. With
  /// Mount::Any, path is a single name.
  /// access: O_RDONLY or O_PATH.
  /// Returns: no failure with opened set. ENOTDIR or ELOOP when the path leads to something else
  ///          than a folder, EXDEV to another mount.
  Failed open(int folder, const std::string &path, int access, Mount mount, Base::UniqueFd &opened);

private:
  bool stepwise_ = false; // openat2 was refused, and openat was not
};

} // namespace KOVA::Backup::Service

#endif
