#include "service/token_lock.h"

#include "base/retry_on_eintr.h"
#include "kovabackup/path_util.h"
#include "service/failed.h"

#include <algorithm>
#include <ctime>
#include <fcntl.h>
#include <string_view>
#include <sys/file.h>
#include <sys/stat.h>

namespace KOVA::Backup::Service {
namespace {

using std::chrono::steady_clock;

constexpr Millis kPause(10);

// A lock file is replaced rarely. After so many times in a row, it is done on purpose.
constexpr int kMaxReplaced = 100;

bool leadsOut(std::string_view token) {
  while (!token.empty()) {
    const std::size_t slash = std::min(token.find('/'), token.size());
    const std::string_view part = token.substr(0, slash);
    if (part == "." || part == "..") {
      return true;
    }
    token.remove_prefix(std::min(slash + 1, token.size()));
  }
  return false;
}

// flock has no time limit, so a limited wait tries again and again.
class LimitedWait {
public:
  explicit LimitedWait(Millis limit) : limit_(limit), begin_(steady_clock::now()) {}

  // Sleeps until the next try. A signal may end the sleep early, which does no harm.
  // Returns: false, at once, when the limit has passed.
  bool pause() const {
    const auto passed = std::chrono::duration_cast<Millis>(steady_clock::now() - begin_);
    if (passed >= limit_) {
      return false;
    }
    const auto sleep = std::chrono::nanoseconds(std::min(limit_ - passed, kPause));
    const struct timespec time = {0, static_cast<long>(sleep.count())};
    (void)::nanosleep(&time, nullptr);
    return true;
  }

private:
  const Millis limit_;
  const steady_clock::time_point begin_;
};

Base::UniqueFd openLockFile(const std::string &path, Error &error) {
  const std::string folder = Path::createIpcTempPath("lock", 0770);
  if (folder.empty()) {
    (void)failed(error, "createIpcTempPath", Path::join(Path::getIpcTempPath(), "lock"));
    return Base::UniqueFd();
  }
  constexpr int kFlags = O_RDWR | O_CREAT | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC;
  Base::UniqueFd file(Base::retryOnEintr([&] { return ::open(path.c_str(), kFlags, 0666); }));
  if (!file) {
    (void)failed(error, "open", path);
  }
  return file;
}

bool lockOpened(int fd, Millis limit, const LimitedWait &wait) {
  const int operation = limit < Millis(0) ? LOCK_EX : LOCK_EX | LOCK_NB;
  while (Base::retryOnEintr([&] { return ::flock(fd, operation); }) != 0) {
    if (errno != EWOULDBLOCK) {
      return false;
    }
    if (!wait.pause()) {
      errno = EWOULDBLOCK;
      return false;
    }
  }
  return true;
}

enum class Named { Yes, No, Unknown };

// Whether the path still leads to the file.
Named isNamed(int fd, const std::string &path, Error &error) {
  struct stat opened = {};
  if (::fstat(fd, &opened) != 0) {
    (void)failed(error, "fstat", path);
    return Named::Unknown;
  }
  struct stat found = {};
  if (::lstat(path.c_str(), &found) != 0) {
    if (errno == ENOENT) {
      return Named::No;
    }
    (void)failed(error, "lstat", path);
    return Named::Unknown;
  }
  return opened.st_dev == found.st_dev && opened.st_ino == found.st_ino ? Named::Yes : Named::No;
}

} // namespace

std::string tokenPath(const std::string &token) {
  if (token.empty() || token.back() == '/' || token.find('\0') != std::string::npos ||
      leadsOut(token)) {
    return "";
  }
  return Path::join(Path::join(Path::getIpcTempPath(), "lock"), token);
}

bool takeToken(const std::string &token, Millis limit, Base::UniqueFd &lock, Error &error) {
  const std::string path = tokenPath(token);
  if (path.empty()) {
    return failed(error, "open", token, EINVAL);
  }
  const LimitedWait wait(limit);
  for (int replaced = 0; replaced < kMaxReplaced; ++replaced) {
    Base::UniqueFd file = openLockFile(path, error);
    if (!file) {
      return false;
    }
    if (!lockOpened(file.get(), limit, wait)) {
      return failed(error, "flock", path);
    }
    const Named named = isNamed(file.get(), path, error);
    if (named == Named::Yes) {
      lock = std::move(file);
      return true;
    }
    if (named == Named::Unknown) {
      return false;
    }
  }
  return failed(error, "flock", path, ESTALE);
}

} // namespace KOVA::Backup::Service
