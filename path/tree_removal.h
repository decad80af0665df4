#ifndef KOVABACKUP_PATH_TREE_REMOVAL_H
#define KOVABACKUP_PATH_TREE_REMOVAL_H

/// @file The walk by which trees are removed, and the removal of one entry of it. removeAll reports
/// the first failure, an owner of a temporary folder ignores them all; the rest is the same here.
///
///     int dropEntry(const char *path, const struct stat *, int type, struct FTW *) {
///       (void)TreeRemoval::removeEntry(path, type);
///       return 0;                                       // go on
///     }
///     TreeRemoval::walk(dir, dropEntry);
///
/// Threads: any; what the callback keeps is the callback's.

#include <ftw.h>
#include <string>

namespace KOVA::Backup::TreeRemoval {

/// What nftw(3) calls for each entry; any result but 0 ends the walk.
using Callback = int (*)(const char *path, const struct stat *info, int type, struct FTW *position);

/// Calls callback for path and everything below it, each directory after its contents. Links are
/// not followed, other file systems not entered, and at most 20 directories are open at a time.
/// The outcome is deliberately not reported: a path that is not there is removed already.
void walk(const std::string &path, Callback callback);

/// Whether an entry of this type goes by rmdir(2): a directory, read or not. All else goes by
/// unlink(2), also what cannot be looked at.
bool isDirectory(int type);

/// Removes one entry. Returns what rmdir(2) or unlink(2) returned, with its errno.
int removeEntry(const char *path, int type);

} // namespace KOVA::Backup::TreeRemoval

#endif
