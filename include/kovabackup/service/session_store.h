#ifndef KOVABACKUP_SERVICE_SESSION_STORE_H
#define KOVABACKUP_SERVICE_SESSION_STORE_H

/// @file All sessions of a machine: what exists, who uses it, adoption and removal.
///
///     SessionStore store;
///     std::vector<SessionInfo> removed;
///     std::vector<Error> failed;
///     if (!store.prune(std::chrono::hours(24 * 7), false, removed, failed)) {
///       for (const Error &error : failed) report(error);
///     }
///
/// A session (session.h) outlives the processes that use it, so crashed processes leave sessions
/// behind. The store finds them all: the entries of the session root /tmp/kovabackup/session, and
/// the lost directories on volumes, to which no link leads. A directory is lost when the machine
/// was restarted and /tmp was emptied, or when a process was killed before it made the link. A
/// directory counts as lost when all of this holds:
///
///     it is in the share temporary directory of a volume that is mounted and writable;
///     its name is "seln." and six letters or digits, and it is a real directory with mode 0700;
///     it belongs to the caller; for root the owner does not matter;
///     no link in the session root leads to it;
///     its modification time is at least ten minutes ago, since a session that is being created has
///     no link for a moment either.
///
/// The age of a session is that of its directory's modification time, which Session::load sets. For
/// an entry without a directory it is that of the entry itself. A time in the future counts as now.
///
/// Without SessionRemoval::evenInUse, a removal never takes a session from a process that uses it.
/// The directory is first renamed to a fresh session name. From then on no process can enter it by
/// the path that it knows. Then the store looks into /proc for processes that are already in it,
/// and checks that no process has loaded it meanwhile. Only then is the tree removed; otherwise the
/// directory gets its old name back. All of this leaves the modification time of the directory
/// unchanged.
///
/// A user is a process with a thread that has a file of the session open or mapped, runs a program
/// from it, or has it as its working or root directory, in whatever mount namespace. The calling
/// process counts like any other, since another part of it may use the session. Where the kernel
/// does not report a path because it is longer than a page, the process counts as a user of every
/// session on that file system. Users cannot be known, and nothing is removed,
///
///     when /proc is missing, is not readable, or hides processes (process 1 is not there);
///     when a process cannot be examined that runs as the owner of the session or, if the caller is
///     root, as root. Process 1 does not count here, nor does a process outside the user namespace
///     of the caller.
///
/// Limits: processes of other users, which an ordinary caller cannot examine, do not count; they
/// cannot enter a directory with mode 0700, except those of root. A process that has only loaded a
/// session and has nothing of it open is not seen. prune spares the session as long as the time
/// that Session::load has set is younger than the given age; remove does not. Not seen either are
/// descriptors on their way through a socket, and a process that passes what it has open to a child
/// and ends during the look. The kernel lists for a process only the mounts below its root
/// directory. So a process is not seen either if it entered a session by a mount at another place
/// and then changed its root directory to one that does not contain the mount point.
/// Not seen are processes outside the PID namespace of the caller, such as those of the host when
/// the caller runs in a container.
///
/// When the process is killed, whatever the step, list shows what is left: under its old id, under
/// a fresh id, or as lost. A volume session may leave a dangling link besides. Later calls handle
/// all of these. The age of a session that was being removed counts from that time.
///
/// The functions that change something require that the session root and the folder above it
/// belong to root or to the caller, and that no other user can write to them; otherwise they fail
/// with EPERM. Where the store itself refuses an operation, the step of the Error is "refused":
///
///     EPERM    path is one of these two folders
///     EINVAL   the session is foreign, or its id is not a session id; adopt: it is not lost
///     EBUSY    a process uses the session at path
///     EAGAIN   the session is younger than the given age, since it was loaded or changed meanwhile
///     ESTALE   something else has taken the place of the session
///
/// Owns:    nothing between calls.
/// Failure: by result and Error. Only std::bad_alloc is thrown. It leaves every session that was
///          not removed under its name; one that was being removed may lack entries.
/// errno:   not meaningful.
/// Log:     nothing of its own. The folders of the volumes are found by TempManager::sameVolume,
///          the session root is created by Path::createIpcTempPath; they log their failures. A
///          volume whose folder the platform does not name is left out.
/// Threads: one thread.
/// Blocks:  functions that change something wait for the lock of the session root, flock(2), which
///          other stores hold while they rename and look, but not while they remove trees.
/// Process: no process-wide state. Descriptors are close-on-exec and closed on return.
/// Cost:    list: a few system calls for each session, one enumeration of the volumes. users: one
///          look at all open files and mappings of all threads. remove: two looks. prune: one look,
///          and one more for each session that it removes.

#include "kovabackup/nodiscard.h"
#include "kovabackup/service/error.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <sys/types.h>
#include <vector>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

/// A process that uses a session.
struct SessionUser {
  pid_t pid = -1;
  std::string command; ///< its name; "" when it has ended
};

struct SessionInfo {
  enum class State {
    Complete, ///< its directory exists
    Dangling, ///< the target of its link does not exist
    Lost,     ///< a directory on a volume to which no link leads; it has no id
    Broken,   ///< something else has its name: a file, or a link instead of a directory
    Foreign   ///< its link leads to something that is not a session directory; never touched
  };
  State state = State::Broken;
  std::string id;        ///< "" when it is lost
  std::string path;      ///< of its directory; "" when its link cannot be read
  bool onVolume = false; ///< on a volume, rather than in the session root
  std::chrono::seconds age{0};
  std::string problem; ///< why it is not complete; "" when it is
};

/// An entry of a session's directory with everything below it.
struct SessionPart {
  std::string name;
  std::uint64_t bytes = 0;
};

/// How SessionStore::remove removes a session.
struct SessionRemoval {
  /// Refuses the removal with EAGAIN when the session is younger after it was renamed.
  std::chrono::seconds olderThan{0};

  /// Removes the session without looking for its users.
  bool evenInUse = false;

  /// Entries of the directory, as size returns them, to be removed one by one before the rest.
  /// A name that is not that of an entry is ignored.
  std::vector<SessionPart> parts;

  /// Called with the bytes of each part that is gone. It must not throw.
  std::function<void(std::uint64_t)> gone;
};

class SessionStore {
public:
  /// Whether id is "sess" or "seln", a dot, and six ASCII letters or digits.
  static bool isId(const std::string &id);

  /// The directory that holds local sessions and links; it need not exist.
  static std::string root();

  /// Lists all sessions in order of their ids, and after them the lost ones in order of their
  /// paths. out is set in either case.
  /// Returns: true when the list is complete. On false error is set to the first failure. When the
  ///          session root cannot be read to its end, lost ones are not listed, since it is not
  ///          known which directories have a link. The same applies when the platform cannot list
  ///          the volumes. A volume that cannot be read only lacks its own.
  /// Process: the platform creates a missing share temporary directory of a volume; nothing else is
  ///          created.
  bool list(std::vector<SessionInfo> &out, Error &error);

  /// Finds one session by its id, without a look at the volumes.
  /// Returns: true with out set; on false out is untouched and error is set, with ENOENT when there
  ///          is no such session.
  bool find(const std::string &id, SessionInfo &out, Error &error);

  /// Finds the processes that use a session. Only complete and lost sessions have users: the path
  /// of any other may be anything. A process that has the session mounted at another place, as in a
  /// container, is found only by the functions that rename it.
  /// Returns: true with out set; false, with out empty, when the users cannot be known.
  KOVA_NODISCARD bool users(const SessionInfo &session, std::vector<SessionUser> &out);

  /// Adds up what is in a session's directory: files counts everything except directories, bytes
  /// the sizes of the regular files. Follows no link and enters no other file system. files and
  /// bytes are 0 for a session that is neither complete nor lost. With parts, each entry of the
  /// directory is listed as well, and what parts held before is dropped.
  /// Returns: true when everything was counted. On false error is the first failure, and the
  ///          outputs hold what could be counted.
  bool size(const SessionInfo &session, std::uint64_t &files, std::uint64_t &bytes, Error &error,
            std::vector<SessionPart> *parts = nullptr);

  /// Makes a link in the session root that leads to a lost directory, so that it is a session
  /// again. Its id is the name of the directory, or a fresh name when that is taken. The session
  /// root is created if it does not exist; the directory must belong to its owner. The directory
  /// itself and its times remain unchanged.
  /// Returns: true with id set; on false id is untouched, and error is set.
  /// Errors:  EINVAL when session is not lost, also when a link leads to it in the meantime; EPERM
  ///          when it belongs to another user than the session root.
  KOVA_NODISCARD bool adopt(const SessionInfo &lost, std::string &id, Error &error);

  /// Removes a session with everything in it, whatever its age, unless a process uses it. Mount
  /// points in it are not entered. If a part of it cannot be removed, the rest keeps its id and its
  /// age.
  /// Returns: true when nothing is left, also when there was nothing. On false error is set to the
  ///          first failure.
  /// Errors:  those of the table above. When users cannot be known, the failed access to /proc.
  ///          When a session could not be put back, the failed renameat2 (EEXIST: its old name was
  ///          taken meanwhile): the directory is then at path. Its id is the name of that, but a
  ///          session on a volume keeps its old id if it had one.
  KOVA_NODISCARD bool remove(const SessionInfo &session, Error &error,
                             const SessionRemoval &how = {});

  /// Removes every session that is at least that old, except foreign ones and those in use. A
  /// failure does not end it. The session root is created if there is something to remove in its
  /// absence.
  /// dryRun:  removes and creates nothing; removed holds what would be removed.
  /// Returns: true when no session of that age is left, except foreign ones. On false failed holds
  ///          what remains, and why: one Error for each session, as remove sets it, with EBUSY for
  ///          one in use; a single one for all sessions of an owner whose users cannot be known;
  ///          the failure of list.
  ///          Both lists are set in either case.
  KOVA_NODISCARD bool prune(std::chrono::seconds olderThan, bool dryRun,
                            std::vector<SessionInfo> &removed, std::vector<Error> &failed);

  /// Whether the functions that change something trust the session root.
  /// Returns: true when they do, also when it does not exist; on false error is set.
  bool trusted(Error &error);
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
