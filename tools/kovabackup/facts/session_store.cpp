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

bool isAsciiAlphanumeric(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}

bool hasSessionName(const std::string &name, const char *prefix) {
  return name.size() == kPrefixBytes + kRandomBytes && name.compare(0, kPrefixBytes, prefix) == 0 &&
         std::all_of(name.begin() + kPrefixBytes, name.end(), isAsciiAlphanumeric);
}

std::chrono::seconds ageOf(const struct stat &info) {
  return std::chrono::seconds(std::max<std::time_t>(std::time(nullptr) - info.st_mtime, 0));
}

void examineLocal(SessionEntry &entry, const struct stat &info) {
  entry.path = Path::join(sessionRoot(), entry.id);
  if (S_ISDIR(info.st_mode)) {
    entry.state = SessionState::Whole;
  } else {
    entry.problem = "not a directory";
  }
}

// The library made the link, so what it leads to is a directory of a session's name at an absolute
// path. Anything else would be removed by a destroy just the same, and is none of ours.
bool leadsToSessionName(const std::string &target) {
  return !target.empty() && target[0] == '/' && hasSessionName(Path::basename(target), "seln.");
}

void examineVolume(SessionEntry &entry, const struct stat &info) {
  if (!S_ISLNK(info.st_mode)) {
    entry.problem = "not a link";
    return;
  }
  entry.path = Session::getPathById(entry.id);
  struct stat target;
  if (!leadsToSessionName(entry.path)) {
    entry.state = SessionState::Foreign;
    entry.problem = fmt::format("leads to '{}', which is no session directory", entry.path);
  } else if (::lstat(entry.path.c_str(), &target) != 0) {
    const bool gone = errno == ENOENT || errno == ENOTDIR;
    entry.state = gone ? SessionState::Dangling : SessionState::Foreign;
    entry.problem = gone ? "leads to nothing" : std::strerror(errno);
  } else if (!S_ISDIR(target.st_mode)) {
    entry.state = SessionState::Foreign;
    entry.problem = fmt::format("leads to '{}', which is no directory", entry.path);
  } else {
    entry.state = SessionState::Whole;
    entry.age = ageOf(target);
  }
}

void count(const FTSENT &item, TreeSize &size) {
  switch (item.fts_info) {
  case FTS_D:
  case FTS_DP:
    break;
  case FTS_DNR:
  case FTS_ERR:
  case FTS_NS:
    size.whole = false;
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
    throw Failure(kFailed, fmt::format("cannot look at session {}: {}", id, reason(errno)));
  }
  entry.id = id;
  entry.volume = hasSessionName(id, "seln.");
  entry.age = ageOf(info);
  entry.volume ? examineVolume(entry, info) : examineLocal(entry, info);
  return true;
}

std::string sessionRoot() {
  return Path::join(Path::getIpcTempPath(), "session");
}

bool isSessionId(const std::string &id) {
  return hasSessionName(id, "sess.") || hasSessionName(id, "seln.");
}

void requireSessionId(const std::string &id) {
  if (!isSessionId(id)) {
    throw Failure(kUsage, fmt::format("'{}' is no session id: sess. or seln. and six letters or "
                                      "digits",
                                      id));
  }
}

std::chrono::seconds requireAge(const std::string &text) {
  const std::optional<std::chrono::seconds> age = parseAge(text);
  if (!age) {
    throw Failure(kUsage, fmt::format("--older-than wants a number and s, m, h, d or w, as in 7d, "
                                      "not '{}'",
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
    if (isSessionId(item->d_name) && lookUpSession(item->d_name, entry)) {
      entries.push_back(entry);
    }
  }
  std::sort(entries.begin(), entries.end(),
            [](const SessionEntry &a, const SessionEntry &b) { return a.id < b.id; });
  return entries;
}

std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry) {
  return entry.state == SessionState::Whole ? open.usersOf(entry.path) : std::vector<Process>();
}

SessionEntry findSession(const std::string &id) {
  requireSessionId(id);
  SessionEntry entry;
  if (!lookUpSession(id, entry)) {
    throw Failure(kNegative, fmt::format("there is no session {}", id));
  }
  return entry;
}

TreeSize measure(const SessionEntry &session, std::vector<TreePart> *parts) {
  TreeSize size;
  if (session.state != SessionState::Whole) {
    return size;
  }
  std::string path = session.path;
  char *const roots[] = {path.data(), nullptr};
  const std::unique_ptr<FTS, int (*)(FTS *)> walk(
      ::fts_open(roots, FTS_PHYSICAL | FTS_XDEV | FTS_NOCHDIR, nullptr), &::fts_close);
  if (!walk) {
    size.whole = false;
    return size;
  }
  while (const FTSENT *item = ::fts_read(walk.get())) {
    const std::uint64_t before = size.bytes;
    count(*item, size);
    if (parts != nullptr && item->fts_level == 1 && item->fts_info != FTS_DP) {
      parts->push_back({item->fts_name, 0});
    }
    if (parts != nullptr && !parts->empty()) {
      parts->back().bytes += size.bytes - before;
    }
  }
  return size;
}

} // namespace KOVA::Backup::Tool
