#include "service/session_lost.h"

#include "kovabackup/path_util.h"
#include "kovabackup/temp_manager.h"
#include "kovaplatform/kovasdk.h"
#include "service/absence.h"
#include "service/session_names.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

constexpr std::chrono::seconds kYoung = std::chrono::minutes(10);

// Accepts no volume, but notes where each is mounted that a session could have been created on.
class MountPaths : public FilterVolume {
public:
  bool isAccept(const KOVAVOLInfo &info) override {
    paths.emplace_back(info.mountPath, ::strnlen(info.mountPath, sizeof info.mountPath));
    return false;
  }
  std::string getSignature() const override { return "SessionStore"; }

  std::vector<std::string> paths;
};

// The share temporary directories of the volumes. A volume that the platform names twice has two.
std::vector<std::string> volumeFolders() {
  const auto mounts = boost::make_shared<MountPaths>();
  std::string none;
  (void)VolumePathManager::getInstance().getVolumePath(mounts, none); // false: it accepts none
  std::vector<std::string> folders;
  for (const std::string &path : mounts->paths) {
    std::string folder = TempManager::sameVolume(path)->defaultPath();
    if (!folder.empty() && std::find(folders.begin(), folders.end(), folder) == folders.end()) {
      folders.push_back(std::move(folder));
    }
  }
  return folders;
}

bool isMissing(int code) {
  return isAbsence(code) || code == ELOOP;
}

} // namespace

std::chrono::seconds ageOf(const struct stat &status) {
  return std::chrono::seconds(std::max<std::time_t>(std::time(nullptr) - status.st_mtime, 0));
}

// A link that can be read, but not followed, may lead to a directory of that name. One that cannot
// be read may lead to any.
bool LostSearch::addLinks(const std::vector<FoundSession> &entries, Error &error) {
  for (const FoundSession &entry : entries) {
    if (entry.info.state == State::Complete) {
      linked_.emplace(entry.status.st_dev, entry.status.st_ino);
    } else if (S_ISLNK(entry.status.st_mode)) {
      const std::string link = Path::join(sessionRoot(), entry.info.id);
      struct stat target = {};
      if (::stat(link.c_str(), &target) == 0) {
        linked_.emplace(target.st_dev, target.st_ino);
      } else if (!isMissing(errno)) {
        const int code = errno;
        if (entry.info.path.empty()) {
          error = {code, "stat", link};
          return false;
        }
        doubtful_.insert(Path::basename(entry.info.path));
      }
    }
  }
  return true;
}

bool LostSearch::isLost(const std::string &name, const struct stat &status) const {
  const bool ours = ::geteuid() == 0 || status.st_uid == ::geteuid();
  return S_ISDIR(status.st_mode) && (status.st_mode & 07777) == 0700 && ours &&
         ageOf(status) >= kYoung && linked_.count({status.st_dev, status.st_ino}) == 0 &&
         doubtful_.count(name) == 0;
}

Search LostSearch::examine(const std::string &path, FoundSession &found, Error &error) const {
  const std::string name = Path::basename(path);
  struct stat status = {};
  if (!isSessionName(name, kVolumePrefix)) {
    return Search::Absent;
  }
  if (::lstat(path.c_str(), &status) != 0) {
    if (isMissing(errno)) {
      return Search::Absent;
    }
    error = {errno, "lstat", path};
    return Search::Failed;
  }
  if (!isLost(name, status)) {
    return Search::Absent;
  }
  found.info = {State::Lost, "", path, true, ageOf(status), "no link leads to it"};
  found.status = status;
  return Search::Found;
}

bool LostSearch::searchFolder(const std::string &folder, std::vector<FoundSession> &out,
                              Error &error) const {
  const auto examineName = [&](const char *name, FoundSession &found, Error &failure) {
    return examine(Path::join(folder, name), found, failure);
  };
  return findIn(folder, examineName, out, error);
}

bool LostSearch::searchVolumes(std::vector<FoundSession> &out, Error &error) const {
  bool complete = true;
  for (const std::string &folder : volumeFolders()) {
    Error failure;
    if (!searchFolder(folder, out, failure) && complete) {
      error = failure;
      complete = false;
    }
  }
  return complete;
}

} // namespace KOVA::Backup::Service
