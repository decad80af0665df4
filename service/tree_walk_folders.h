#ifndef KOVABACKUP_SERVICE_TREE_WALK_FOLDERS_H
#define KOVABACKUP_SERVICE_TREE_WALK_FOLDERS_H

/// @file The folders between the root of a walk and the place where it is.
///
/// Only the deepest few have an open descriptor. The one above them is reached by "..", and counts
/// only when it has the device and inode that it had on the way down. Where that fails, each folder
/// from the root down is opened by name again and compared likewise.

#include "base/unique_fd.h"

#include "service/folder_id.h"

#include <cstddef>
#include <string>
#include <vector>

namespace KOVA::Backup::Service {

/// Opens a folder without following a link, and checks that it is the expected one.
/// access: O_RDONLY or O_PATH.
/// Returns: no failure with folder set; ESTALE for another folder. Otherwise folder is untouched.
Failed openFolder(int parent, const char *name, int access, const FolderId &expected,
                  Base::UniqueFd &folder);

class OpenFolders {
public:
  struct Folder {
    Base::UniqueFd fd; // of the deepest few only
    FolderId id;
    std::size_t prefix = 0;   // how much of the path of an entry leads to this folder, without "/"
    std::size_t dueAbove = 0; // names that are due in the folders above
    bool kept = false;
  };

  bool empty() const noexcept { return folders_.empty(); }

  /// The folder where the walk is. Its descriptor is open.
  const Folder &deepest() const noexcept { return folders_.back(); }

  void enter(Folder folder);

  /// Removes the deepest folder. With stay, its parent is opened when it is not open.
  /// Returns: why ".." failed; the parent is then not open.
  Failed leave(bool stay);

  /// Opens the deepest folder by descending from the root of the walk along the names in path.
  /// Returns: the number of folders that could be opened; all of them unless failed is set. The
  ///          others remain until cutTo is called.
  std::size_t descend(int root, const std::string &path, Failed &failed);

  /// Removes the folders below the first count.
  void cutTo(std::size_t count) { folders_.resize(count); }

  const Folder &at(std::size_t depth) const noexcept { return folders_[depth]; }
  std::size_t size() const noexcept { return folders_.size(); }

private:
  std::vector<Folder> folders_;
};

} // namespace KOVA::Backup::Service

#endif
