#ifndef KOVABACKUP_SERVICE_PROCESS_USES_H
#define KOVABACKUP_SERVICE_PROCESS_USES_H

/// @file What the processes of this machine have of sessions, as /proc shows it.
///
///     ProcessUses uses;
///     if (!uses.look(error)) return false;             // nothing can be known
///     if (!uses.isKnown(owner, error)) return false;   // of the sessions of this user
///     users = uses.usersOf(path);

#include "kovabackup/service/session_store.h"
#include "service/session_mounts.h"

#include <map>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <utility>
#include <vector>

namespace KOVA::Backup::Service {

class ProcessUses {
public:
  /// Looks once at every thread of every process. Paths without a component that begins as a
  /// session name does are not kept.
  /// Returns: false with error set when /proc does not show the processes.
  bool look(Error &error);

  /// Whether every process was examined that might use a session of this user.
  /// Returns: true; on false error is set to the access that failed.
  bool isKnown(uid_t owner, Error &error) const;

  /// The processes that use a directory or anything below it. folder has no links in it, since the
  /// kernel reports such paths. For a path that is too long to be reported only the device is
  /// known; its process counts as a user of every directory on that.
  std::vector<SessionUser> usersOf(const std::string &folder, dev_t device) const;

  /// The same for a directory of this name, wherever it is in the mount namespace of the process,
  /// even if it is mounted there under another name.
  /// Only for a name that was chosen just now, so that no other directory has it.
  std::vector<SessionUser> usersOfName(const std::string &name, dev_t device) const;

private:
  struct Use {
    pid_t pid;
    std::string path; // "": too long
    dev_t device;     // of such a path
  };

  // A process that could not be examined.
  struct Closed {
    std::vector<uid_t> owners; // empty: unknown
    Error error;
  };

  enum class Outcome { Seen, Ended, Refused };

  static Outcome outcomeOf(const Error &error);

  template <typename Matches>
  std::vector<SessionUser> usersWhere(dev_t device, Matches matches) const;
  void lookAtProcess(pid_t pid);
  Outcome lookAtThreads(pid_t pid, Error &error);
  Outcome lookAtThread(pid_t pid, const std::string &folder, bool &mapsSeen, Error &error);
  Outcome findMounts(const std::string &folder, Error &error);
  Outcome addFiles(pid_t pid, const std::string &folder, Error &error);
  Outcome addMappings(pid_t pid, const std::string &file, Error &error);
  Outcome addLink(pid_t pid, const std::string &link, Error &error);
  Outcome addDevice(pid_t pid, const std::string &link, Error &error);
  void add(pid_t pid, std::string_view path);

  using View = std::pair<std::string, std::string>; // a mount namespace and a root directory in it

  std::map<View, std::vector<SessionMount>> mounts_;
  const std::vector<SessionMount> *current_ = nullptr; // of the thread that is examined
  std::vector<Use> uses_;                              // those of one process are adjacent
  std::vector<Closed> closed_;
};

/// What SessionStore::users returns; on false error says why.
bool usersOf(const SessionInfo &session, std::vector<SessionUser> &out, Error &error);

/// A path without links; "" when it cannot be resolved, with errno as realpath(3) left it.
std::string realPathOf(const std::string &path);

} // namespace KOVA::Backup::Service

#endif
