#ifndef KOVABACKUP_PATH_TREE_REMOVAL_H
#define KOVABACKUP_PATH_TREE_REMOVAL_H

/// @file The walk that removes a tree, and the removal of one entry. The callers differ only in
/// what they do about failures: removeAll reports the first, the owner of a temporary folder
/// ignores all.
///
///     int dropEntry(const char *path, const struct stat *, int type, struct FTW *) {
///       (void)TreeRemoval::removeEntry(path, type);
///       return 0;                                       // continue the walk
///     }
///     (void)TreeRemoval::walk(dir, dropEntry);
///
/// Threads: any, as far as the callback allows it: it gets no context and keeps its own state.

#include <ftw.h>
#include <string>

namespace KOVA::Backup::TreeRemoval {

/// What nftw(3) calls for each entry. Any result except 0 ends the walk.
using Callback = int (*)(const char *path, const struct stat *info, int type, struct FTW *position);

/// Calls callback for path and everything below it, and for each directory after its contents.
/// Links are not followed, other file systems are not entered, and at most 20 directories are open
/// at a time.
/// Returns: true when everything was visited. On false, errno says why the walk has ended early:
///          memory or descriptors ran out, or the path does not exist.
bool walk(const std::string &path, Callback callback);

/// Whether an entry of this type is removed by rmdir(2): a directory, readable or not. Everything
/// else is removed by unlink(2), an entry that cannot be examined included.
bool isDirectory(int type);

/// Removes one entry. Returns what rmdir(2) or unlink(2) returned, with its errno.
int removeEntry(const char *path, int type);

} // namespace KOVA::Backup::TreeRemoval

#endif
