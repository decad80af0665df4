#include "kovabackup/service/session_store.h"

#include "kovabackup/path_filter.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/tree_walk.h"
#include "service/process_uses.h"
#include "service/session_aside.h"
#include "service/session_names.h"
#include "service/session_removal.h"
#include "service/session_scan.h"

#include <cerrno>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

// A failure never replaces an earlier one.
void keepFirst(Error &error, const Error &failure) {
  error = error.code == 0 ? failure : error;
}

void count(const WalkEntry &entry, std::uint64_t &files, std::uint64_t &bytes) {
  if (!S_ISDIR(entry.mode)) {
    ++files;
    bytes += S_ISREG(entry.mode) ? entry.size : 0;
  }
}

// The first name below the session's directory.
std::string partOf(const std::string &path, const std::string &folder) {
  const std::size_t start = folder.size() + 1;
  if (path.size() < start) {
    return "";
  }
  return path.substr(start, path.find('/', start) - start);
}

void addPart(std::vector<SessionPart> &parts, const std::string &name, std::uint64_t bytes) {
  if (name.empty()) {
    return; // the session's directory itself
  }
  if (parts.empty() || parts.back().name != name) {
    parts.push_back({name, 0});
  }
  parts.back().bytes += bytes;
}

// Makes the session root if it does not exist.
bool openRoot(Error &error) {
  if (!isRootTrusted(error)) {
    return false;
  }
  struct stat info = {};
  const std::string root = sessionRoot();
  if (::lstat(root.c_str(), &info) == 0) {
    return true;
  }
  if (Path::createIpcTempPath("session", 0700).empty()) {
    error = {errno, "mkdir", root};
    return false;
  }
  return isRootTrusted(error);
}

bool mayAdopt(const FoundSession &lost, Error &error) {
  struct stat root = {};
  if (::lstat(sessionRoot().c_str(), &root) != 0) {
    error = {errno, "lstat", sessionRoot()};
    return false;
  }
  if (lost.status.st_uid != root.st_uid) {
    error = {EPERM, "refused", lost.info.path};
    return false;
  }
  return true;
}

// Links the name of the directory or, when that is taken, a fresh one.
bool linkLost(const std::string &path, std::string &id, Error &error) {
  std::string name = Path::basename(path);
  for (int tries = 0; tries < 10; ++tries) {
    const std::string link = Path::join(sessionRoot(), name);
    if (::symlink(path.c_str(), link.c_str()) == 0) {
      id.swap(name);
      return true;
    }
    error = {errno, "symlink", link};
    if (error.code != EEXIST || !chooseName(kVolumePrefix, name, error)) {
      return false;
    }
  }
  return false;
}

class Pruning {
public:
  Pruning(std::chrono::seconds olderThan, bool dryRun, std::vector<SessionInfo> &removed,
          std::vector<Error> &failed)
      : dryRun_(dryRun), removed_(removed), failed_(failed) {
    how_.olderThan = olderThan;
  }

  void run();

private:
  std::vector<SessionInfo> findStale();
  bool isFree(const FoundSession &found, const ProcessUses &uses);
  void remove(const SessionInfo &session);

  const bool dryRun_;
  SessionRemoval how_;
  std::vector<SessionInfo> &removed_;
  std::vector<Error> &failed_;
  std::set<uid_t> unknownOwners_; // for which that has been reported
};

bool Pruning::isFree(const FoundSession &found, const ProcessUses &uses) {
  if (!hasDirectory(found.info.state)) {
    return true;
  }
  Error error;
  if (!uses.isKnown(found.status.st_uid, error)) {
    if (unknownOwners_.insert(found.status.st_uid).second) {
      failed_.push_back(error);
    }
    return false;
  }
  const std::string path = realPathOf(found.info.path);
  if (!path.empty() && !uses.usersOf(path, found.status.st_dev).empty()) {
    failed_.push_back({EBUSY, "refused", found.info.path});
    return false;
  }
  return true;
}

// One look sorts out what is in use. It is taken together with the list, so that a store that is
// removing one of these sessions under a fresh name is seen in it.
std::vector<SessionInfo> Pruning::findStale() {
  std::vector<SessionInfo> stale;
  std::vector<FoundSession> all;
  RootLock lock;
  Error error;
  struct stat info = {};
  const bool lockable = !dryRun_ && ::lstat(sessionRoot().c_str(), &info) == 0;
  if (lockable && !lock.take(error)) {
    failed_.push_back(error);
    return stale;
  }
  if (!findAll(all, error)) {
    failed_.push_back(error);
  }
  ProcessUses uses;
  if (!uses.look(error)) {
    failed_.push_back(error);
    return stale;
  }
  for (const FoundSession &found : all) {
    if (found.failure.code != 0) { // its directory may be of any age
      failed_.push_back(found.failure);
    } else if (found.info.state != State::Foreign && found.info.age >= how_.olderThan &&
               isFree(found, uses)) {
      stale.push_back(found.info);
    }
  }
  return stale;
}

void Pruning::remove(const SessionInfo &session) {
  Error error;
  const Outcome outcome = removeSession(session, how_, error);
  if (outcome == Outcome::Removed) {
    removed_.push_back(session);
  } else if (outcome == Outcome::Failed) {
    failed_.push_back(error);
  }
}

void Pruning::run() {
  Error error;
  if (!dryRun_ && !isRootTrusted(error)) {
    failed_.push_back(error);
    return;
  }
  std::vector<SessionInfo> stale = findStale();
  if (dryRun_) {
    removed_ = std::move(stale);
    return;
  }
  if (!stale.empty() && !openRoot(error)) {
    failed_.push_back(error);
    return;
  }
  for (const SessionInfo &session : stale) {
    remove(session);
  }
}

} // namespace

bool SessionStore::isId(const std::string &id) {
  return isSessionName(id, kLocalPrefix) || isSessionName(id, kVolumePrefix);
}

std::string SessionStore::root() {
  return sessionRoot();
}

bool SessionStore::list(std::vector<SessionInfo> &out, Error &error) {
  std::vector<FoundSession> all;
  const bool complete = findAll(all, error);
  out.clear();
  for (FoundSession &found : all) {
    out.push_back(std::move(found.info));
  }
  return complete;
}

bool SessionStore::find(const std::string &id, SessionInfo &out, Error &error) {
  if (!isId(id)) {
    error = {EINVAL, "refused", id};
    return false;
  }
  FoundSession found;
  const Search search = findEntry(id, found, error);
  if (search == Search::Absent) {
    error = {ENOENT, "lstat", Path::join(sessionRoot(), id)};
  }
  if (search == Search::Found) {
    out = std::move(found.info);
  }
  return search == Search::Found;
}

bool SessionStore::users(const SessionInfo &session, std::vector<SessionUser> &out) {
  Error error;
  return usersOf(session, out, error);
}

bool SessionStore::size(const SessionInfo &session, std::uint64_t &files, std::uint64_t &bytes,
                        Error &error, std::vector<SessionPart> *parts) {
  files = 0;
  bytes = 0;
  if (parts != nullptr) {
    parts->clear();
  }
  if (!hasDirectory(session.state)) {
    return true;
  }
  PathFilter all;
  WalkOptions options;
  options.oneFileSystem = true;
  TreeWalk walk(session.path, all, options);
  Error first;
  for (WalkEntry entry; walk.next(entry);) {
    const std::uint64_t before = bytes;
    if (entry.error.code != 0) {
      keepFirst(first, entry.error);
    } else {
      count(entry, files, bytes);
    }
    if (parts != nullptr) {
      addPart(*parts, partOf(entry.path, session.path), bytes - before);
    }
  }
  error = first.code != 0 ? first : error;
  return first.code == 0;
}

bool SessionStore::adopt(const SessionInfo &lost, std::string &id, Error &error) {
  RootLock lock;
  FoundSession found;
  if (!openRoot(error) || !lock.take(error)) {
    return false;
  }
  const Search search =
      lost.state == State::Lost ? findLost(lost.path, found, error) : Search::Absent;
  if (search == Search::Absent) {
    error = {EINVAL, "refused", lost.path};
  }
  return search == Search::Found && mayAdopt(found, error) && linkLost(lost.path, id, error);
}

bool SessionStore::remove(const SessionInfo &session, Error &error, const SessionRemoval &how) {
  struct stat info = {};
  const bool rootless = ::lstat(sessionRoot().c_str(), &info) != 0 && errno == ENOENT;
  if (rootless && session.state != State::Lost) {
    return true;
  }
  if (!openRoot(error)) {
    return false;
  }
  const Outcome outcome = removeUnused(session, how, error);
  return outcome == Outcome::Removed || outcome == Outcome::Gone;
}

bool SessionStore::prune(std::chrono::seconds olderThan, bool dryRun,
                         std::vector<SessionInfo> &removed, std::vector<Error> &failed) {
  removed.clear();
  failed.clear();
  Pruning(olderThan, dryRun, removed, failed).run();
  return failed.empty();
}

bool SessionStore::trusted(Error &error) {
  return isRootTrusted(error);
}

} // namespace KOVA::Backup::Service
