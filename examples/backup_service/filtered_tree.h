#ifndef BACKUP_SERVICE_FILTERED_TREE_H
#define BACKUP_SERVICE_FILTERED_TREE_H

/// @file Walks a directory tree and applies the filter of a task.
///
///     FilteredTree tree("/home", filter);
///     for (TreeEntry entry; tree.next(entry);) {
///       if (entry.kept) std::cout << entry.path << '\n';
///     }

#include <cstdint>
#include <kovabackup/path_filter.h>
#include <string>
#include <vector>

struct TreeEntry {
  std::string path;
  std::uint64_t bytes = 0; ///< the size of a regular file, 0 for anything else
  bool kept = false;       ///< whether the entry is to be backed up
  int error = 0;           ///< errno if the entry or its contents cannot be read, else 0
};

/// Visits a source and everything below it. A directory comes before its contents, and the contents
/// come in byte order. An excluded directory is entered only if an include pattern can match inside
/// it. Symbolic links are not followed. Sockets are never kept, since they hold no data.
class FilteredTree {
public:
  /// skipped is a path that the walk omits regardless of the filter.
  FilteredTree(const std::string &source, KOVA::Backup::PathFilter &filter,
               const std::string &skipped = "");

  /// Visits the next entry, which may be one that the filter excludes.
  /// Returns: false when the walk has finished.
  bool next(TreeEntry &entry);

private:
  bool mayKeepBelow(const std::string &directory);
  int enter(const std::string &directory);

  KOVA::Backup::PathFilter &filter_;
  std::string skipped_;
  std::vector<std::string> pending_; ///< paths still to visit; the next one is the last
};

#endif
