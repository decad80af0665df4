#include "check.h"

#include <kovabackup/service/session_store.h>
#include <kovabackup/session.h>
#include <kovabackup/temp_manager.h>

#include <cerrno>
#include <chrono>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

namespace {

void callLooks(const std::string &id, const std::string &path) {
  SessionStore store;
  Error error;
  check(SessionStore::isId(id) && !SessionStore::isId("sess"), "isId");
  check(path == SessionStore::root() + "/" + id && store.trusted(error), "root, trusted");
  SessionInfo found;
  check(store.find(id, found, error) && found.path == path, "find");
  std::vector<SessionInfo> all;
  check(store.list(all, error) && all.size() == 1 && all[0].id == id, "list");
  std::vector<SessionUser> users;
  const int fd = ::open((path + "/data").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  check(::write(fd, "text", 4) == 4, "a file in the session");
  check(store.users(found, users) && users.size() == 1 && users[0].pid == ::getpid(), "users");
  ::close(fd);
  std::uint64_t files = 0;
  std::uint64_t bytes = 0;
  std::vector<SessionPart> parts;
  check(store.size(found, files, bytes, error, &parts) && files == 1 && bytes == 4 &&
            parts.size() == 1,
        "size");
}

void callRemoval(const std::string &id, const std::string &path) {
  SessionStore store;
  Error error;
  SessionInfo found;
  check(store.find(id, found, error), "find");
  std::vector<SessionInfo> removed;
  std::vector<Error> failed;
  check(store.prune(std::chrono::hours(1), true, removed, failed) && removed.empty(), "prune");
  SessionRemoval how;
  how.evenInUse = true;
  check(store.remove(found, error, how) && ::access(path.c_str(), F_OK) != 0, "remove");
}

// A directory on a volume without a link, as a restart of the machine leaves it.
void callAdopt() {
  Session made;
  check(made.create(TempManager::sameVolume("/mnt")), "a session on a volume");
  const std::string path = made.getPath();
  const struct timespec old[2] = {{0, UTIME_OMIT}, {1000000000, 0}};
  check(::unlink((SessionStore::root() + "/" + made.getId()).c_str()) == 0 &&
            ::utimensat(AT_FDCWD, path.c_str(), old, 0) == 0,
        "a lost session");
  SessionStore store;
  std::vector<SessionInfo> all;
  Error error;
  std::string id;
  check(store.list(all, error) && all.size() == 1 && all[0].state == SessionInfo::State::Lost,
        "list: a lost session");
  check(!all.empty() && store.adopt(all[0], id, error) && SessionStore::isId(id), "adopt");
  check(Session::destroyById(id), "the adopted session");
}

} // namespace

void callSessions() {
  Session made;
  check(made.create(), "a session");
  callLooks(made.getId(), made.getPath());
  callRemoval(made.getId(), made.getPath());
  callAdopt();
}
