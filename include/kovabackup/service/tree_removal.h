#ifndef KOVABACKUP_SERVICE_TREE_REMOVAL_H
#define KOVABACKUP_SERVICE_TREE_REMOVAL_H

/// @file The removal of a directory tree that others may change at the same time.
///
///     const bool gone = TreeRemoval::remove("/volume1/@tmp/seln.x7Gk2a", [](const Error &error) {
///       std::fprintf(stderr, "%s %s: %s\n", error.step.c_str(), error.path.c_str(),
///                    std::strerror(error.code));
///     });
///
/// The result says whether anything is left, the reports say what and why. A failure never ends the
/// removal: everything else is still removed.
///
/// Only the path of the root is resolved as usual, with links on the way to its last name followed.
/// Below the root the removal goes down by single names and by paths that the kernel keeps beneath
/// an open folder, on its mount and free of links (openat2 with RESOLVE_BENEATH, RESOLVE_NO_XDEV
/// and RESOLVE_NO_SYMLINKS), and it never opens "..". So whatever others rename, replace or mount
/// meanwhile, it opens no folder outside the tree or on another mount, not even one of the same
/// file system that is bound into the tree. Links are removed and never followed. A mount point
/// inside is reported and stays, with all that is mounted there, and everything around it is
/// removed. When the root itself is a mount point, its contents are removed and it is reported with
/// EBUSY. Subvolumes of btrfs that are not mounted belong to the mount, and are removed.
///
/// Where a sandbox refuses openat2, each name is opened by openat with O_NOFOLLOW, and the id of
/// its mount is compared with that of the folder above, which keeps the same promise with more
/// calls. Where statx gives no ids of mounts either, no folder is entered, and ENOSYS is reported.
///
/// What others do meanwhile:
///
///     they remove something first      not a failure
///     they add something               it is removed as well. A folder that is not empty after
///                                      everything in it was removed is read again, up to 32 times,
///                                      and then reported with ENOTEMPTY
///     they move something within the   removed when a folder of the tree that leads to it is still
///       tree                           to be read or is read again
///     they move something out of the   no longer part of the tree, and not counted as left. When
///       tree                           the removal is in that folder at the moment, it removes
///                                      what it finds there until it gets back to a folder
///                                      above
///     they replace a folder            the new folder or link is removed
///     they move the root               its contents are removed; the folder itself stays where it
///                                      was moved to
///
/// Refused with EINVAL, with nothing removed: "", a path with a NUL byte, a path whose last name is
/// "." or "..", "/" however written, and a folder that is the same as "/" by device and inode, such
/// as another mount of it. Slashes at the end require a folder: "link/" and "file/" are refused
/// with ENOTDIR. A link without a slash is removed itself, and its target stays.
///
/// The removal needs no privilege. In a folder that cannot be opened (EACCES) nothing can be
/// removed, but an empty one is removed all the same. Immutable files are reported with EPERM.
///
/// Owns:    up to ten descriptors at any depth, close-on-exec, until remove returns.
/// Failure: by result and report. Only std::bad_alloc is thrown, and what report throws; the
///          removal then ends, and the rest of the tree stays.
/// errno:   not meaningful.
/// Threads: any number of removals at once, of the same tree too; report is called in the thread of
///          remove.
/// Process: no process-wide state.
/// Blocks:  for as long as the file systems need. There is no limit of time.
/// Cost:    one system call for an entry, and five or six more for a folder. Memory for the names
///          of the folders that are still due on the current path, and about 60 bytes and the name
///          for each folder that the path leads through; none for files.

#include "kovabackup/nodiscard.h"
#include "kovabackup/service/error.h"

#include <functional>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

class TreeRemoval {
public:
  using Report = std::function<void(const Error &)>;

  /// Removes path, which may be of any type, and everything below it. failed is called for each
  /// failure, with the path as the caller wrote it, without slashes at the end, then the names
  /// below it. The path may be longer than PATH_MAX. The steps are:
  ///
  ///     unlinkat    the entry could not be removed
  ///     openat2     the folder could not be opened, so what is in it stays: EXDEV for a mount
  ///                 point. openat and statx where openat2 is refused
  ///     getdents64  the folder's names could not be read to the end; those read are removed
  ///     openat      the path is refused (EINVAL), or the folder that holds it could not be opened;
  ///                 the error then names that folder
  ///     statx       the root could not be compared with "/"; nothing is removed
  ///
  /// A folder that stays because of something in it that was reported is not reported itself.
  /// When others moved folders of the tree meanwhile, a failure may be reported twice.
  /// Returns: true when nothing is left at path, and also when nothing was there. Failures may have
  ///          been reported even so, when others removed those entries afterwards. On false, at
  ///          least one failure was reported.
  KOVA_NODISCARD static bool remove(const std::string &path, const Report &failed = {});

  TreeRemoval() = delete;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
