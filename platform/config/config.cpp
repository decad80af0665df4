#include "platform/config/config.h"

#include "base/open_file.h"
#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>
#include <utility>

namespace KovaPlatform {
namespace {

constexpr const char *kDefaultPath = "/etc/kovaplatform/platform.conf";
constexpr const char *kPathVariable = "KOVA_PLATFORM_CONF";
constexpr const char *kDefaultKeyPath = "/var/lib/kovaplatform/secret.key";

// A thousand volumes take a tenth of it. The limit keeps a wrong path, such as that of a disk
// image, from filling the memory of every service.
constexpr std::size_t kMostBytes = std::size_t{1} << 20U;

// secure_getenv, because a program with raised privileges must not read a file of its caller's
// choice.
const char *pathFromEnvironment() {
  const char *path = ::secure_getenv(kPathVariable);
  return path != nullptr && *path != '\0' ? path : nullptr;
}

ConfigError systemError(const char *what) {
  return {KOVA_CONF_ERR_OPEN, 0, std::string(what) + ": " + std::strerror(errno)};
}

// The owner is deliberately not checked: a service may have a configuration of its own user.
bool isSafe(const struct stat &status, ConfigError &error) {
  if (!S_ISREG(status.st_mode)) {
    error = {KOVA_CONF_ERR_UNSAFE, 0, "not a regular file"};
    return false;
  }
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    error = {KOVA_CONF_ERR_UNSAFE, 0, "group or others may write it"};
    return false;
  }
  return true;
}

bool readAll(int fd, std::string &text, ConfigError &error) {
  char buffer[4096];
  for (;;) {
    const ssize_t count = ::read(fd, buffer, sizeof buffer);
    if (count > 0) {
      text.append(buffer, static_cast<std::size_t>(count));
      if (text.size() > kMostBytes) {
        errno = EFBIG;
        error = systemError("cannot be read");
        return false;
      }
    } else if (count == 0) {
      return true;
    } else if (errno != EINTR) {
      error = systemError("cannot be read");
      return false;
    }
  }
}

// Following links is safe: the checks use the open descriptor, so they apply to the file that is
// read.
bool readFile(const char *path, bool mustExist, std::string &text, ConfigError &error) {
  const KOVA::Base::UniqueFd fd = KOVA::Base::openFile(path, O_RDONLY);
  if (!fd) {
    if (!mustExist && (errno == ENOENT || errno == ENOTDIR)) {
      return true; // without a file at the default path the configuration is empty
    }
    error = systemError("cannot be opened");
    return false;
  }
  struct stat status {};
  if (::fstat(fd.get(), &status) != 0) {
    error = systemError("cannot be examined");
    return false;
  }
  return isSafe(status, error) && readAll(fd.get(), text, error);
}

// Records and logs the error. Always returns false, so that loadConfig can return it. What is wrong
// with the file itself has no line.
bool report(const char *path, const ConfigError &error) {
  KLIBCErrSetEx(error.code, path, error.line);
  if (error.line > 0) {
    ::syslog(LOG_ERR, "kovaplatform: %s:%d: %s", path, error.line, error.what.c_str());
  } else {
    ::syslog(LOG_ERR, "kovaplatform: %s: %s", path, error.what.c_str());
  }
  return false;
}

} // namespace

std::string configPath() {
  const char *named = pathFromEnvironment();
  return named != nullptr ? named : kDefaultPath;
}

std::string secretKeyPath(const Config &config) {
  return config.secretKeyFile.empty() ? kDefaultKeyPath : config.secretKeyFile;
}

bool readConfig(Config &config, ConfigError &error) {
  const bool mustExist = pathFromEnvironment() != nullptr;
  std::string text;
  return readFile(configPath().c_str(), mustExist, text, error) && parseConfig(text, config, error);
}

bool loadConfig(Config &config) noexcept {
  try {
    ConfigError error;
    return readConfig(config, error) || report(configPath().c_str(), error);
  } catch (const std::exception &) { // nothing here throws anything but std::bad_alloc
    KLIBCErrSetEx(KOVA_CONF_ERR_NO_MEMORY, "config/config.cpp", __LINE__);
    ::syslog(LOG_ERR, "kovaplatform: memory ran out while the configuration was read");
    return false;
  }
}

} // namespace KovaPlatform
