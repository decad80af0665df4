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
///     const std::string kept = work.preserve();            // without this line: all removed
///
/// The name is a template for mkstemp(3) or mkdtemp(3): as it stands when it ends in "XXXXXX", else
/// with ".XXXXXX" appended; an empty one stands for a default. "/d/" becomes "/d/.XXXXXX", and a
/// name without a slash lands in the working directory.
///
/// An object owns what it made until unlink, rename, preserve, another create or its destruction.
/// It keeps a hash of the path as a guard: should the path and its hash ever disagree, the object
/// counts as owning nothing and neither removes, moves nor hands out anything. Ownership is told by
/// isValid, and so is every failure of a constructor.
///
/// To replace a file on a data volume, make the temporary file in that file's own folder, or with
/// TempManager::sameVolume: a rename from /tmp to another file system fails.
///
/// Ownership: of the file or folder, and of the file's descriptor, by the object; it is neither
///            copied nor moved, since two owners would remove twice.
/// Failure:   by return value or isValid; nothing is thrown but std::bad_alloc, and then nothing
///            is left on disk.
/// Log:       under the module path "temp_manager/temp_manager".
/// Threads:   one thread per object; objects are independent. The volume variants use
///            VolumePathManager, so only one thread at a time may construct one.
/// Process:   no process-wide state. A forked child that runs the destructor removes the file or
///            folder under its parent's eyes; leave such a child by _exit or exec. What a crashed
///            process owned stays on disk. Age-based cleaners of /tmp may take an old file away.

#include "kovabackup/volume_path_manager.h"

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// The owner of one temporary file, with mode 0600 whatever the umask, and of its descriptor.
class ScopedTempFile {
public:
  /// Makes an object that owns nothing. The argument is ignored.
  explicit ScopedTempFile(int = 0);

  /// Calls create(name); with closeFd, closes the descriptor of the new file at once.
  ScopedTempFile(const std::string &name, bool closeFd);

  ScopedTempFile(const ScopedTempFile &) = delete;
  ScopedTempFile &operator=(const ScopedTempFile &) = delete;

  /// Closes the descriptor and removes the file if it is still owned.
  /// errno: unchanged.
  virtual ~ScopedTempFile();

  /// Closes and removes what the object owned, then makes a new file.
  /// An empty name makes "/tmp/scoped_temp_file.XXXXXX". When the name as given is too long for a
  /// file name (255 bytes) or a path (4095), it is cut, never inside a UTF-8 character, and
  /// tried once more; a name that ends in "XXXXXX" is not, and one that ends in "/" is tried again
  /// as it is. The path is the absolute one at this moment, so a later chdir does no harm.
  /// Returns: true with the file open for reading and writing; on false the object owns nothing.
  /// Errors:  mkstemp(3), chmod(2), and no memory for the name. Deliberate: when only chmod fails,
  ///          the new file stays on disk and belongs to nobody.
  /// errno:   as the failing call left it.
  /// Log:     "mkstemp failed" at LOG_DEBUG (207), or at LOG_ERR (203) for the second attempt, both
  ///          without pid and tag; none for the other failures.
  /// Process: the descriptor is close-on-exec.
  bool create(const std::string &name);

  /// Whether the object owns a file.
  bool isValid() const;

  /// Returns: the absolute path of the owned file, or "".
  std::string getPath() const;

  /// Returns: the open descriptor, or -1. The spelling is part of the interface.
  /// Owns:    the object closes it; dup(2) what is to live longer.
  int getFileDescripter() const;

  /// Closes the descriptor, if any. The file stays and stays owned.
  /// errno: unchanged.
  void close();

  /// Removes the owned file, whether or not that works, and gives it up. The descriptor stays open.
  /// errno: unchanged.
  void unlink();

  /// Moves the file to its final place, closes the descriptor and gives up ownership. What stood
  /// there is replaced, as rename(2) does.
  /// Returns: true when it is there; on false nothing has changed and the object still owns the
  ///          file and the descriptor.
  /// Errors:  nothing is owned; newPath is the present path; rename(2), for example to another file
  ///          system.
  /// errno:   as rename(2) left it when that failed, else not meaningful.
  /// Log:     one LOG_ERR line (249) for the present path; none for a failing rename(2).
  bool rename(const std::string &newPath);

  /// Gives up ownership and closes the descriptor; the file stays for the caller.
  /// Returns: its path, or "" when nothing was owned.
  std::string preserve();

private:
  int fd_;
  std::string path_;
  std::uint32_t pathHash_;
};

/// A ScopedTempFile in the temporary directory of the volume that a filter chooses.
class ScopedVolumeTempFile : public ScopedTempFile {
public:
  /// Resolves the filter to a directory and makes the file in it, as create does. name is a bare
  /// file name; an empty one stands for "scoped_volume_temp_file.XXXXXX". With closeFd, closes the
  /// descriptor at once.
  /// Errors: filter is null; name holds a "/"; no volume qualifies; as create. The object then
  ///         owns nothing.
  /// Log:    one LOG_ERR line for a null filter (335) or a name with "/" (339); what
  ///         VolumePathManager and create log; none of its own when no volume qualifies.
  ScopedVolumeTempFile(boost::shared_ptr<FilterVolume> filter, const std::string &name,
                       bool closeFd);
  ~ScopedVolumeTempFile() override;
};

/// The owner of one temporary folder, with mode 0700 whatever the umask, and of all in it.
class ScopedTempFolder {
public:
  /// Makes an object that owns nothing. The argument is ignored.
  explicit ScopedTempFolder(int = 0);

  /// Calls create(name).
  explicit ScopedTempFolder(const std::string &name);

  ScopedTempFolder(const ScopedTempFolder &) = delete;
  ScopedTempFolder &operator=(const ScopedTempFolder &) = delete;

  /// Does as unlink.
  /// errno: unchanged.
  virtual ~ScopedTempFolder();

  /// Removes what the object owned, then makes a new folder. An empty name makes
  /// "/tmp/scoped_temp_folder.XXXXXX". A name that is too long is not cut: unlike a file's.
  /// Returns: true when the folder is there; on false the object owns nothing.
  /// Errors:  mkdtemp(3), chmod(2), and no memory for the name. Deliberate: when only chmod fails,
  ///          the new folder stays on disk and belongs to nobody.
  /// errno:   as the failing call left it.
  /// Log:     none.
  bool create(const std::string &name);

  /// Whether the object owns a folder.
  bool isValid() const;

  /// Returns: the absolute path of the owned folder, or "".
  std::string getPath() const;

  /// Removes the owned folder with everything in it, and gives it up whether or not that works.
  /// Links are removed and not followed; a mount point inside stays with what is mounted there, and
  /// so do the folders above it. Not guarded against someone who swaps entries meanwhile: the tree
  /// is this user's alone.
  /// errno:   unchanged.
  /// Log:     none; what cannot be removed stays without a word.
  /// Process: up to 20 directories are open at a time.
  void unlink();

  /// Moves the folder to its final place and gives up ownership.
  /// Returns: true when it is there; on false nothing has changed and the object still owns it.
  /// Errors:  nothing is owned; newPath is the present path; rename(2), for example to another file
  ///          system or onto a folder that is not empty.
  /// errno:   as rename(2) left it when that failed, else not meaningful.
  /// Log:     one LOG_ERR line (446) for the present path; none for a failing rename(2).
  bool rename(const std::string &newPath);

  /// Gives up ownership; the folder stays for the caller.
  /// Returns: its path, or "" when nothing was owned.
  std::string preserve();

private:
  std::string path_;
  std::uint32_t pathHash_;
};

/// A ScopedTempFolder in the temporary directory of the volume that a filter chooses.
class ScopedVolumeTempFolder : public ScopedTempFolder {
public:
  /// Resolves the filter to a directory and makes the folder in it, as create does. name is a bare
  /// folder name; an empty one stands for "scoped_volume_temp_folder.XXXXXX".
  /// Errors: filter is null; name holds a "/"; no volume qualifies; as create. The object then
  ///         owns nothing.
  /// Log:    one LOG_ERR line for a null filter (477) or a name with "/" (481); what
  ///         VolumePathManager logs; none of its own when no volume qualifies.
  ScopedVolumeTempFolder(boost::shared_ptr<FilterVolume> filter, const std::string &name);
  ~ScopedVolumeTempFolder() override;
};

/// Makes the filters by which callers choose a volume. Each call makes a new filter of the class
/// named in volume_path_manager.h with exactly the arguments given.
/// Owns: the pointer returned, which is never null.
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
  static boost::shared_ptr<FilterVolume> sameVolume(const std::string &path);
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
