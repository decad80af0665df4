#ifndef BACKUP_SERVICE_FILTERED_TREE_H
#define BACKUP_SERVICE_FILTERED_TREE_H

/// @file One walk over a tree, through the filter of a task.
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
  std::uint64_t bytes = 0; ///< of a regular file
  bool kept = false;       ///< whether the filter keeps it
  int error = 0;           ///< errno, when it or what lies in it cannot be read
};

/// Everything below a source and the source itself, a directory before its contents and those in
/// byte order. A directory that the filter leaves out is entered only when an include pattern can
/// still match below it. Links are entries, never followed; sockets hold nothing to keep.
class FilteredTree {
public:
  /// skipped is a directory that the walk does not enter, whatever the filter says.
  FilteredTree(const std::string &source, KOVA::Backup::PathFilter &filter,
               const std::string &skipped = "");

  /// Takes the next step of the walk; the entry may be one that the filter leaves out.
  /// Returns: false when everything was seen.
  bool next(TreeEntry &entry);

private:
  bool mayKeepBelow(const std::string &directory);
  int enter(const std::string &directory);

  KOVA::Backup::PathFilter &filter_;
  std::string skipped_;
  std::vector<std::string> pending_; ///< what was not looked at yet, the next one last
};

#endif
