#include "service/process_uses.h"

#include "service/absence.h"
#include "service/file_text.h"
#include "service/process_facts.h"
#include "service/session_mounts.h"
#include "service/session_scan.h"
#include "service/words.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <memory>
#include <string_view>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

constexpr const char *kProc = "/proc";
constexpr pid_t kInit = 1;

bool isDenied(int code) {
  return code == EACCES || code == EPERM;
}

// Calls use(name) for each name in a folder that begins with a digit.
// Returns: 0, or errno of the call that failed, which is named in step.
template <typename Use>
int forEachNumber(const std::string &folder, std::string &step, Use use) {
  const std::unique_ptr<DIR, int (*)(DIR *)> dir(::opendir(folder.c_str()), &::closedir);
  step = "opendir";
  if (!dir) {
    return errno;
  }
  step = "readdir";
  for (;;) {
    errno = 0;
    const dirent *entry = ::readdir(dir.get());
    if (entry == nullptr) {
      return errno;
    }
    if (entry->d_name[0] >= '0' && entry->d_name[0] <= '9') {
      use(entry->d_name);
    }
  }
}

bool readLink(const std::string &link, std::string &out, Error &error) {
  std::array<char, PATH_MAX> target{};
  const ssize_t length = ::readlink(link.c_str(), target.data(), target.size());
  if (length < 0) {
    error = {errno, "readlink", link};
    return false;
  }
  out.assign(target.data(), static_cast<std::size_t>(length));
  return true;
}

bool hasComponent(const std::string &path, const std::string &name) {
  const std::string start = "/" + name;
  for (std::size_t at = path.find(start); at != std::string::npos; at = path.find(start, at + 1)) {
    const std::size_t end = at + start.size();
    if (end == path.size() || path[end] == '/') {
      return true;
    }
  }
  return false;
}

// The real, effective, saved and file system user of a process. Even the file system user alone may
// open what belongs to it. Empty: they cannot be read.
std::vector<uid_t> ownersOf(const std::string &process, bool &ended) {
  std::string text;
  Error error;
  const bool read = readFileText(process + "/status", text, error);
  ended = !read && isEndOfProcess(error.code);
  std::vector<uid_t> owners;
  std::size_t at = text.find("\nUid:");
  if (at == std::string::npos) {
    return owners;
  }
  std::string_view rest = std::string_view(text).substr(at + 5);
  rest = takeLine(rest);
  while (!rest.empty()) {
    rest.remove_prefix(1); // a tab
    uid_t owner = 0;
    const std::string_view word = rest.substr(0, rest.find('\t'));
    if (!parseInteger(word, owner)) {
      return {};
    }
    owners.push_back(owner);
    rest.remove_prefix(word.size());
  }
  return owners;
}

// Whether a process is in another user namespace than this one. Each has a map of its own.
bool isOutside(const std::string &process) {
  const std::string path = process + "/uid_map";
  const std::string ownPath = std::string(kProc) + "/self/uid_map";
  std::string map;
  std::string ownMap;
  Error ignored; // then it may be in the same one
  return readFileText(path, map, ignored) && readFileText(ownPath, ownMap, ignored) &&
         map != ownMap;
}

std::string commandOf(pid_t pid) {
  ProcessFacts facts;
  (void)findProcess(pid, facts); // without a name when it has ended
  return facts.command;
}

} // namespace

// /proc/self is the process itself as this /proc numbers it. Without it, or without an entry of
// that name, this is not a /proc of this process. Process 1 always exists; a /proc that does not
// show it hides processes.
bool ProcessUses::look(Error &error) {
  uses_.clear();
  closed_.clear();
  mounts_.clear();
  std::array<char, 32> self{};
  if (::readlink("/proc/self", self.data(), self.size() - 1) < 0) {
    error = {errno, "readlink", "/proc/self"};
    return false;
  }
  struct stat info = {};
  if (::lstat("/proc/1", &info) != 0) {
    error = {errno, "lstat", "/proc/1"};
    return false;
  }
  bool selfSeen = false;
  std::string step;
  const int code = forEachNumber(kProc, step, [&](const char *name) {
    selfSeen = selfSeen || std::strcmp(name, self.data()) == 0;
    lookAtProcess(static_cast<pid_t>(std::strtol(name, nullptr, 10)));
  });
  if (code != 0 || !selfSeen) {
    error = {code != 0 ? code : ENOENT, step, kProc};
    return false;
  }
  return true;
}

ProcessUses::Outcome ProcessUses::outcomeOf(const Error &error) {
  return isEndOfProcess(error.code) ? Outcome::Ended : Outcome::Refused;
}

void ProcessUses::lookAtProcess(pid_t pid) {
  Error error;
  if (lookAtThreads(pid, error) != Outcome::Refused) {
    return;
  }
  if (!isDenied(error.code)) { // a lack of descriptors, for instance, says nothing of the process
    closed_.push_back({{}, std::move(error)});
    return;
  }
  const std::string folder = std::string(kProc) + "/" + std::to_string(pid);
  bool ended = false;
  std::vector<uid_t> owners = ownersOf(folder, ended);
  if (!ended && pid != kInit && !isOutside(folder)) {
    closed_.push_back({std::move(owners), std::move(error)});
  }
}

// Each thread is examined. One may have unshared its descriptors or its working directory, and the
// first may have ended while the others continue; nothing is shown for it then.
ProcessUses::Outcome ProcessUses::lookAtThreads(pid_t pid, Error &error) {
  const std::string folder = std::string(kProc) + "/" + std::to_string(pid) + "/task";
  Outcome outcome = Outcome::Seen;
  bool mapsSeen = false;
  std::string step;
  const int code = forEachNumber(folder, step, [&](const char *name) {
    if (outcome != Outcome::Refused &&
        lookAtThread(pid, folder + "/" + name + "/", mapsSeen, error) == Outcome::Refused) {
      outcome = Outcome::Refused;
    }
  });
  if (code != 0 && !isEndOfProcess(code)) {
    error = {code, step, folder};
    return Outcome::Refused;
  }
  return outcome;
}

// The mappings of a process are those of each thread, so one that still has any is enough.
ProcessUses::Outcome ProcessUses::lookAtThread(pid_t pid, const std::string &folder, bool &mapsSeen,
                                               Error &error) {
  Outcome outcome = findMounts(folder, error);
  if (outcome != Outcome::Seen) {
    return outcome;
  }
  for (const char *link : {"cwd", "root", "exe"}) {
    const Outcome one = addLink(pid, folder + link, error);
    const bool noProgram = one == Outcome::Ended && std::strcmp(link, "exe") == 0; // of the kernel
    if (one != Outcome::Seen && !noProgram) {
      return one;
    }
  }
  outcome = addFiles(pid, folder + "fd", error);
  if (outcome == Outcome::Seen && !mapsSeen) {
    outcome = addMappings(pid, folder + "maps", error);
    mapsSeen = outcome == Outcome::Seen;
  }
  return outcome;
}

// The points in mountinfo are relative to the root directory of the thread, unlike the paths that
// links show. So each mount namespace is read once for every root directory in it. A root directory
// that cannot be read, also because its path is too long, leaves the mounts unknown. EINVAL: the
// thread has just left the namespace.
ProcessUses::Outcome ProcessUses::findMounts(const std::string &folder, Error &error) {
  std::string space;
  std::string root;
  if (!readLink(folder + "ns/mnt", space, error) || !readLink(folder + "root", root, error)) {
    return outcomeOf(error);
  }
  auto found = mounts_.find({space, root});
  if (found == mounts_.end()) {
    std::string text;
    if (!readFileText(folder + "mountinfo", text, error)) {
      return error.code == EINVAL ? Outcome::Ended : outcomeOf(error);
    }
    std::vector<SessionMount> mounts = findSessionMounts(text, root);
    found = mounts_.emplace(std::make_pair(space, root), std::move(mounts)).first;
  }
  current_ = &found->second;
  return Outcome::Seen;
}

ProcessUses::Outcome ProcessUses::addFiles(pid_t pid, const std::string &folder, Error &error) {
  Outcome outcome = Outcome::Seen;
  std::string step;
  const int code = forEachNumber(folder, step, [&](const char *name) {
    if (outcome != Outcome::Refused && // a descriptor may be closed meanwhile
        addLink(pid, folder + "/" + name, error) == Outcome::Refused) {
      outcome = Outcome::Refused;
    }
  });
  if (code != 0) {
    error = {code, step, folder};
    return outcomeOf(error);
  }
  return outcome;
}

// The path is the last field of a line and the only one with a slash.
ProcessUses::Outcome ProcessUses::addMappings(pid_t pid, const std::string &file, Error &error) {
  std::string text;
  if (!readFileText(file, text, error)) {
    return outcomeOf(error);
  }
  for (std::string_view rest = text; !rest.empty();) {
    const std::string_view line = takeLine(rest);
    const std::size_t slash = line.find('/');
    if (slash != std::string_view::npos) {
      add(pid, line.substr(slash));
    }
  }
  return Outcome::Seen;
}

ProcessUses::Outcome ProcessUses::addLink(pid_t pid, const std::string &link, Error &error) {
  std::string target;
  if (!readLink(link, target, error)) {
    return error.code == ENAMETOOLONG ? addDevice(pid, link, error) : outcomeOf(error);
  }
  if (target.compare(0, 1, "/") == 0) { // pipes and sockets have names without one
    add(pid, target);
  }
  return Outcome::Seen;
}

ProcessUses::Outcome ProcessUses::addDevice(pid_t pid, const std::string &link, Error &error) {
  struct stat info = {};
  if (::stat(link.c_str(), &info) != 0) {
    error = {errno, "stat", link};
    return outcomeOf(error);
  }
  uses_.push_back({pid, "", info.st_dev});
  return Outcome::Seen;
}

// Mounts can lie within or over one another, and their order does not show which one the path is
// on. So it counts as a path on each of them; a use too many only keeps a session for longer.
void ProcessUses::add(pid_t pid, std::string_view path) {
  if (hasSessionComponent(path)) {
    uses_.push_back({pid, std::string(path), 0});
  }
  for (const SessionMount &mount : *current_) {
    if (isWithin(path, mount.point)) {
      uses_.push_back({pid, mount.root + std::string(path.substr(mount.point.size())), 0});
    }
  }
}

bool ProcessUses::isKnown(uid_t owner, Error &error) const {
  const bool isRoot = ::geteuid() == 0;
  for (const Closed &closed : closed_) {
    const auto matters = [&](uid_t uid) { return uid == owner || (isRoot && uid == 0); };
    if (closed.owners.empty() || std::any_of(closed.owners.begin(), closed.owners.end(), matters)) {
      error = closed.error;
      return false;
    }
  }
  return true;
}

template <typename Matches>
std::vector<SessionUser> ProcessUses::usersWhere(dev_t device, Matches matches) const {
  std::vector<SessionUser> users;
  for (const Use &use : uses_) {
    const bool listed = !users.empty() && users.back().pid == use.pid;
    if (!listed && (use.path.empty() ? use.device == device : matches(use.path))) {
      users.push_back({use.pid, commandOf(use.pid)});
    }
  }
  return users;
}

std::vector<SessionUser> ProcessUses::usersOf(const std::string &folder, dev_t device) const {
  return usersWhere(device, [&](const std::string &path) { return isWithin(path, folder); });
}

std::vector<SessionUser> ProcessUses::usersOfName(const std::string &name, dev_t device) const {
  return usersWhere(device, [&](const std::string &path) { return hasComponent(path, name); });
}

std::string realPathOf(const std::string &path) {
  const std::unique_ptr<char, void (*)(void *)> real(::realpath(path.c_str(), nullptr), &std::free);
  return real ? real.get() : "";
}

bool usersOf(const SessionInfo &session, std::vector<SessionUser> &out, Error &error) {
  out.clear();
  if (!hasDirectory(session.state)) {
    return true;
  }
  struct stat info = {};
  const std::string path = realPathOf(session.path);
  if (path.empty() || ::lstat(path.c_str(), &info) != 0) {
    error = {errno, path.empty() ? "realpath" : "lstat", session.path};
    return isEndOfProcess(error.code); // what does not exist has no users
  }
  ProcessUses uses;
  if (!uses.look(error) || !uses.isKnown(info.st_uid, error)) {
    return false;
  }
  out = uses.usersOf(path, info.st_dev);
  return true;
}

} // namespace KOVA::Backup::Service
