#include "service/session_removal.h"

#include "kovabackup/path_util.h"
#include "kovabackup/service/tree_removal.h"
#include "service/process_uses.h"
#include "service/session_aside.h"
#include "service/session_lost.h"
#include "service/session_names.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

// An absent lost directory may have been adopted, so it counts as changed while it exists.
// Returns: Removed when the session is still as it was listed, and is to be removed.
Outcome findAgain(const SessionInfo &session, FoundSession &found, Error &error) {
  const bool lost = session.state == State::Lost;
  const Search search =
      lost ? findLost(session.path, found, error) : findEntry(session.id, found, error);
  if (search == Search::Failed) {
    return Outcome::Failed;
  }
  struct stat info = {};
  if (search == Search::Absent && !(lost && ::lstat(session.path.c_str(), &info) == 0)) {
    return Outcome::Gone;
  }
  if (search == Search::Found && found.failure.code != 0) {
    error = found.failure;
    return Outcome::Failed;
  }
  if (search == Search::Found && found.info.state == session.state &&
      found.info.path == session.path) {
    return Outcome::Removed;
  }
  error = {ESTALE, "refused", lost ? session.path : Path::join(sessionRoot(), session.id)};
  return Outcome::Failed;
}

bool isUnused(const std::vector<SessionUser> &users, const std::string &path, Error &error) {
  if (!users.empty()) {
    error = {EBUSY, "refused", path};
  }
  return users.empty();
}

// One look while the session has its fresh name.
bool isLeft(const FoundSession &found, const SessionAside &aside, Error &error) {
  ProcessUses uses;
  return uses.look(error) && uses.isKnown(found.status.st_uid, error) &&
         isUnused(uses.usersOfName(aside.name(), found.status.st_dev), found.info.path, error);
}

// Loading a session sets its time; a process may have done so just before it was renamed.
bool isOld(const FoundSession &found, const SessionAside &aside, std::chrono::seconds age,
           Error &error) {
  struct stat now = {};
  if (::lstat(aside.path().c_str(), &now) != 0) {
    error = {errno, "lstat", aside.path()};
    return false;
  }
  if (ageOf(now) < age) {
    error = {EAGAIN, "refused", found.info.path};
    return false;
  }
  return true;
}

// The name of an entry, so that it leads to nothing outside the session.
bool isPart(const std::string &name) {
  return !name.empty() && name != "." && name != ".." && name.find('/') == std::string::npos;
}

// TreeRemoval empties what is mounted at the path that it is given, so such a part is left to the
// removal of the session itself, which reports it.
bool isMountPoint(const std::string &path) {
  struct statx found = {};
  return ::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_TYPE,
                 &found) != 0 ||
         (found.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

bool removeTree(const SessionAside &aside, const SessionRemoval &how, Error &error) {
  bool failed = false;
  const TreeRemoval::Report report = [&](const Error &failure) {
    error = failed ? error : failure;
    failed = true;
  };
  for (const SessionPart &part : how.parts) {
    const std::string path = Path::join(aside.path(), part.name);
    const bool gone = isPart(part.name) && !isMountPoint(path) && TreeRemoval::remove(path, report);
    if (gone && how.gone) {
      how.gone(part.bytes);
    }
  }
  return TreeRemoval::remove(aside.path(), report);
}

// What is left is reported under the name that it has now.
void renameIn(Error &error, const std::string &from, const std::string &to) {
  if (error.path.compare(0, from.size(), from) == 0) {
    error.path.replace(0, from.size(), to);
  }
}

Outcome putBack(SessionAside &aside, Error &error) {
  const Failed failed = aside.putBack();
  if (failed) {
    error = {failed.code, failed.step, aside.path()};
  }
  return Outcome::Failed;
}

Outcome removeAside(SessionAside &aside, const FoundSession &found, const SessionRemoval &how,
                    RootLock &lock, Error &error) {
  if ((!how.evenInUse && !isLeft(found, aside, error)) ||
      (how.olderThan.count() > 0 && !isOld(found, aside, how.olderThan, error))) {
    return putBack(aside, error);
  }
  constexpr int kFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
  const Base::UniqueFd mark(::open(aside.path().c_str(), kFlags));
  if (!mark) {
    error = {errno, "open", aside.path()};
    return putBack(aside, error);
  }
  lock.release();
  aside.startRemoval();
  if (!removeTree(aside, how, error)) {
    renameIn(error, aside.path(), aside.oldPath());
    return putBack(aside, error);
  }
  return aside.dropLinks(error) ? Outcome::Removed : Outcome::Failed;
}

Outcome removeLink(const std::string &id, Error &error) {
  const std::string link = Path::join(sessionRoot(), id);
  if (::unlink(link.c_str()) == 0) {
    return Outcome::Removed;
  }
  if (errno == ENOENT) {
    return Outcome::Gone;
  }
  error = {errno, "unlink", link};
  return Outcome::Failed;
}

Outcome removeFound(const FoundSession &found, const SessionRemoval &how, RootLock &lock,
                    Error &error) {
  if (found.info.state == State::Foreign) {
    error = {EINVAL, "refused", Path::join(sessionRoot(), found.info.id)};
    return Outcome::Failed;
  }
  if (found.info.age < how.olderThan) {
    error = {EAGAIN, "refused", found.info.path};
    return Outcome::Failed;
  }
  if (found.info.state == State::Dangling) {
    return removeLink(found.info.id, error);
  }
  SessionAside aside;
  return aside.take(found, error) ? removeAside(aside, found, how, lock, error) : Outcome::Failed;
}

Outcome removeLocked(const SessionInfo &session, const SessionRemoval &how, RootLock &lock,
                     Error &error) {
  FoundSession found;
  const Outcome outcome = findAgain(session, found, error);
  return outcome == Outcome::Removed ? removeFound(found, how, lock, error) : outcome;
}

} // namespace

Outcome removeSession(const SessionInfo &session, const SessionRemoval &how, Error &error) {
  RootLock lock;
  return lock.take(error) ? removeLocked(session, how, lock, error) : Outcome::Failed;
}

Outcome removeUnused(const SessionInfo &session, const SessionRemoval &how, Error &error) {
  RootLock lock;
  if (!lock.take(error)) {
    return Outcome::Failed;
  }
  std::vector<SessionUser> users;
  if (!how.evenInUse &&
      (!usersOf(session, users, error) || !isUnused(users, session.path, error))) {
    return Outcome::Failed;
  }
  return removeLocked(session, how, lock, error);
}

} // namespace KOVA::Backup::Service
