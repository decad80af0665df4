#ifndef BACKUP_SERVICE_FILTERED_TREE_H
#define BACKUP_SERVICE_FILTERED_TREE_H

/// @file One walk over the sources of a task, through its filter.

#include <cstdint>
#include <functional>
#include <kovabackup/path_filter.h>
#include <string>

struct TreeTotals {
  std::uint64_t files = 0;
  std::uint64_t bytes = 0; ///< of regular files
  std::uint64_t unreadable = 0;
};

/// Calls visit for everything below source (and source itself) that the filter keeps, a directory
/// before its contents. A directory that is left out is entered only when an include pattern can
/// still match below it. Links are entries, never followed. visit returns false to end the walk.
/// Returns: false when visit ended it.
bool walkFiltered(const std::string &source, KOVA::Backup::PathFilter &filter,
                  const std::function<bool(const std::string &path)> &visit, TreeTotals &totals);

#endif
