#ifndef KOVAPLATFORM_CORE_TEMP_FILE_H
#define KOVAPLATFORM_CORE_TEMP_FILE_H

/// @file The temporary file that becomes a file's new content.
///
///     state      its name                   a writer killed now leaves
///     made       none (or a slot's)         nothing (or a leftover)
///     linked     a slot's                   a leftover
///     renamed    the file's                 the new content
///
/// Where the file system has unnamed files, it has no name until it is complete. Names are those of
/// a few slots in the directory, ".kovacore.0.tmp" and so on, so that leftovers are found without
/// reading the directory. The maker holds a flock on the file as long as it lives: a name whose
/// lock is free is a leftover.
///
/// Failure:  false, with errno as the failing call set it; nothing is recorded.
/// Process:  a child forked meanwhile, by another thread, keeps the lock until it runs a program
///           or ends; until then a leftover is not cleared.

#include "base/unique_fd.h"

#include <string>

namespace KovaPlatform {

class TempFile {
public:
  enum class Kind { Unnamed, Named };

  explicit TempFile(int dir) : dir_(dir) {}
  ~TempFile();
  TempFile(const TempFile &) = delete;
  TempFile &operator=(const TempFile &) = delete;

  /// Makes the file, empty, with mode 0600 and locked.
  bool make(Kind kind);

  /// Gives the file a slot's name; true at once when it has one.
  bool link();

  /// Gives the file its final name, in place of what has that name. It has a slot's name before.
  bool rename(const std::string &name);

  /// Gives the file its final name unless something has it already (then EEXIST).
  bool linkFinal(const std::string &name);

  int fd() const { return fd_.get(); }

private:
  bool makeNamed();
  bool lockNamed();
  bool linkAs(const char *name);

  int dir_;
  KOVA::Base::UniqueFd fd_;
  std::string name_; // empty while it has none, and once it has its final one
};

/// Removes what killed writers left in a directory. What cannot be removed stays.
void clearLeftovers(int dir);

} // namespace KovaPlatform

#endif
