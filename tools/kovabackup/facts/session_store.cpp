#include "tools/kovabackup/facts/session_store.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tools/kovabackup/facts/directory.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <fmt/format.h>
#include <fts.h>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kPrefixBytes = 5; // "sess." and "seln."
constexpr std::size_t kRandomBytes = 6;

// Not isalnum(3), whose answer depends on the locale: mkdtemp(3) and mkstemp(3), from which the ids
// come, use ASCII letters and digits only.
bool isAsciiAlphanumeric(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}

bool isSessionName(const std::string &name, const char *prefix) {
  return name.size() == kPrefixBytes + kRandomBytes && name.compare(0, kPrefixBytes, prefix) == 0 &&
         std::all_of(name.begin() + kPrefixBytes, name.end(), isAsciiAlphanumeric);
}

// The clock may have been set back: a modification time in the future counts as now.
std::chrono::seconds ageOf(const struct stat &info) {
  return std::chrono::seconds(std::max<std::time_t>(std::time(nullptr) - info.st_mtime, 0));
}

// A local session is a directory in the session root itself; no link leads to it.
void examineLocal(SessionEntry &entry, const struct stat &info) {
  entry.path = Path::join(sessionRoot(), entry.id);
  if (S_ISDIR(info.st_mode)) {
    entry.state = SessionState::Intact;
  } else {
    entry.state = SessionState::Broken;
    entry.problem = "not a directory";
  }
}

// A link that the library created holds an absolute path whose last component is a session name.
// Session::destroy removes whatever a link points to, so other links must be recognised here.
bool pointsToSessionName(const std::string &target) {
  return !target.empty() && target[0] == '/' && isSessionName(Path::basename(target), "seln.");
}

void examineVolume(SessionEntry &entry, const struct stat &info) {
  if (!S_ISLNK(info.st_mode)) {
    entry.state = SessionState::Broken;
    entry.problem = "not a symbolic link";
    return;
  }
  entry.path = Session::getPathById(entry.id);
  struct stat target;
  if (!pointsToSessionName(entry.path)) {
    entry.state = SessionState::Foreign;
    entry.problem =
        fmt::format("the link points to '{}', which is not a session directory", entry.path);
  } else if (::lstat(entry.path.c_str(), &target) != 0) {
    // A target that cannot be examined may be anything, so it is not offered for removal.
    const bool gone = errno == ENOENT || errno == ENOTDIR;
    entry.state = gone ? SessionState::Dangling : SessionState::Foreign;
    entry.problem = gone ? "the target of the link does not exist" : std::strerror(errno);
  } else if (!S_ISDIR(target.st_mode)) {
    entry.state = SessionState::Foreign;
    entry.problem = fmt::format("the link points to '{}', which is not a directory", entry.path);
  } else {
    entry.state = SessionState::Intact;
    entry.age = ageOf(target);
  }
}

// A directory is visited twice, before and after its contents, and counted at neither visit.
void count(const FTSENT &item, TreeSize &size) {
  switch (item.fts_info) {
  case FTS_D:
  case FTS_DP:
    break;
  case FTS_DNR: // a directory that cannot be read
  case FTS_ERR: // an entry that cannot be examined, as is FTS_NS
  case FTS_NS:
    size.complete = false;
    break;
  default:
    ++size.files;
    size.bytes +=
        S_ISREG(item.fts_statp->st_mode) ? static_cast<std::uint64_t>(item.fts_statp->st_size) : 0;
  }
}

} // namespace

bool lookUpSession(const std::string &id, SessionEntry &entry) {
  struct stat info;
  if (::lstat(Path::join(sessionRoot(), id).c_str(), &info) != 0) {
    if (errno == ENOENT || errno == ENOTDIR) {
      return false;
    }
    throw Failure(kFailed, fmt::format("cannot access session {}: {}", id, reason(errno)));
  }
  entry.id = id;
  entry.volume = isSessionName(id, "seln.");
  entry.age = ageOf(info); // of the link, for a volume session without an intact directory
  if (entry.volume) {
    examineVolume(entry, info);
  } else {
    examineLocal(entry, info);
  }
  return true;
}

std::string sessionRoot() {
  return Path::join(Path::getIpcTempPath(), "session");
}

bool isSessionId(const std::string &id) {
  return isSessionName(id, "sess.") || isSessionName(id, "seln.");
}

void requireSessionId(const std::string &id) {
  if (!isSessionId(id)) {
    throw Failure(kUsage, fmt::format("'{}' is not a session id: expected sess. or seln. and six "
                                      "letters or digits",
                                      id));
  }
}

std::chrono::seconds requireAge(const std::string &text) {
  const std::optional<std::chrono::seconds> age = parseAge(text);
  if (!age) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid age: expected a number and s, m, h, d "
                                      "or w, as in 7d",
                                      text));
  }
  return *age;
}

std::vector<SessionEntry> listSessions() {
  std::vector<SessionEntry> entries;
  const std::string root = sessionRoot();
  const Directory dir = openDirectory(root);
  if (!dir) {
    if (errno == ENOENT) {
      return entries;
    }
    throw Failure(kFailed, fmt::format("cannot read {}: {}", root, reason(errno)));
  }
  while (const dirent *item = ::readdir(dir.get())) {
    SessionEntry entry;
    // The root holds a lock file as well, and a session may vanish while the root is read.
    if (isSessionId(item->d_name) && lookUpSession(item->d_name, entry)) {
      entries.push_back(entry);
    }
  }
  std::sort(entries.begin(), entries.end(),
            [](const SessionEntry &a, const SessionEntry &b) { return a.id < b.id; });
  return entries;
}

// The path of a session that is not intact may be anything, so its users say nothing.
std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry) {
  return entry.state == SessionState::Intact ? open.usersOf(entry.path) : std::vector<Process>();
}

SessionEntry findSession(const std::string &id) {
  requireSessionId(id);
  SessionEntry entry;
  if (!lookUpSession(id, entry)) {
    throw Failure(kNegative, fmt::format("there is no session {}", id));
  }
  return entry;
}

// With fts(3): a service may have left a tree so deep that recursion would overflow the stack.
TreeSize measure(const SessionEntry &session, std::vector<TreePart> *parts) {
  TreeSize size;
  if (session.state != SessionState::Intact) {
    return size;
  }
  std::string path = session.path; // fts_open takes pointers to non-const
  char *const roots[] = {path.data(), nullptr};
  const std::unique_ptr<FTS, int (*)(FTS *)> walk(
      ::fts_open(roots, FTS_PHYSICAL | FTS_XDEV | FTS_NOCHDIR, nullptr), &::fts_close);
  if (!walk) {
    size.complete = false;
    return size;
  }
  while (const FTSENT *item = ::fts_read(walk.get())) {
    const std::uint64_t before = size.bytes; // what count adds belongs to the latest part
    count(*item, size);
    if (parts != nullptr && item->fts_level == 1 && item->fts_info != FTS_DP) {
      parts->push_back({item->fts_name, 0});
    }
    if (parts != nullptr && !parts->empty()) {
      parts->back().bytes += size.bytes - before;
    }
  }
  size.complete = size.complete && errno == 0; // fts_read sets it to 0 at the end of the tree
  return size;
}

} // namespace KOVA::Backup::Tool
