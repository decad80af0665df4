#include "service/session_scan.h"

#include "kovabackup/path_util.h"
#include "service/absence.h"
#include "service/session_lost.h"
#include "service/session_names.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstring>
#include <ctime>
#include <dirent.h>
#include <memory>
#include <tuple>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

// A local session is a directory in the session root itself; no link leads to it.
void examineLocal(const std::string &entry, FoundSession &found) {
  found.info.path = entry;
  const bool complete = S_ISDIR(found.status.st_mode);
  found.info.state = complete ? State::Complete : State::Broken;
  found.info.problem = complete ? "" : "not a directory";
}

bool readLink(const std::string &link, std::string &target) {
  std::array<char, PATH_MAX> buffer{};
  const ssize_t length = ::readlink(link.c_str(), buffer.data(), buffer.size());
  if (length < 0) {
    return false;
  }
  target.assign(buffer.data(), static_cast<std::size_t>(length));
  return true;
}

// A link that the library created holds an absolute path whose last component is a session name.
bool pointsToSessionName(const std::string &target) {
  if (target.compare(0, 1, "/") != 0) {
    return false;
  }
  return isSessionName(Path::basename(target), kVolumePrefix);
}

void setUnknown(FoundSession &found, const char *step, const std::string &path, int code) {
  found.info.state = State::Foreign;
  found.info.problem = std::strerror(code);
  found.failure = {code, step, path};
}

void setProblem(SessionInfo &info, State state, const std::string &problem) {
  info.state = state;
  info.problem = problem;
}

// A target that cannot be examined may be anything, so it is not offered for removal.
void examineTarget(FoundSession &found) {
  SessionInfo &info = found.info;
  struct stat target = {};
  if (!pointsToSessionName(info.path)) {
    setProblem(info, State::Foreign,
               "the link points to '" + info.path + "', which is not a session directory");
  } else if (::lstat(info.path.c_str(), &target) != 0) {
    if (isAbsence(errno)) {
      setProblem(info, State::Dangling, "the target of the link does not exist");
    } else {
      setUnknown(found, "lstat", info.path, errno);
    }
  } else if (!S_ISDIR(target.st_mode)) {
    setProblem(info, State::Foreign,
               "the link points to '" + info.path + "', which is not a directory");
  } else {
    info.state = State::Complete;
    found.status = target;
  }
}

// The entry may be removed or replaced between the two calls.
Search examineVolume(const std::string &entry, FoundSession &found) {
  if (!S_ISLNK(found.status.st_mode)) {
    setProblem(found.info, State::Broken, "not a symbolic link");
  } else if (readLink(entry, found.info.path)) {
    examineTarget(found);
  } else if (isAbsence(errno)) {
    return Search::Absent;
  } else {
    setUnknown(found, "readlink", entry, errno);
  }
  return Search::Found;
}

bool listRoot(std::vector<FoundSession> &out, Error &error) {
  // The root holds a lock file as well, and a session may vanish while the root is read.
  const auto examine = [](const char *name, FoundSession &found, Error &failure) {
    return SessionStore::isId(name) ? findEntry(name, found, failure) : Search::Absent;
  };
  Error failure;
  const bool complete = findIn(sessionRoot(), examine, out, failure);
  if (complete || (failure.code == ENOENT && failure.step == "opendir")) {
    return true;
  }
  error = failure;
  return false;
}

bool isBefore(const FoundSession &a, const FoundSession &b) {
  const auto key = [](const FoundSession &found) {
    return std::make_tuple(found.info.state == State::Lost, std::cref(found.info.id),
                           std::cref(found.info.path));
  };
  return key(a) < key(b);
}

} // namespace

bool findIn(const std::string &folder, const Examine &examine, std::vector<FoundSession> &out,
            Error &error) {
  const std::unique_ptr<DIR, int (*)(DIR *)> dir(::opendir(folder.c_str()), &::closedir);
  if (!dir) {
    error = {errno, "opendir", folder};
    return false;
  }
  bool complete = true;
  for (;;) {
    errno = 0;
    const dirent *entry = ::readdir(dir.get());
    if (entry == nullptr) {
      break;
    }
    FoundSession found;
    Error failure;
    const Search search = examine(entry->d_name, found, failure);
    if (search == Search::Found) {
      out.push_back(std::move(found));
    } else if (search == Search::Failed && complete) {
      error = failure;
      complete = false;
    }
  }
  if (errno != 0 && complete) {
    error = {errno, "readdir", folder};
    complete = false;
  }
  return complete;
}

Search findEntry(const std::string &id, FoundSession &found, Error &error) {
  const std::string entry = Path::join(sessionRoot(), id);
  FoundSession result;
  if (::lstat(entry.c_str(), &result.status) != 0) {
    if (isAbsence(errno)) {
      return Search::Absent;
    }
    error = {errno, "lstat", entry};
    return Search::Failed;
  }
  result.info.id = id;
  result.info.onVolume = isSessionName(id, kVolumePrefix);
  if (!result.info.onVolume) {
    examineLocal(entry, result);
  } else if (examineVolume(entry, result) == Search::Absent) {
    return Search::Absent;
  }
  result.info.age = ageOf(result.status);
  found = std::move(result);
  return Search::Found;
}

Search findLost(const std::string &path, FoundSession &found, Error &error) {
  std::vector<FoundSession> entries;
  LostSearch lost;
  if (!listRoot(entries, error) || !lost.addLinks(entries, error)) {
    return Search::Failed;
  }
  return lost.examine(path, found, error);
}

bool findAll(std::vector<FoundSession> &out, Error &error) {
  out.clear();
  LostSearch lost;
  const bool rootRead = listRoot(out, error) && lost.addLinks(out, error);
  const bool volumesRead = rootRead && lost.searchVolumes(out, error);
  std::sort(out.begin(), out.end(), isBefore);
  return rootRead && volumesRead;
}

bool isRootTrusted(Error &error) {
  for (const std::string &folder : {Path::getIpcTempPath(), sessionRoot()}) {
    struct stat info = {};
    if (::lstat(folder.c_str(), &info) != 0) {
      if (isAbsence(errno)) {
        return true; // nothing in it can be changed
      }
      error = {errno, "lstat", folder};
      return false;
    }
    const bool ours = info.st_uid == 0 || info.st_uid == ::geteuid();
    if (!S_ISDIR(info.st_mode) || !ours || (info.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
      error = {EPERM, "refused", folder};
      return false;
    }
  }
  return true;
}

} // namespace KOVA::Backup::Service
