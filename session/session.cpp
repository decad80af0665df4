#include "kovabackup/session.h"

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"
#include "common/log.h"
#include "kovabackup/path_util.h"
#include "kovabackup/temp_manager.h"

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <string_view>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>
#include <utime.h>

namespace KOVA::Backup {

class SessionPrivate {
public:
  std::string id;
  std::string path;
};

namespace {

constexpr const char *kModule = "session";
constexpr const char *kRootName = "session";
constexpr const char *kLockName = "__sess__.lock";

// The prefix of an id says where the session is: in the session root, or where a link in the
// session root leads.
constexpr const char *kLocalPrefix = "sess";
constexpr const char *kVolumePrefix = "seln";

constexpr std::size_t kLinkBytes = 1024;

bool beginsWith(std::string_view text, std::string_view prefix) {
  return text.substr(0, prefix.size()) == prefix;
}

bool hasLink(const std::string &id) {
  return beginsWith(id, kVolumePrefix);
}

std::string sessionRoot() {
  return Path::join(Path::getIpcTempPath(), kRootName);
}

std::string linkPathOf(const std::string &id) {
  return Path::join(sessionRoot(), id);
}

// Waits as long as necessary: a signal handler that runs meanwhile must not cost the session.
bool lockExclusively(int fd) {
  return Base::retryOnEintr([fd] { return ::flock(fd, LOCK_EX); }) == 0;
}

// Replaces the placeholder by a link, under the lock of the session root: of all processes that do
// so, only one at a time is between removing the placeholder and making the link. Names are chosen
// without the lock. When another process chooses this very name in between, symlink fails, so no
// name is ever shared.
bool replaceByLink(ScopedTempFile &placeholder, const std::string &linkPath,
                   const std::string &path) {
  const std::string lockPath = Path::join(sessionRoot(), kLockName);
  const Base::UniqueFd lock(::open(lockPath.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC, 0400));
  if (!lock) {
    Log::error(kModule, 49, "failed to open file[%s]", lockPath.c_str());
    return false;
  }
  if (!lockExclusively(lock.get())) {
    Log::error(kModule, 53, "failed to flock[%s]", lockPath.c_str());
    return false;
  }
  placeholder.close();
  placeholder.unlink();
  if (::symlink(path.c_str(), linkPath.c_str()) != 0) {
    Log::error(kModule, 60, "failed to create symlink[%s][%s]", path.c_str(), linkPath.c_str());
    return false;
  }
  if (::flock(lock.get(), LOCK_UN) != 0) {
    Log::error(kModule, 64, "failed to unlock flock[%s]", lockPath.c_str());
    return false; // the link stays
  }
  return true;
}

// Makes a link with a fresh name that leads to path.
// Returns: whether that worked; id is then the name.
bool linkFreshName(const std::string &path, std::string &id) {
  const std::string name = Path::join(sessionRoot(), kVolumePrefix);
  ScopedTempFile placeholder(name, true);
  if (!placeholder.isValid()) {
    Log::error(kModule, 41, "ScopedTempFile failed[%s]", name.c_str());
    return false;
  }
  const std::string linkPath = placeholder.getPath();
  std::string freshId = Path::basename(linkPath); // before the link: on bad_alloc none is left
  if (!replaceByLink(placeholder, linkPath, path)) {
    return false;
  }
  id = std::move(freshId);
  return true;
}

// Makes a link named id that leads to path. When the name is taken, a fresh name becomes the id.
bool linkSession(const std::string &root, const std::string &path, std::string &id) {
  const std::string linkPath = Path::join(root, id);
  if (::symlink(path.c_str(), linkPath.c_str()) == 0) {
    return true;
  }
  if (errno != EEXIST) {
    Log::error(kModule, 108, "failed to create symlink[%s][%s]", path.c_str(), linkPath.c_str());
    return false;
  }
  if (!linkFreshName(path, id)) {
    Log::error(kModule, 113, "failed to create_sesslink[%s]", path.c_str());
    return false;
  }
  return true;
}

// Makes a session for a base directory: in the session root when the directory's path begins with
// "/tmp", else in the directory itself.
bool createIn(const std::string &baseDir, SessionPrivate &session) {
  const std::string root = Path::createIpcTempPath(kRootName, 0700);
  if (root.empty()) {
    Log::error(kModule, 82, "failed to create temp directory [%s]", root.c_str());
    return false;
  }
  const bool local = beginsWith(baseDir, "/tmp"); // deliberately a mere comparison of bytes
  ScopedTempFolder folder(Path::join(local ? root : baseDir, local ? kLocalPrefix : kVolumePrefix));
  if (!folder.isValid()) {
    // "seln" for a local session, too: support knows the message by this text.
    Log::error(kModule, 99, "ScopedTempFolder failed[%s]",
               Path::join(baseDir, kVolumePrefix).c_str());
    return false;
  }
  std::string path = folder.getPath();
  std::string id = Path::basename(path);
  if (!local && !linkSession(root, path, id)) {
    return false;
  }
  (void)folder.preserve(); // its path is in path already
  session.id = std::move(id);
  session.path = std::move(path);
  return true;
}

// Whether the session's directory exists and the caller may use it. Sets its times to now, so that
// cleaners that go by age see a session in use.
bool touchDirectory(const std::string &path) {
  struct stat info {};
  if (::lstat(path.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) {
    Log::error(kModule, 180, "failed to lstat session[%s]", path.c_str());
    return false;
  }
  if (::access(path.c_str(), W_OK | X_OK) != 0) {
    Log::error(kModule, 184, "failed to access session[%s]", path.c_str());
    return false;
  }
  if (::utime(path.c_str(), nullptr) != 0) {
    Log::error(kModule, 188, "failed to touch session[%s]", path.c_str());
    return false;
  }
  return true;
}

bool removeDirectory(const std::string &path, int number) {
  if (path.empty() || removeAll(path)) {
    return true;
  }
  Log::error(kModule, number, "failed to remove session[%s]", path.c_str());
  return false;
}

bool removeLink(const std::string &id, int number) {
  if (!hasLink(id)) {
    return true;
  }
  const std::string linkPath = linkPathOf(id);
  if (::unlink(linkPath.c_str()) == 0 || errno == ENOENT) {
    return true;
  }
  Log::error(kModule, number, "failed to unlink session link[%s]", linkPath.c_str());
  return false;
}

} // namespace

Session::Session() : d_(std::make_unique<SessionPrivate>()) {}

Session::~Session() = default;

bool Session::create() {
  if (!d_->id.empty()) {
    Log::error(kModule, 136, "session has already existed[%s][%s]", d_->id.c_str(),
               d_->path.c_str());
    return false;
  }
  return createIn(sessionRoot(), *d_);
}

bool Session::create(boost::shared_ptr<FilterVolume> filter) {
  if (!d_->id.empty()) {
    Log::error(kModule, 153, "session has already existed[%s][%s]", d_->id.c_str(),
               d_->path.c_str());
    return false;
  }
  std::string dir;
  if (!VolumePathManager::getInstance().getVolumePath(std::move(filter), dir)) {
    Log::error(kModule, 126, "failed to getVolumePath()");
    return false;
  }
  return createIn(dir, *d_);
}

bool Session::load(const std::string &id) {
  if (!d_->id.empty()) {
    Log::error(kModule, 170, "session has been loaded[%s][%s]", d_->id.c_str(), d_->path.c_str());
    return false;
  }
  if (id.empty()) {
    Log::error(kModule, 174, "invalid parameter, empty session id");
    return false;
  }
  std::string path = getPathById(id);
  if (!touchDirectory(path)) {
    return false;
  }
  d_->id = id;
  d_->path = std::move(path);
  return true;
}

bool Session::destroy() {
  const bool directoryGone = removeDirectory(d_->path, 200);
  const bool linkGone = removeLink(d_->id, 206);
  d_->id.clear();
  d_->path.clear();
  return directoryGone && linkGone;
}

std::string Session::getId() const {
  return d_->id;
}

std::string Session::getPath() const {
  return d_->path;
}

std::string Session::getPathById(const std::string &id) {
  if (id.empty()) {
    Log::error(kModule, 250, "invalid parameter, empty session id");
    return "";
  }
  std::string candidate = linkPathOf(id);
  if (!hasLink(id)) {
    return candidate;
  }
  std::array<char, kLinkBytes> target{};
  const ssize_t length = ::readlink(candidate.c_str(), target.data(), target.size());
  if (length < 0) {
    if (errno != ENOENT) {
      Log::error(kModule, 259, "failed to read link[%s]", candidate.c_str());
    }
    return "";
  }
  return {target.data(), static_cast<std::size_t>(length)};
}

bool Session::destroyById(const std::string &id) {
  if (id.empty()) {
    Log::error(kModule, 228, "invalid parameter, empty session id");
    return false;
  }
  const bool directoryGone = removeDirectory(getPathById(id), 234);
  return removeLink(id, 240) && directoryGone;
}

} // namespace KOVA::Backup
