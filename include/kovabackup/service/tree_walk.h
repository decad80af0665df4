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
/// Order: next returns the root first. The entries of a folder follow in byte order of their names,
/// and the contents of a folder follow directly after it. Two walks through an unchanged tree
/// return the same list.
///
/// Entries that the filter leaves out are returned too, with kept = false, because the folders that
/// lead to a kept entry are often left out themselves. The contents of a folder are returned only
/// when the walk enters it. A folder is entered unless one of these conditions holds:
///
///     it is left out, and no include pattern can match anything below it;
///     it is kept, but an exclude pattern that ends in "**" matches everything below it, and no
///       include pattern can match anything below it;
///     skipFolder was called, or an option keeps the walk out.
///
/// By default an excluded folder thus takes its contents with it, which is what users expect when
/// they exclude "/volume1/cache". Once a folder is entered, kept depends on each path alone, so
/// exclude "/volume1/cache/**" as well when an include pattern reaches into the folder. With
/// WalkOptions::leftOutCloses = false the first condition does not exist, and the second applies to
/// folders that are left out as well. The kept entries are then exactly the paths of the tree for
/// which PathFilter::filterOut returns false.
///
/// The constructor copies the patterns: PathFilter lists them all when it is queried with an empty
/// base. It derives two more filters from them. One holds the prefixes of include patterns that end
/// where the pattern can continue below a folder, the other the exclude patterns that end in "**".
/// Each condition is then one indexed query per folder. The walk neither compares every pattern
/// with every folder nor carries patterns along, and its answers are exact. What getIncludePattern
/// and getExcludePattern return for a folder is not exact enough for this: a pattern with "\/" is
/// missing there, and a single "*" may consume a "/", so that an exclude pattern can appear to
/// match everything below a folder that it does not match.
///
/// The walk uses descriptors and never resolves a path below its root. A folder that is replaced by
/// a symbolic link leads nowhere. Each folder that is opened must have the device and inode that it
/// had when it was returned. The walk holds at most seven descriptors at any depth: it closes the
/// upper folders on the way down, opens ".." on the way up, and compares device and inode there
/// too. When a folder has been moved away in the meantime, the walk descends again from the root to
/// the place where it continues.
///
/// Owns:    up to seven descriptors, close-on-exec, until the walk has ended or is destroyed.
/// Failure: by entry, see WalkEntry::error; a failure never ends the walk. std::bad_alloc is
///          thrown when memory runs out. The walk may then only be destroyed.
/// errno:   not meaningful.
/// Threads: one thread per object; objects are independent.
/// Process: no process-wide state.
/// Cost:    one system call for an entry, five or six more for a folder. Memory for the names that
///          are still due in the folders on the current path, and about twice that of a PathFilter
///          with the same patterns.

#include "kovabackup/path_filter.h"
#include "kovabackup/service/error.h"

#include <cstdint>
#include <ctime>
#include <memory>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup::Service {
class TreeWalkPrivate; // declared before the pragma, so that it is not exported
}

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

struct WalkOptions {
  /// Folders on another device than the root are returned but not entered.
  bool oneFileSystem = false;

  /// Folders with a regular file CACHEDIR.TAG that begins with the line
  /// "Signature: 8a477f597d28d172789f06886806bc55" are returned but not entered.
  bool skipCaches = false;

  /// Whether a folder that is left out takes its contents with it; see the rules above.
  bool leftOutCloses = true;

  /// Entries that are not returned, nor is anything below them, such as the service's own scratch
  /// folder. These are paths in the form in which the walk returns them, compared byte by byte;
  /// slashes at the end are ignored.
  std::vector<std::string> leaveOut;
};

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
  /// The last two are detected after the folder was returned, so the folder is returned a second
  /// time, with path, kept, device, inode and the type in mode; the other fields are 0. The step of
  /// such an entry is statx when the folder was opened but could not be examined. The code ESTALE
  /// means that another folder was found in the place of the expected one: the expected one was
  /// replaced or moved during the walk. An entry that vanished during the walk is not an error and
  /// is not returned. For the root, ENOENT is an error, and so is a path that is not absolute
  /// (EINVAL).
  Error error;
};

/// One walk. Nothing is opened before the first call of next.
class TreeWalk {
public:
  /// Prepares a walk through absoluteRoot, which may be of any type. A symbolic link as the last
  /// component is not followed; it is then the only entry.
  /// filter is read here only; it may be changed or destroyed afterwards.
  TreeWalk(const std::string &absoluteRoot, PathFilter &filter, const WalkOptions &options = {});
  ~TreeWalk();
  TreeWalk(const TreeWalk &) = delete;
  TreeWalk &operator=(const TreeWalk &) = delete;

  /// Moves to the next entry.
  /// Returns: true with entry set; false at the end, with entry untouched.
  bool next(WalkEntry &entry);

  /// Keeps the walk out of the folder that next just returned. Has no effect on other entries.
  void skipFolder();

  /// Reads the target of the symbolic link that next just returned.
  /// Returns: true with target set. On false target is untouched and error is set.
  /// Errors:  readlinkat(2)'s; EINVAL when the entry is not a symbolic link.
  bool linkTarget(std::string &target, Error &error);

  /// Finds the pattern that decided about the entry that next just returned: for a kept entry the
  /// first include pattern that matches it, for one that is left out the first exclude pattern.
  /// Returns: true with pattern set; false, with pattern untouched, when no pattern matches or the
  ///          folder was returned for the second time.
  /// Cost:    the first call builds a second index of the patterns. With 10,000 patterns a call
  ///          takes some tens of microseconds.
  bool decidedBy(std::string &pattern);

private:
  std::unique_ptr<TreeWalkPrivate> private_;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
