#ifndef KOVABACKUP_SERVICE_RUN_LOCK_H
#define KOVABACKUP_SERVICE_RUN_LOCK_H

/// @file A lock for one run of something at a time, across processes.
///
///     RunLock lock("nightly");
///     Error error;
///     if (!lock.take(error)) {
///       LockHolder holder;
///       if (error.code == EWOULDBLOCK && RunLock::holder("nightly", holder)) {
///         std::fprintf(stderr, "process %d runs it\n", static_cast<int>(holder.taker));
///       }
///       return false;
///     }
///     ...run...                                          // the destructor releases the lock
///
/// The lock is an flock(2) on the lock file "/tmp/kovabackup/lock/<name>". The names are the lock
/// tokens of option maps (OptionMap::setLockToken), so a RunLock excludes a map's lock() with the
/// same token, and `kovabackup lock show` lists it.
///
/// The lock belongs to the open file. Every process that has a descriptor of it holds the lock: a
/// forked child until it runs a program or ends, and a program that was given the descriptor
/// (Command::passFd(lock.fd(), n)) until it closes it. The lock then outlives this process, even a
/// killed one, for as long as the child works. Neither release nor the destructor takes the lock
/// away from such a child.
///
/// The process that takes the lock notes its PID, its start and the time in the lock file. holder
/// reads the note and compares it with /proc/locks and the process. A note that was left by a
/// process that has ended is therefore never mistaken for the holder's. If the note cannot be
/// written, for example because the disk is full, the lock is held nevertheless; holder then
/// reports what the kernel knows, without the time. A note is written only to a regular file with a
/// single name, so a link planted there cannot have another file overwritten.
///
/// Owns:    one descriptor while the lock is held, close-on-exec.
/// Failure: by result and Error; only std::bad_alloc is thrown.
/// errno:   not meaningful.
/// Log:     the lines of Path::createIpcTempPath when the lock directory cannot be prepared.
///          Nothing else.
/// Threads: one thread per object; objects are independent, and exclude each other even in one
///          process. The static functions may be called by any number of threads.
/// Signals: none ends a wait for the lock.

#include "kovabackup/nodiscard.h"
#include "kovabackup/service/error.h"
#include "kovabackup/service/millis.h"

#include <ctime>
#include <string>
#include <sys/types.h>
#include <vector>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

/// Who took a lock that is held.
struct LockHolder {
  pid_t taker = -1;      ///< the process that took it
  bool alive = false;    ///< false: it has ended, and a child of it keeps the lock
  std::time_t since = 0; ///< when it took the lock; 0 if that is not known
};

/// A process that holds a lock or waits for it.
struct LockUser {
  pid_t pid = -1;
  bool waits = false;  ///< waits without limit for the lock rather than holding it
  std::string command; ///< its name; "" when it has ended and a child of it keeps the lock
};

class RunLock {
public:
  /// Prepares the lock of that name; nothing is opened yet. Slashes at the beginning of the name
  /// are ignored; a name with inner slashes refers to a subdirectory, which must exist.
  explicit RunLock(const std::string &name);
  /// Closes the descriptor, as release does.
  ~RunLock();
  RunLock(const RunLock &) = delete;
  RunLock &operator=(const RunLock &) = delete;

  /// Takes the lock and notes this process as its holder. Directory and file are created as
  /// Path::createIpcLockFile creates them. If the lock file is removed or replaced meanwhile, the
  /// new one is locked.
  /// Returns: true when the object holds the lock. On false error is set, and the object holds what
  ///          it held before; on true error is untouched.
  /// Errors:  EWOULDBLOCK: the limit passed while another process, or another object, held it.
  ///          EALREADY: this object holds it.
  ///          EINVAL: the name is empty, ends with "/", contains a NUL byte, or has "." or ".." as
  ///          a component. ELOOP: the lock file is a symbolic link, which is not followed. ESTALE:
  ///          the lock file was replaced again and again. Else the errno of createIpcTempPath,
  ///          open, flock, fstat or lstat.
  /// Units:   a negative limit waits without limit, 0 does not wait.
  /// Blocks:  while another descriptor holds the lock. With a limit above 0, the lock is tried
  ///          every 10 ms, because flock(2) has no time limit; such a caller is not listed by
  ///          users, and one that waits without limit gets the lock before it.
  KOVA_NODISCARD bool take(Error &error, Millis limit = Millis(0));

  /// Closes the descriptor. The lock is free unless a child has the descriptor too. Without a lock
  /// this does nothing.
  void release();

  /// The descriptor that holds the lock, -1 while there is none. Callers may hand it to a child;
  /// they must neither unlock nor close it.
  int fd() const noexcept { return fd_; }

  /// The path of the lock file of a name; "" for a name that take refuses.
  static std::string path(const std::string &name);

  /// Finds out who took the lock. The lock is not tried, so no other process can be refused because
  /// of this call.
  /// Returns: true with out set; false, with out untouched, when no process holds the lock or it
  ///          cannot be known (users says why).
  /// Errors:  as users. In another PID namespace, the kernel does not list a lock whose taker is
  ///          not in this one or, unless this is the initial one, has ended.
  /// A lock that was not taken by a RunLock has no time. For an instant after take, it has none
  /// yet, or that of the run before it when the same process took both.
  static bool holder(const std::string &name, LockHolder &out);

  /// Lists the processes that hold the lock and those that wait for it, as /proc/locks does: those
  /// that asked for it, not the children to which a descriptor was handed.
  /// Returns: true with out set, empty for a lock that no process uses or that was never taken. On
  ///          false out is untouched and error is set.
  /// Errors:  EINVAL as take; stat(2)'s for the lock file; open(2)'s and read(2)'s for /proc/locks.
  /// Where stat(2) reports another device number than the kernel lists, as in subvolumes, the inode
  /// number may belong to several files. A process that runs is then left out if it does not have
  /// the file open. Only root, or the user of the process with every capability that the process
  /// has, can see that; for any other caller the process is listed.
  static bool users(const std::string &name, std::vector<LockUser> &out, Error &error);

private:
  std::string name_;
  int fd_ = -1;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
