#include "platform/core/secret_key.h"

#include "base/open_file.h"
#include "base/temp_file.h"
#include "platform/config/config.h"
#include "platform/core/temp_names.h"
#include "platform/support/failure.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaPlatform {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::TempFile;
using KOVA::Base::UniqueFd;

constexpr const char *kFile = "core/secret_key.cpp";
constexpr mode_t kFolderMode = 0700;
constexpr mode_t kKeyMode = 0600;
constexpr mode_t kGroupAndOthers = 077;

std::string folderOf(const std::string &path) {
  return path.substr(0, std::max<std::size_t>(path.rfind('/'), 1));
}

// A user who may write the file could choose the key; one who may read it has all secrets. The size
// distinguishes a key from a file that the configuration names by mistake.
bool isSafe(const struct stat &status) {
  return S_ISREG(status.st_mode) && (status.st_mode & kGroupAndOthers) == 0 &&
         (status.st_uid == 0 || status.st_uid == ::geteuid()) &&
         status.st_size == static_cast<off_t>(kMasterKeyBytes);
}

enum class Read { Done, Missing, Failed };

Read readKey(const std::string &path, SecureBuffer &key) {
  const UniqueFd fd = KOVA::Base::openFile(path.c_str(), O_RDONLY);
  struct stat status {};
  if (!fd && errno == ENOENT) {
    return Read::Missing;
  }
  if (!fd || ::fstat(fd.get(), &status) != 0) {
    return fail({KLIBC_ERR_KEY_READ, kFile}, Read::Failed);
  }
  if (!isSafe(status)) {
    return fail({KLIBC_ERR_KEY_UNSAFE, kFile}, Read::Failed);
  }
  // One read: a regular file gives all of its 32 bytes at once.
  const ssize_t got = retryOnEintr([&] { return ::read(fd.get(), key.data(), key.size()); });
  return got == static_cast<ssize_t>(key.size()) ? Read::Done
                                                 : fail({KLIBC_ERR_KEY_READ, kFile}, Read::Failed);
}

UniqueFd openDirectory(const std::string &path) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;
  return UniqueFd(retryOnEintr([&] { return ::open(path.c_str(), kFlags); }));
}

bool syncFolder(const std::string &path) {
  const UniqueFd fd = openDirectory(path);
  return fd && ::fsync(fd.get()) == 0;
}

// Makes the last folder only; a missing one above it is more likely a wrong path than a first use.
// Another process may make the folder in between, hence EEXIST. The parent is synced because the
// folder's name must last as long as the key in it.
UniqueFd openFolder(const std::string &path) {
  UniqueFd fd = openDirectory(path);
  if (fd || errno != ENOENT) {
    return fd;
  }
  if ((::mkdir(path.c_str(), kFolderMode) == 0 || errno == EEXIST) && syncFolder(folderOf(path))) {
    fd = openDirectory(path);
  }
  return fd;
}

// The key is complete and on the disk before its file gets a name, so that no other process ever
// reads a part of it. The mode is set, because a umask may have taken the owner's permissions.
bool fillWithKey(int fd) {
  SecureBuffer key(kMasterKeyBytes);
  ::randombytes_buf(key.data(), key.size());
  const ssize_t wrote = retryOnEintr([&] { return ::write(fd, key.data(), key.size()); });
  return wrote == static_cast<ssize_t>(key.size()) && ::fchmod(fd, kKeyMode) == 0 &&
         ::fsync(fd) == 0;
}

// Several processes may make the first key at the same time. Each fills a file of its own, and
// linkFinal lets only one of them take the name; the others get EEXIST. That is a success as well:
// the caller then reads the winner's key.
//
// A key that is lost in a power cut takes with it all that was encrypted in the meantime. So the
// key and its name are on the disk before the key is used. The losers sync the folder, too, because
// the winner may not have done so yet.
bool makeKey(const std::string &path) {
  const UniqueFd folder = openFolder(folderOf(path));
  if (!folder) {
    return fail({KLIBC_ERR_KEY_MAKE, kFile}, false);
  }
  KOVA::Base::clearLeftovers(folder.get(), kTempPrefix);
  const std::string name = path.substr(path.rfind('/') + 1);
  // A named file where an unnamed one cannot be made or linked, as in file_replace.cpp.
  for (const TempFile::Kind kind : {TempFile::Kind::Unnamed, TempFile::Kind::Named}) {
    TempFile temp(folder.get(), kTempPrefix);
    if (!temp.make(kind)) {
      continue;
    }
    if (!fillWithKey(temp.fd())) {
      break;
    }
    if (temp.linkFinal(name) || errno == EEXIST) {
      return ::fsync(folder.get()) == 0 || fail({KLIBC_ERR_KEY_MAKE, kFile}, false);
    }
  }
  return fail({KLIBC_ERR_KEY_MAKE, kFile}, false);
}

} // namespace

bool loadMasterKey(SecureBuffer &key) {
  Config config;
  if (!loadConfig(config)) {
    return false;
  }
  const std::string path = secretKeyPath(config);
  Read read = readKey(path, key); // once the file exists, nothing is ever made
  if (read == Read::Missing) {
    // Read back even when this process made it: it may be another one's, and all checks apply.
    read = makeKey(path) ? readKey(path, key) : Read::Failed;
  }
  return read == Read::Done || (read == Read::Missing && fail({KLIBC_ERR_KEY_READ, kFile}, false));
}

} // namespace KovaPlatform
