#ifndef KOVABACKUP_SERVICE_TREE_WALK_NAMES_H
#define KOVABACKUP_SERVICE_TREE_WALK_NAMES_H

/// @file The names that a walk has still to visit: of one folder the first in byte order on top.

#include "service/folder_records.h"
#include "service/name_stack.h"

namespace KOVA::Backup::Service {

class DueNames : public NameStack {
public:
  /// Adds the names in an open folder.
  /// Returns: 0, or the errno of getdents64; names that were read before the failure are added.
  int add(int folder);

private:
  FolderRecords records_;
};

} // namespace KOVA::Backup::Service

#endif
