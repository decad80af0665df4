#ifndef KOVABACKUP_SESSION_H
#define KOVABACKUP_SESSION_H

/// @file Scratch directories that one process makes and others find again by a short id.
///
///     Session session;                                           // the first process
///     if (!session.create(TempManager::maxExtBtrfsVolume())) return false;
///     ...fill session.getPath(), tell session.getId() to the others...
///
///     const std::string dir = Session::getPathById(id);          // a second one reads
///
///     Session session;                                           // the last one cleans up
///     return session.load(id) && session.destroy();
///
/// A local session is a directory "sess.XXXXXX" in the session root /tmp/kovabackup/session. A
/// volume session is a directory "seln.XXXXXX" in the temporary directory of the volume that a
/// filter chooses, and a link in the session root whose name is the id and whose content is the
/// directory's path. The directories have mode 0700. The id tells the kind: "sess" or "seln" at its
/// front; that of a volume session is the name of its link, mostly but not always of its directory,
/// too. The lock file "__sess__.lock" in the session root is made when it is first needed and
/// stays.
///
/// On disk a session lives from create until destroy or destroyById, whatever becomes of the
/// processes and objects. Sessions of crashed processes stay; see which by the directories' times,
/// which load refreshes. A cleaner of old files in /tmp sees the times of what lies in a session,
/// too, and load does not refresh those: exclude /tmp/kovabackup from its work.
///
/// Trust:     ids are taken as they are. One that an outsider chose may hold "/" or ".." and lead
///            anywhere: check for "sess" or "seln", a dot and six letters or digits before.
/// Ownership: an object owns the id and the path, never the directory.
/// Failure:   by return value; nothing is thrown but std::bad_alloc, and a create that throws
///            leaves no session on disk.
/// errno:     not meaningful.
/// Log:       under the module path "session"; what this stands on logs before that.
/// Threads:   one thread per object; one thread at a time for create(filter), which uses
///            VolumePathManager, and for destroy and destroyById, which use removeAll. Processes
///            need not know of each other.
/// Process:   no process-wide state of its own.

#include "kovabackup/volume_path_manager.h"

#include <boost/shared_ptr.hpp>
#include <memory>
#include <string>

namespace KOVA {
namespace Backup {

class SessionPrivate;

#pragma GCC visibility push(default)

/// One session directory, or none.
class Session {
public:
  /// Makes an object without a session.
  Session();

  Session(const Session &) = delete;
  Session &operator=(const Session &) = delete;

  /// Touches nothing on disk.
  ~Session();

  /// Makes a local session and binds it.
  /// Returns: true with id and path set; on false the object is as it was, and nothing of a new
  ///          session is on disk, but what ScopedTempFolder and ScopedTempFile leave whose mode
  ///          could not be set. The session root stays.
  /// Errors:  a session is bound already; the session root or the directory cannot be made.
  /// Log:     one LOG_ERR line: 136 bound already, 82 session root, 99 directory (it names "seln"
  ///          for a local session, too); what Path::createIpcTempPath logs before 82.
  bool create();

  /// Makes a session on the volume that the filter chooses and binds it. When the filter resolves
  /// to a directory whose path begins with "/tmp" (a bare comparison: "/tmpdata", too), the session
  /// is a local one.
  /// Returns: as create().
  /// Errors:  as create(); no volume qualifies, filter null included; the link cannot be made.
  /// Log:     LOG_ERR lines: 153 bound already, 126 no volume, 82 and 99 as create(), 108 link;
  ///          113 after one of 41 (placeholder), 49 (lock file), 53 (lock), 60 (link) and 64
  ///          (unlock) when the link's name was taken and another could not be reserved. After 64
  ///          alone a link to nothing stays.
  /// Blocks:  as VolumePathManager::getVolumePath; when the link's name is taken, until the lock of
  ///          the session root is free, through signals, without limit.
  /// Process: the lock's descriptor is close-on-exec and closed again.
  bool create(boost::shared_ptr<FilterVolume> filter);

  /// Binds an existing session and sets its directory's times to now; those of the files in it stay
  /// as they are.
  /// Returns: true with id and path set; on false the object is as it was.
  /// Errors:  a session is bound already; id is empty; there is no such directory (a link in its
  ///          place does not count), or the caller may not write and enter it.
  /// Log:     one LOG_ERR line: 170 bound already, 174 empty id, 180 no directory, 184 no access,
  ///          188 times; what getPathById logs before 180.
  bool load(const std::string &id);

  /// Removes the bound session from disk, directory and link. The object holds none afterwards,
  /// whether or not that worked.
  /// Returns: true when nothing failed, as removeAll counts it: what is gone already is no failure.
  ///          True, too, without a session.
  /// Log:     LOG_ERR lines: 200 directory (after removeAll's own), 206 link.
  bool destroy();

  /// Returns: the id of the bound session, or "".
  std::string getId() const;

  /// Returns: the absolute path of the bound session's directory, or "".
  std::string getPath() const;

  /// Finds the directory of a session. That of a local one is computed and need not exist; that of
  /// a volume session is what its link holds, at most 1024 bytes of it.
  /// Returns: the path, or "" on failure.
  /// Errors:  id is empty; the link is missing or cannot be read.
  /// Log:     one LOG_ERR line: 250 empty id, 259 unreadable link; none for a missing one.
  static std::string getPathById(const std::string &id);

  /// Removes a session from disk, directory and link, without loading it.
  /// Returns: true when nothing failed, as with destroy, also when nothing was there; false for an
  ///          empty id.
  /// Log:     LOG_ERR lines: 228 empty id, 234 directory (after removeAll's own), 240 link; what
  ///          getPathById logs.
  static bool destroyById(const std::string &id);

private:
  std::unique_ptr<SessionPrivate> d_;
};

#pragma GCC visibility pop

} // namespace Backup
} // namespace KOVA

#endif
