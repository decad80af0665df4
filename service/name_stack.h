#ifndef KOVABACKUP_SERVICE_NAME_STACK_H
#define KOVABACKUP_SERVICE_NAME_STACK_H

/// @file The names that are still due on the way through a tree: those of the deepest folder on
/// top.
///
/// A name that was taken releases its memory, so the stack holds what is due and nothing else.

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace KOVA::Backup::Service {

class NameStack {
public:
  std::size_t size() const noexcept { return starts_.size(); }
  bool empty() const noexcept { return starts_.empty(); }

  void push(std::string_view name);

  /// Appends the name on top to text and removes it.
  void take(std::string &text);

  /// Removes names from the top until size are left.
  void shrinkTo(std::size_t size) noexcept;

private:
  void release() noexcept;

  std::string names_; // one after the other
  std::vector<std::size_t> starts_;
};

} // namespace KOVA::Backup::Service

#endif
