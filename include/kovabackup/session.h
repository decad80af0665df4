#ifndef KOVABACKUP_SESSION_H
#define KOVABACKUP_SESSION_H

/// @file Scratch directories that one process creates and other processes find by a short id.
///
///     Session session;                                           // the first process
///     if (!session.create(TempManager::maxExtBtrfsVolume())) return false;
///     ...fill session.getPath(), pass session.getId() to the others...
///
///     const std::string dir = Session::getPathById(id);          // a second one reads
///
///     Session session;                                           // the last one cleans up
///     return session.load(id) && session.destroy();
///
/// A local session is a directory "sess.XXXXXX" in the session root /tmp/kovabackup/session. A
/// volume session is a directory "seln.XXXXXX" in the temporary directory of the volume that a
/// filter chooses, together with a symbolic link in the session root. The link's name is the
/// session id, and its content is the path of the directory. All these directories have mode 0700.
/// The first four bytes of an id show its kind: "sess" or "seln". The id of a volume session is
/// always the name of its link, and usually, but not always, also the name of its directory. The
/// lock file "__sess__.lock" in the session root is created when it is first needed, and is never
/// removed.
///
/// On disk a session exists from create until destroy or destroyById, whatever happens to the
/// processes and objects that use it. Sessions of crashed processes therefore remain. The times of
/// their directories, which load refreshes, show how old they are. A program that removes old files
/// from /tmp also looks at the times of the files inside a session, which load does not refresh:
/// exclude /tmp/kovabackup from such a program.
///
/// Trust:     ids are used without a check. An id that comes from outside the program may contain
///            "/" or ".." and lead anywhere. Before using it, check that it is "sess" or "seln", a
///            dot, and six letters or digits.
/// Ownership: an object owns the id and the path, never the directory.
/// Failure:   by return value. Only std::bad_alloc is thrown; a create that throws leaves no
///            session on disk.
/// errno:     not meaningful.
/// Log:       under the module path "session". The modules that a session uses log before it does.
/// Threads:   one thread per object. One thread at a time may call create(filter), which uses
///            VolumePathManager, and one at a time destroy or destroyById, which use removeAll.
///            Processes need no coordination.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state of its own.

#include "kovabackup/nodiscard.h"
#include "kovabackup/volume_path_manager.h"

#include <boost/shared_ptr.hpp>
#include <memory>
#include <string>

namespace KOVA {
namespace Backup {

class SessionPrivate;

#pragma GCC visibility push(default)

/// Holds one session, or none.
class Session {
public:
  /// Creates an object without a session.
  Session();

  Session(const Session &) = delete;
  Session &operator=(const Session &) = delete;

  /// Changes nothing on disk: the session remains.
  ~Session();

  /// Creates a local session and binds the object to it.
  /// Returns: true with id and path set. On false the object is unchanged, and nothing of the new
  ///          session remains on disk, except a folder whose mode could not be set (see
  ///          ScopedTempFolder). The session root remains.
  /// Errors:  the object already holds a session; the session root or the directory cannot be
  ///          created.
  /// Log:     one LOG_ERR line: 136 for an object that already holds a session, 82 for the session
  ///          root, 99 for the directory (it names "seln" even for a local session).
  ///          Path::createIpcTempPath logs a line of its own before 82.
  KOVA_NODISCARD bool create();

  /// Creates a session on the volume that the filter chooses and binds the object to it. If the
  /// filter resolves to a directory whose path begins with "/tmp", the session is a local one. That
  /// is a plain comparison of bytes: "/tmpdata" counts as well.
  /// Returns: as create(). In the same way, a placeholder file whose mode could not be set remains
  ///          (see ScopedTempFile).
  /// Errors:  as create(); no volume qualifies, or filter is null; the link cannot be created.
  /// Log:     LOG_ERR lines: 153 for an object that already holds a session, 126 for no volume, 82
  ///          and 99 as create(), 108 for the link. If the link's name is taken and no other name
  ///          can be reserved, 113 follows one of 41 (placeholder), 49 (lock file), 53 (lock), 60
  ///          (link) and 64 (unlock). After 64, and only then, a dangling link remains.
  /// Blocks:  as VolumePathManager::getVolumePath. If the link's name is taken, create also waits
  ///          for the lock of the session root, without limit; signals do not interrupt the wait.
  /// Process: the descriptor of the lock is close-on-exec and is closed before create returns.
  KOVA_NODISCARD bool create(boost::shared_ptr<FilterVolume> filter);

  /// Binds the object to an existing session and sets the access and modification times of its
  /// directory to now. The times of the files in it do not change.
  /// Returns: true with id and path set; on false the object is unchanged.
  /// Errors:  the object already holds a session; id is empty; the directory does not exist (a
  ///          symbolic link in its place does not count); the caller may not write to it and enter
  ///          it; its times cannot be set.
  /// Log:     one LOG_ERR line: 170 for an object that already holds a session, 174 for an empty
  ///          id, 180 for no directory, 184 for no access, 188 for the times. getPathById may log a
  ///          line of its own before 180.
  KOVA_NODISCARD bool load(const std::string &id);

  /// Removes the session from disk, directory and link. Afterwards the object holds no session,
  /// even if the removal failed.
  /// Returns: true when nothing failed, as removeAll counts it: what is already gone is not a
  ///          failure. Also true for an object without a session.
  /// Log:     LOG_ERR lines: 200 for the directory, after the line of removeAll; 206 for the link.
  /// Blocks:  as removeAll.
  KOVA_NODISCARD bool destroy();

  /// Returns: the id of the session; "" for an object without a session.
  std::string getId() const;

  /// Returns: the absolute path of the session's directory; "" for an object without a session.
  std::string getPath() const;

  /// Finds the directory of a session. The path of a local session is computed and need not exist.
  /// The path of a volume session is the content of its link, of which at most 1024 bytes are read.
  /// Returns: the path, or "" on failure.
  /// Errors:  id is empty; the link does not exist or cannot be read.
  /// Log:     one LOG_ERR line: 250 for an empty id, 259 for a link that cannot be read. A link
  ///          that does not exist is not logged.
  /// Threads: any.
  static std::string getPathById(const std::string &id);

  /// Removes a session from disk, directory and link, without loading it.
  /// Returns: true when nothing failed, as destroy counts it, even if nothing existed; false for an
  ///          empty id.
  /// Log:     LOG_ERR lines: 228 for an empty id; 234 for the directory, after the line of
  ///          removeAll; 240 for the link; the lines of getPathById.
  /// Blocks:  as removeAll.
  KOVA_NODISCARD static bool destroyById(const std::string &id);

private:
  std::unique_ptr<SessionPrivate> d_;
};

#pragma GCC visibility pop

} // namespace Backup
} // namespace KOVA

#endif
