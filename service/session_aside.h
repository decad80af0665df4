#ifndef KOVABACKUP_SERVICE_SESSION_ASIDE_H
#define KOVABACKUP_SERVICE_SESSION_ASIDE_H

/// @file A session that is out of reach under a fresh name until it is removed or put back.
///
///     local session    sess.A -> sess.B
///     volume session   link B is made, leading to a directory that does not exist yet;
///                      directory seln.D -> seln.B; link A leads nowhere from now on
///     lost session     the same without a link A
///
/// put back: the directory gets its old name, link A is made again if another process has removed
/// it as dangling, and link B is removed. If the old name has been taken, link B replaces link A.
///
/// removed: after the directory is gone, both links are removed.
///
/// If the process is killed at any step, at least one link leads to the directory, or it is lost,
/// and links that lead nowhere remain visible as dangling ones.

#include "base/unique_fd.h"
#include "service/folder_id.h"
#include "service/session_scan.h"

#include <string>

namespace KOVA::Backup::Service {

class SessionAside {
public:
  SessionAside() = default;
  ~SessionAside() { (void)putBack(); }
  SessionAside(const SessionAside &) = delete;
  SessionAside &operator=(const SessionAside &) = delete;

  /// Gives a session, or an entry of the session root that is broken, a fresh name.
  /// Returns: true; on false nothing has changed and error is set.
  bool take(const FoundSession &session, Error &error);

  /// Where the session is now, and the last component of that.
  const std::string &path() const { return to_; }
  const std::string &oldPath() const { return from_; }
  const std::string &name() const { return name_; }

  /// To be called before anything in the session is removed, which changes its modification time.
  void startRemoval() { removing_ = true; }

  /// Gives the session its old name back, and its modification time if a removal has started. Does
  /// nothing when no session is held.
  /// Returns: nothing, or what failed; the session then keeps its fresh name.
  Failed putBack() noexcept;

  /// Removes the links. To be called once the directory is gone.
  /// Returns: true; on false error is set.
  bool dropLinks(Error &error);

private:
  bool chooseNames(const FoundSession &session, Error &error);
  bool moveToFreshName(bool &taken, Error &error);
  Failed restoreTime() const noexcept;

  bool held_ = false;
  bool removing_ = false;
  std::string name_;
  std::string from_;
  std::string to_;
  std::string link_;      // "" when there is none
  std::string freshLink_; // "" for a local session
  struct timespec modified_ = {};
};

/// The lock of the session root, which makes renaming and looking one step for other stores.
class RootLock {
public:
  /// Waits for the lock. Returns: true; on false error is set.
  bool take(Error &error);
  void release();

  ~RootLock() { release(); }
  RootLock() = default;
  RootLock(const RootLock &) = delete;
  RootLock &operator=(const RootLock &) = delete;

private:
  Base::UniqueFd fd_;
};

} // namespace KOVA::Backup::Service

#endif
