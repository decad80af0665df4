#ifndef KOVABACKUP_SERVICE_TREE_WALK_NAMES_H
#define KOVABACKUP_SERVICE_TREE_WALK_NAMES_H

/// @file The names that a walk has still to visit: those of the deepest folder on top, and of one
/// folder the first in byte order on top.
///
/// A name that was taken releases its memory, so a walk holds what is due and nothing else.

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace KOVA::Backup::Service {

class DueNames {
public:
  DueNames();

  std::size_t size() const noexcept { return starts_.size(); }
  bool empty() const noexcept { return starts_.empty(); }

  /// Adds the names in an open folder, without "." and "..".
  /// Returns: 0, or the errno of getdents64; names that were read before the failure are added.
  int add(int folder);

  /// Appends the name on top to text and removes it.
  void take(std::string &text);

  /// Removes names from the top until size are left.
  void shrinkTo(std::size_t size) noexcept;

private:
  void release() noexcept;

  std::unique_ptr<char[]> buffer_; // for getdents64
  std::string names_;              // one after the other
  std::vector<std::size_t> starts_;
};

} // namespace KOVA::Backup::Service

#endif
