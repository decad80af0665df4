#include "service/session_aside.h"

#include "base/retry_on_eintr.h"
#include "kovabackup/path_util.h"
#include "service/session_names.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

// Some file systems cannot rename without replacing, and some filters of system calls do not let
// the call pass; they report ENOSYS or EPERM. A name that was free a moment ago is taken now only
// when another process has chosen the same random one, and rename(2) replaces nothing but an empty
// directory by a directory.
int renameToFree(const char *from, const char *to) noexcept {
  if (::renameat2(AT_FDCWD, from, AT_FDCWD, to, RENAME_NOREPLACE) == 0) {
    return 0;
  }
  if (errno != EINVAL && errno != ENOSYS && errno != EPERM) {
    return errno;
  }
  struct stat info = {};
  if (::lstat(to, &info) == 0) {
    return EEXIST;
  }
  return errno == ENOENT && ::rename(from, to) == 0 ? 0 : errno;
}

bool isSame(const struct stat &one, const struct stat &other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

} // namespace

bool SessionAside::chooseNames(const FoundSession &session, Error &error) {
  const SessionInfo &info = session.info;
  const std::string entry = Path::join(sessionRoot(), info.id);
  from_ = hasDirectory(info.state) ? info.path : entry;
  link_ = info.onVolume && info.state == State::Complete ? entry : "";
  if (!chooseName(info.onVolume ? kVolumePrefix : kLocalPrefix, name_, error)) {
    return false;
  }
  to_ = Path::join(Path::dirname(from_), name_);
  const bool onVolume = info.onVolume && hasDirectory(info.state);
  freshLink_ = onVolume ? Path::join(sessionRoot(), name_) : "";
  return true;
}

// taken: whether it failed because another session has the fresh name.
bool SessionAside::moveToFreshName(bool &taken, Error &error) {
  taken = false;
  if (!freshLink_.empty() && ::symlink(to_.c_str(), freshLink_.c_str()) != 0) {
    error = {errno, "symlink", freshLink_};
    taken = error.code == EEXIST;
    return false;
  }
  const int code = renameToFree(from_.c_str(), to_.c_str());
  held_ = code == 0;
  if (!held_) {
    if (!freshLink_.empty()) {
      (void)::unlink(freshLink_.c_str()); // if that fails, a dangling link remains, which is listed
    }
    error = {code, "renameat2", from_};
    taken = code == EEXIST;
  }
  return held_;
}

bool SessionAside::take(const FoundSession &session, Error &error) {
  modified_ = session.status.st_mtim;
  bool taken = true;
  for (int tries = 0; taken && tries < 10; ++tries) {
    if (!chooseNames(session, error)) {
      return false;
    }
    (void)moveToFreshName(taken, error);
  }
  if (!held_) {
    return false;
  }
  struct stat now = {};
  const int code = ::lstat(to_.c_str(), &now) == 0 ? 0 : errno;
  if (code == 0 && isSame(now, session.status)) {
    return true;
  }
  error = code != 0 ? Error{code, "lstat", to_} : Error{ESTALE, "refused", from_};
  (void)putBack();
  return false;
}

// A lost session that counts as young would not be listed.
Failed SessionAside::restoreTime() const noexcept {
  const timespec times[] = {{0, UTIME_OMIT}, modified_};
  const bool restored =
      !removing_ || ::utimensat(AT_FDCWD, to_.c_str(), times, AT_SYMLINK_NOFOLLOW) == 0;
  const bool lost = link_.empty() && !freshLink_.empty();
  return {"utimensat", restored || !lost ? 0 : errno};
}

Failed SessionAside::putBack() noexcept {
  if (!held_) {
    return {};
  }
  held_ = false;
  Failed failed = restoreTime();
  if (!failed) {
    failed = {"renameat2", renameToFree(to_.c_str(), from_.c_str())};
  }
  if (failed) {
    if (!link_.empty()) {
      (void)::rename(freshLink_.c_str(), link_.c_str()); // else both remain, and both are listed
    }
    return failed;
  }
  if (!link_.empty() && ::symlink(from_.c_str(), link_.c_str()) != 0 && errno != EEXIST) {
    return {}; // the session keeps its directory, which is listed as lost
  }
  if (!freshLink_.empty()) {
    (void)::unlink(freshLink_.c_str()); // else a dangling link remains, which is listed
  }
  return {};
}

bool SessionAside::dropLinks(Error &error) {
  held_ = false;
  bool dropped = true;
  for (const std::string &link : {link_, freshLink_}) {
    if (!link.empty() && ::unlink(link.c_str()) != 0 && errno != ENOENT && dropped) {
      error = {errno, "unlink", link};
      dropped = false;
    }
  }
  return dropped;
}

bool RootLock::take(Error &error) {
  const std::string root = sessionRoot();
  const int flags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
  Base::UniqueFd fd(Base::retryOnEintr([&] { return ::open(root.c_str(), flags); }));
  if (!fd) {
    error = {errno, "open", root};
    return false;
  }
  if (Base::retryOnEintr([&] { return ::flock(fd.get(), LOCK_EX); }) != 0) {
    error = {errno, "flock", root};
    return false;
  }
  fd_ = std::move(fd);
  return true;
}

// Unlocked before it is closed: a child that was forked meanwhile has a copy of the descriptor.
void RootLock::release() {
  if (fd_) {
    (void)::flock(fd_.get(), LOCK_UN);
    fd_.reset();
  }
}

} // namespace KOVA::Backup::Service
