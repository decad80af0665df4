#ifndef KOVABACKUP_SERVICE_TREE_WALK_H
#define KOVABACKUP_SERVICE_TREE_WALK_H

/// @file A walk through a directory tree with a path filter, one entry at a time.
///
///     PathFilter filter;
///     filter.addExcludePattern("/volume1/photo/**.tmp");
///     TreeWalk walk("/volume1/photo", filter);
///     WalkEntry entry;
///     while (walk.next(entry)) {
///       if (entry.error.code != 0) { report(entry.error); continue; }
///       if (entry.kept) backUp(entry);
///     }
///
/// Order: the root comes first. The entries of a folder come in byte order of their names, and the
/// contents of a folder directly after it. Two walks through an unchanged tree give the same list.
///
/// Entries that the filter leaves out are given too, with kept = false.
///
/// The walk works by descriptors, never by path. A folder that is swapped for a symbolic link leads
/// nowhere. Each folder that is opened must have the device and inode with which it was given. At
/// any depth the walk holds at most six descriptors. It therefore closes the upper folders on the
/// way down and opens ".." on the way up, checked by device and inode. When a folder has been
/// moved away meanwhile, the walk descends again from the root to where it left off.
///
/// Owns:    up to six descriptors, close-on-exec, until the walk has ended or is destroyed.
/// Failure: by entry, see WalkEntry::error; a failure never ends the walk. std::bad_alloc is
///          thrown when memory runs out. The walk may then only be destroyed.
/// errno:   not meaningful.
/// Threads: one thread per object; objects are independent.
/// Process: no process-wide state.
/// Cost:    one system call for an entry, five or six more for a folder. Memory for the names that
///          are still due in the folders on the current path, and for
///          a copy of the patterns.

#include "kovabackup/path_filter.h"
#include "kovabackup/service/error.h"

#include <cstdint>
#include <ctime>
#include <memory>
#include <string>
#include <sys/types.h>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

struct WalkEntry {
  /// The root as the caller wrote it, without slashes at the end, then "/" and the names below it.
  std::string path;
  mode_t mode = 0; ///< type and permissions, as st_mode
  uid_t uid = 0;
  gid_t gid = 0;
  dev_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t links = 0;
  std::uint64_t size = 0; ///< in bytes
  timespec modified = {}; ///< st_mtim
  timespec changed = {};  ///< st_ctim

  /// Whether the filter keeps this path: !filterOut(path).
  bool kept = false;

  /// code is 0 unless something failed on this entry:
  ///
  ///     statx       the entry could not be examined; only path and kept are set
  ///     openat      the folder could not be entered, or could not be left towards its parent
  ///     getdents64  the folder's names could not be read to the end; those read are walked
  ///
  /// The last two are found after the folder was given, so the folder is given a second time, with
  /// path, kept, device, inode and the type in mode; the other fields are 0. The code ESTALE means
  /// that another folder was found in the place of the expected one: it was replaced or moved
  /// during the walk. An entry that vanished during the walk is not an error and is not given.
  /// For the root, ENOENT is an error, and so is a path that is not absolute (EINVAL).
  Error error;
};

class TreeWalkPrivate;

/// One walk. Nothing is opened before the first call of next.
class TreeWalk {
public:
  /// Prepares a walk through absoluteRoot, which may be of any type. A symbolic link as the last
  /// component is not followed; it is then the only entry.
  /// filter is read here only; it may be changed or destroyed afterwards.
  TreeWalk(const std::string &absoluteRoot, PathFilter &filter);
  ~TreeWalk();
  TreeWalk(const TreeWalk &) = delete;
  TreeWalk &operator=(const TreeWalk &) = delete;

  /// Gives the next entry.
  /// Returns: false at the end; entry is then untouched.
  bool next(WalkEntry &entry);

  /// Keeps the walk out of the folder that was just given. Without effect for other entries.
  void skipFolder();

  /// Reads the target of the symbolic link that was just given.
  /// Returns: true with target set. On false target is untouched and error is set.
  /// Errors:  readlinkat(2)'s; EINVAL when the entry is not a symbolic link.
  bool linkTarget(std::string &target, Error &error);

private:
  std::unique_ptr<TreeWalkPrivate> private_;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
