#ifndef KOVABACKUP_SERVICE_PUBLISHED_FILE_H
#define KOVABACKUP_SERVICE_PUBLISHED_FILE_H

/// @file A file that appears complete or not at all.
///
///     PublishedFile file("/volume1/backup/index.json");
///     Error error;
///     if (!file.create(error, text.size())) return false;
///     if (!writeAll(file.fd(), text)) return false; // the target is as it was, nothing is left
///     if (!file.publish(error)) return false;
///
/// The content is written to a file in the target's folder that has no name (O_TMPFILE). publish
/// syncs it and only then gives it the target's name, replacing what has that name. Readers find
/// the previous content or the complete new one, even after a power cut. A process that is killed
/// before publish leaves nothing.
///
/// File systems without unnamed files get a hidden file beside the target, with mode 0600, named
/// after it: ".NAME.kova.0.tmp" to ".NAME.kova.15.tmp", a long NAME being shortened. The unnamed
/// file has such a name for an instant too when it replaces another one, since no system call
/// replaces a name by an unnamed file. What a killed process leaves under such a name is removed by
/// the next create for the same target. Sixteen processes can work on one target at a time.
///
/// The folder is opened by create and the target is found in it from then on, even if the folder is
/// moved or another one gets its path. If the target is a symbolic link, the link itself is
/// replaced.
///
/// The new file belongs to the process (user, group, access list); nothing is taken from a file
/// that it replaces.
///
/// Owns:    two descriptors, close-on-exec, from create until publish or destruction, and an
///          flock(2) on the new file. A child that was given fd() must have closed it before
///          publish: whatever it writes later ends up in the published file.
/// Failure: by result and Error; only std::bad_alloc is thrown.
/// errno:   not meaningful.
/// Log:     nothing.
/// Threads: one thread per object; objects are independent.
/// Process: no process-wide state. A forked child that runs the destructor does no harm to an
///          unnamed file, but removes a named one.

#include "kovabackup/nodiscard.h"
#include "kovabackup/service/error.h"

#include <cstdint>
#include <memory>
#include <string>
#include <sys/types.h>

namespace KOVA::Backup::Service {
class PublishedFilePrivate; // declared before the pragma, so that it is not exported
}

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

class PublishedFile {
public:
  /// Prepares a file for that path; nothing is opened yet. A relative path is relative to the
  /// working directory at the time of create.
  /// Units: mode is a set of permission bits, which the published file gets regardless of the
  ///        umask. Until then no other user can open it.
  explicit PublishedFile(const std::string &target, mode_t mode = 0640);
  /// Without publish, removes the file.
  ~PublishedFile();
  PublishedFile(const PublishedFile &) = delete;
  PublishedFile &operator=(const PublishedFile &) = delete;

  /// Creates the file, empty.
  ///
  /// room is the number of bytes that will be written. If the file system has fewer free bytes for
  /// ordinary users, the call fails at once. This is a look and not a reservation: other writers
  /// may take the room, quotas are not looked at, and a file that is replaced keeps its room until
  /// publish. A file system that does not report its size is taken to have room.
  ///
  /// Returns: true when fd is open. On false error is set, nothing is left, and create may be
  ///          called again; on true error is untouched.
  /// Errors:  EINVAL: the target is empty, ends with "/" or contains a NUL byte; or create or
  ///          publish has succeeded before.
  ///          EISDIR: the target is a folder.
  ///          ENOSPC of fstatvfs: there is no room.
  ///          EBUSY: sixteen other processes work on the target.
  ///          Else the errno of open of the folder (which needs read permission), fstatat,
  ///          fstatvfs or openat.
  KOVA_NODISCARD bool create(Error &error, std::uint64_t room = 0);

  /// The file, open for reading and writing; -1 before create and after publish.
  int fd() const noexcept;

  /// Syncs the file, gives it its mode and the target's name, and syncs the folder. Whatever is
  /// returned, fd is closed and the object has done its work.
  /// Returns: true when the file is in place and will survive a power cut. On false error is set;
  ///          on true error is untouched.
  /// Errors:  fsync with the path of the folder: the file is in place, but may be lost in a power
  ///          cut. Any other step: the target is as it was and the file is gone. These are EINVAL
  ///          without a created file, and the errno of fchmod, fsync, linkat or renameat; ENOENT
  ///          when the folder was removed meanwhile.
  /// Blocks:  until everything is on the disk.
  KOVA_NODISCARD bool publish(Error &error);

private:
  std::unique_ptr<PublishedFilePrivate> private_;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
