#ifndef KOVABACKUP_TEMP_MANAGER_H
#define KOVABACKUP_TEMP_MANAGER_H

/// @file Temporary files and folders that remove themselves unless the caller keeps them.
///
///     ScopedTempFile file(dir + "/report", false);         // dir/report.XXXXXX, mode 0600
///     if (!file.isValid()) return false;
///     ...write to file.getFileDescripter()...
///     return file.rename(dir + "/report");
///
///     ScopedVolumeTempFolder work(TempManager::maxExtVolume(true), "index");
///     if (!work.isValid()) return false;                   // <volume's directory>/index.XXXXXX
///     ...fill work.getPath(), mode 0700...
///     const std::string kept = work.preserve();            // otherwise all is removed
///
/// The name is a template for mkstemp(3) or mkdtemp(3). A name that ends in "XXXXXX" is used
/// unchanged, ".XXXXXX" is appended to any other name, and an empty name selects a default. "/d/"
/// becomes "/d/.XXXXXX". A name without a slash refers to the working directory.
///
/// An object owns what it created until unlink, rename, preserve, another create or its
/// destruction. It keeps a hash of the path as a safeguard. If path and hash ever disagree, the
/// object counts as owning nothing: it neither removes, moves nor returns anything. isValid reports
/// whether the object owns something, and is also the only way to learn that a constructor failed.
///
/// To replace a file on a data volume, create the temporary file in the folder of that file, or
/// with TempManager::sameVolume: rename(2) from /tmp to another file system fails.
///
/// Ownership: the object owns the file or folder, and the descriptor of the file. It can be neither
///            copied nor moved, because two owners would remove the same path twice.
/// Failure:   by return value or isValid. Only std::bad_alloc is thrown, and it leaves nothing on
///            disk.
/// errno:     not meaningful, unless said otherwise.
/// Log:       under the module path "temp_manager/temp_manager".
/// Threads:   one thread per object; objects are independent. The volume variants use
///            VolumePathManager, so only one thread at a time may construct one.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state. A forked child that runs the destructor removes the file or
///            folder while the parent still uses it; leave such a child with _exit(2) or exec. What
///            a crashed process owned remains on disk. Age-based cleaners of /tmp may remove an old
///            file.

#include "kovabackup/nodiscard.h"
#include "kovabackup/volume_path_manager.h"

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Owns one temporary file, with mode 0600 regardless of the umask, and its descriptor.
class ScopedTempFile {
public:
  /// Creates an object that owns nothing. The argument is ignored.
  explicit ScopedTempFile(int = 0);

  /// Calls create(name). With closeFd, closes the descriptor of the new file at once.
  ScopedTempFile(const std::string &name, bool closeFd);

  ScopedTempFile(const ScopedTempFile &) = delete;
  ScopedTempFile &operator=(const ScopedTempFile &) = delete;

  /// Closes the descriptor, and removes the file if the object still owns it.
  /// errno: unchanged.
  virtual ~ScopedTempFile();

  /// Closes and removes the file that the object owned, then creates a new one.
  /// An empty name creates "/tmp/scoped_temp_file.XXXXXX". If the name as given is too long for a
  /// file name (255 bytes) or a path (4095 bytes), it is shortened, never inside a UTF-8 character,
  /// and tried once more. A name that ends in "XXXXXX" is not shortened; a name that ends in "/" is
  /// tried again unchanged. The path is made absolute at once, so a later chdir(2) has no effect.
  /// Returns: true with the file open for reading and writing; on false the object owns nothing.
  /// Errors:  mkstemp(3) or chmod(2) fails; memory for the name runs out. Deliberate: when only
  ///          chmod fails, the new file remains on disk without an owner.
  /// errno:   as the failing call left it.
  /// Log:     one line without process id and tag when mkstemp(3) fails: 207 at LOG_DEBUG for the
  ///          first attempt, 203 at LOG_ERR for the second. Other failures are not logged.
  /// Process: the descriptor is close-on-exec.
  KOVA_NODISCARD bool create(const std::string &name);

  /// Returns: true when the object owns a file.
  bool isValid() const;

  /// Returns: the absolute path of the owned file, or "".
  std::string getPath() const;

  /// Returns: the open descriptor, or -1. The spelling of the name is part of the interface.
  /// Owns:    the object closes the descriptor. Use dup(2) for one that is to outlive the object.
  int getFileDescripter() const;

  /// Closes the descriptor, if it is open. The object still owns the file.
  /// errno: unchanged.
  void close();

  /// Removes the owned file and gives up ownership, even if the removal fails. The descriptor stays
  /// open.
  /// errno: unchanged.
  void unlink();

  /// Moves the file to its final place, closes the descriptor and gives up ownership. An existing
  /// file at newPath is replaced atomically, as by rename(2).
  /// Returns: true when the file is at newPath; on false nothing has changed, and the object still
  ///          owns the file and the descriptor.
  /// Errors:  the object owns nothing; newPath is the current path; rename(2) fails, for example
  ///          because newPath is on another file system.
  /// errno:   as rename(2) left it when that failed; otherwise not meaningful.
  /// Log:     one LOG_ERR line, 249, when newPath is the current path; nothing when rename(2)
  ///          fails.
  KOVA_NODISCARD bool rename(const std::string &newPath);

  /// Gives up ownership and closes the descriptor. The file remains for the caller.
  /// Returns: the file's path; "" when the object owned nothing.
  KOVA_NODISCARD std::string preserve();

private:
  int fd_;
  std::string path_;
  std::uint32_t pathHash_;
};

/// A ScopedTempFile in the temporary directory of a volume that a filter chooses.
class ScopedVolumeTempFile : public ScopedTempFile {
public:
  /// Resolves the filter to a directory and creates the file there, as create does. name is a file
  /// name without slashes; an empty name means "scoped_volume_temp_file.XXXXXX". With closeFd,
  /// closes the descriptor at once.
  /// Errors: filter is null; name contains "/"; no volume qualifies; as create. The object then
  ///         owns nothing.
  /// Log:    one LOG_ERR line, 335 for a null filter or 339 for a name with "/"; the lines of
  ///         VolumePathManager and create. The constructor itself logs nothing when no volume
  ///         qualifies.
  /// Blocks: as VolumePathManager::getVolumePath.
  ScopedVolumeTempFile(boost::shared_ptr<FilterVolume> filter, const std::string &name,
                       bool closeFd);

  /// As ~ScopedTempFile.
  ~ScopedVolumeTempFile() override;
};

/// Owns one temporary folder, with mode 0700 regardless of the umask, and everything in it.
class ScopedTempFolder {
public:
  /// Creates an object that owns nothing. The argument is ignored.
  explicit ScopedTempFolder(int = 0);

  /// Calls create(name).
  explicit ScopedTempFolder(const std::string &name);

  ScopedTempFolder(const ScopedTempFolder &) = delete;
  ScopedTempFolder &operator=(const ScopedTempFolder &) = delete;

  /// Calls unlink.
  /// errno: unchanged.
  virtual ~ScopedTempFolder();

  /// Removes the folder that the object owned, then creates a new one. An empty name creates
  /// "/tmp/scoped_temp_folder.XXXXXX". Unlike a file's name, a name that is too long is not
  /// shortened.
  /// Returns: true when the folder exists; on false the object owns nothing.
  /// Errors:  mkdtemp(3) or chmod(2) fails; memory for the name runs out. Deliberate: when only
  ///          chmod fails, the new folder remains on disk without an owner.
  /// errno:   as the failing call left it.
  /// Log:     nothing.
  KOVA_NODISCARD bool create(const std::string &name);

  /// Returns: true when the object owns a folder.
  bool isValid() const;

  /// Returns: the absolute path of the owned folder, or "".
  std::string getPath() const;

  /// Removes the owned folder with everything in it, and gives up ownership even if the removal
  /// fails. Links are removed and not followed. A mount point inside the folder remains, with
  /// everything mounted there, and so do the folders above it. unlink does not guard against
  /// another process that replaces entries meanwhile; only the user who owns the tree may write to
  /// it.
  /// errno:   unchanged.
  /// Log:     nothing, even for entries that cannot be removed.
  /// Memory:  an empty folder is removed even when memory or descriptors have run out.
  /// Blocks:  until the walk is complete, however large the tree is.
  /// Process: up to 20 directories are open at a time.
  void unlink();

  /// Moves the folder to its final place and gives up ownership.
  /// Returns: true when the folder is at newPath; on false nothing has changed, and the object
  ///          still owns the folder.
  /// Errors:  the object owns nothing; newPath is the current path; rename(2) fails, for example
  ///          because newPath is on another file system or is a folder that is not empty.
  /// errno:   as rename(2) left it when that failed; otherwise not meaningful.
  /// Log:     one LOG_ERR line, 446, when newPath is the current path; nothing when rename(2)
  ///          fails.
  KOVA_NODISCARD bool rename(const std::string &newPath);

  /// Gives up ownership. The folder remains for the caller.
  /// Returns: the folder's path; "" when the object owned nothing.
  KOVA_NODISCARD std::string preserve();

private:
  std::string path_;
  std::uint32_t pathHash_;
};

/// A ScopedTempFolder in the temporary directory of a volume that a filter chooses.
class ScopedVolumeTempFolder : public ScopedTempFolder {
public:
  /// Resolves the filter to a directory and creates the folder there, as create does. name is a
  /// folder name without slashes; an empty name means "scoped_volume_temp_folder.XXXXXX".
  /// Errors: filter is null; name contains "/"; no volume qualifies; as create. The object then
  ///         owns nothing.
  /// Log:    one LOG_ERR line, 477 for a null filter or 481 for a name with "/"; the lines of
  ///         VolumePathManager. The constructor itself logs nothing when no volume qualifies.
  /// Blocks: as VolumePathManager::getVolumePath.
  ScopedVolumeTempFolder(boost::shared_ptr<FilterVolume> filter, const std::string &name);

  /// As ~ScopedTempFolder.
  ~ScopedVolumeTempFolder() override;
};

/// Creates the filters by which callers choose a volume. Each call creates a new filter of the
/// class named below (volume_path_manager.h) with exactly the given arguments.
/// Owns: the returned pointer owns the filter and is never null.
class TempManager {
public:
  /// The largest volume (FilterMaxVolume).
  static boost::shared_ptr<FilterVolume> maxVolume();
  static boost::shared_ptr<FilterVolume> maxVolume(bool fallbackTmp);
  static boost::shared_ptr<FilterVolume> maxVolume(int location, int enumFlags, bool fallbackTmp);

  /// The largest ext volume (FilterMaxExtVolume).
  static boost::shared_ptr<FilterVolume> maxExtVolume();
  static boost::shared_ptr<FilterVolume> maxExtVolume(bool fallbackTmp);
  static boost::shared_ptr<FilterVolume> maxExtVolume(int location, int enumFlags,
                                                      bool fallbackTmp);

  /// The largest ext or btrfs volume (FilterMaxExtBtrfsVolume).
  static boost::shared_ptr<FilterVolume> maxExtBtrfsVolume();
  static boost::shared_ptr<FilterVolume> maxExtBtrfsVolume(bool fallbackTmp);
  static boost::shared_ptr<FilterVolume> maxExtBtrfsVolume(int location, int enumFlags,
                                                           bool fallbackTmp);

  /// The volume that holds path (FilterSameVolume).
  /// Log: as the constructor of FilterSameVolume.
  static boost::shared_ptr<FilterVolume> sameVolume(const std::string &path);
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
