#ifndef KOVABACKUP_SERVICE_TREE_REMOVAL_PATH_H
#define KOVABACKUP_SERVICE_TREE_REMOVAL_PATH_H

/// @file The folders between the root of a removal and the place where it is.
///
/// A walk that reads compares device and inode to be sure of the folder above (see
/// tree_walk_folders.h). A removal must not rely on them: the number of a removed folder is given
/// to the next one that is made, which may be outside. So a folder whose descriptor was closed is
/// opened again by its path from the deepest one above it that is still open, and the kernel keeps
/// that path beneath. What is found there is in the tree, and is to be removed, whatever it is.
///
/// At most eight descriptors are kept. They are dense near the deepest folder and get sparser
/// towards the root: which one is closed depends on how much longer the way back gets without it.
/// The way up from 100,000 levels costs one or two calls for each folder, with a path of fifteen
/// names on average.

#include "base/unique_fd.h"

#include "service/folder_id.h"
#include "service/folder_opener.h"

#include <cstddef>
#include <string>
#include <vector>

namespace KOVA::Backup::Service {

class RemovalPath {
public:
  struct Level {
    std::size_t prefix = 0;   // how much of the path of an entry leads to this folder, without "/"
    std::size_t dueAbove = 0; // names that are due in the folders above
    int reads = 1;            // how often the folder was read, this time included
    bool failed = false;      // something in it could not be removed and was reported
    bool lost = false;        // the way back to a folder in it failed
  };

  bool empty() const noexcept { return levels_.empty(); }

  /// The folder where the removal is, and its open descriptor.
  Level &deepest() noexcept { return levels_.back(); }
  int fd() const noexcept { return held_.back().fd.get(); }

  void enter(Base::UniqueFd fd, const Level &level);

  /// Removes the deepest folder, and opens its parent, if it has one and that is not open, along
  /// the names in path.
  /// Returns: false when that failed. The parent is then deepest, without a descriptor, until cut
  ///          is called.
  bool leave(FolderOpener &opener, const std::string &path);

  /// Removes the folders below the deepest one that is open.
  /// Returns: the names that are due in the others.
  std::size_t cut();

private:
  struct Held {
    std::size_t level;
    Base::UniqueFd fd;
  };

  void hold(std::size_t level, Base::UniqueFd fd);
  std::size_t nextToOpen() const noexcept;

  std::vector<Level> levels_;
  std::vector<Held> held_; // the root's first, the deepest last
};

} // namespace KOVA::Backup::Service

#endif
