#ifndef KOVA_BASE_TEMP_FILE_H
#define KOVA_BASE_TEMP_FILE_H

/// @file The temporary file that becomes a file's new content.
///
///     state      its name                   a writer killed now leaves
///     made       none (or a slot's)         nothing (or a leftover)
///     linked     a slot's                   a leftover
///     renamed    the file's                 the new content
///
/// Where the file system supports unnamed files, the file has no name until it is complete. The
/// names are those of a few slots in the directory: the prefix, 0 to 15 and ".tmp". So leftovers
/// are found without reading the directory. The writer holds a flock on the file for as long as the
/// TempFile exists: a slot's file that no process has locked is a leftover.
///
/// Failure:  false, with errno as the failing call set it; nothing is recorded.
/// Process:  a child that another thread forks in the meantime keeps the lock until it executes a
///           program or exits; until then a leftover is not cleared.

#include "base/unique_fd.h"

#include <string>
#include <utility>

namespace KOVA::Base {

class TempFile {
public:
  enum class Kind { Unnamed, Named };

  /// dir must stay open for as long as this object exists.
  TempFile(int dir, std::string prefix) : dir_(dir), prefix_(std::move(prefix)) {}
  ~TempFile();
  TempFile(const TempFile &) = delete;
  TempFile &operator=(const TempFile &) = delete;

  /// Creates the file, empty, with mode 0600 and locked.
  bool make(Kind kind);

  /// Gives the file a slot's name; succeeds at once when it already has one.
  bool link();

  /// Gives the file its final name and replaces whatever has that name. Call link first.
  bool rename(const std::string &name);

  /// Gives the file its final name, or fails with EEXIST when something already has that name.
  bool linkFinal(const std::string &name);

  int fd() const { return fd_.get(); }

private:
  bool makeNamed();
  bool lockNamed();
  bool linkAs(const char *name);

  int dir_;
  std::string prefix_;
  UniqueFd fd_;
  std::string name_; // of the slot; empty before the file has one, and after rename
};

/// Removes what killed writers left in a directory under the names of a prefix. What cannot be
/// removed stays. Keeps errno.
void clearLeftovers(int dir, const std::string &prefix);

} // namespace KOVA::Base

#endif
