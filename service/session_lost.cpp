#include "service/session_lost.h"

#include "kovabackup/path_util.h"
#include "kovabackup/temp_manager.h"
#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"
#include "service/absence.h"
#include "service/failed.h"
#include "service/session_names.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <memory>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using State = SessionInfo::State;

constexpr std::chrono::seconds kYoung = std::chrono::minutes(10);

using VolumeList = std::unique_ptr<KOVAVOLInfo, decltype(&KOVAMountVolInfoFree)>;

// Whether a platform call has failed: one that has found nothing returns the same. Keeps the
// platform's last error unless the call has set another.
class PlatformCall {
public:
  explicit PlatformCall(const char *name)
      : name_(name),
        code_(KLIBCErrGet()),
        file_(textOf(KLIBCErrorGetFile())),
        line_(KLIBCErrorGetLine()) {
    KLIBCErrSetEx(0, "", 0);
    errno = 0;
  }
  ~PlatformCall() {
    if (KLIBCErrGet() == 0) {
      KLIBCErrSetEx(code_, file_.c_str(), line_);
    }
  }
  PlatformCall(const PlatformCall &) = delete;
  PlatformCall &operator=(const PlatformCall &) = delete;

  // Returns: false with error set when it has.
  bool hasSucceeded(Error &error) const {
    const int code = errno == 0 ? EIO : errno;
    if (KLIBCErrGet() != 0) {
      return failed(error, name_, "", code);
    }
    return true;
  }

private:
  static std::string textOf(const char *file) { return file == nullptr ? "" : file; }

  const char *const name_;
  const int code_;
  const std::string file_;
  const int line_;
};

bool getLocations(int &locations, Error &error) {
  const PlatformCall call("KOVAVolumeSupportLocGet");
  locations = KOVAVolumeSupportLocGet();
  return locations != 0 || call.hasSucceeded(error);
}

void addMountPath(const KOVAVOLInfo &info, std::vector<std::string> &out) {
  const std::size_t size = ::strnlen(info.mountPath, sizeof info.mountPath);
  if (size > 0 && info.status != 0 && info.accessStatus != 0) {
    out.emplace_back(info.mountPath, size);
  }
}

// Where the volumes are mounted.
// Returns: false with error set when the platform cannot list them.
bool listMountPaths(std::vector<std::string> &out, Error &error) {
  int locations = 0;
  if (!getLocations(locations, error)) {
    return false;
  }
  if (locations == 0) {
    return true; // no volume can be supported here
  }
  const PlatformCall call("KOVAMountVolAllEnum");
  const VolumeList volumes(KOVAMountVolAllEnum(0, locations, KOVA_VOL_ENUM_MOUNTED),
                           &KOVAMountVolInfoFree);
  for (const KOVAVOLInfo *info = volumes.get(); info != nullptr; info = info->next) {
    addMountPath(*info, out);
  }
  return volumes || call.hasSucceeded(error);
}

// Whether this process could create sessions there. When that cannot be found out, the search says
// why.
bool isUsable(const std::string &folder) {
  return ::access(folder.c_str(), W_OK) == 0 || (errno != EACCES && errno != EROFS);
}

// The usable share temporary directories. A volume that the platform names twice has two.
bool listVolumeFolders(std::vector<std::string> &out, Error &error) {
  std::vector<std::string> mountPaths;
  if (!listMountPaths(mountPaths, error)) {
    return false;
  }
  for (const std::string &path : mountPaths) {
    std::string folder = TempManager::sameVolume(path)->defaultPath();
    if (!folder.empty() && isUsable(folder) &&
        std::find(out.begin(), out.end(), folder) == out.end()) {
      out.push_back(std::move(folder));
    }
  }
  return true;
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
  std::vector<std::string> folders;
  bool complete = listVolumeFolders(folders, error);
  for (const std::string &folder : folders) {
    Error failure;
    if (!searchFolder(folder, out, failure) && complete) {
      error = failure;
      complete = false;
    }
  }
  return complete;
}

} // namespace KOVA::Backup::Service
