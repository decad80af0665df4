#include "kovabackup/temp_manager.h"

#include "base/errno_guard.h"
#include "base/unique_fd.h"
#include "common/log.h"
#include "kovabackup/path_util.h"
#include "path/tree_removal.h"
#include "temp_manager/temp_name.h"

#include <boost/make_shared.hpp>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup {
namespace {

constexpr const char *kModule = "temp_manager/temp_manager";

// States of an owner of a file or folder:
//   empty   path is "" and hash is 0; a file's descriptor may still be open after unlink
//   owning  path is set and hash is that of path
// create leads to owning. unlink, rename, preserve, a create that fails and the destructor lead to
// empty.

bool owns(const std::string &path, std::uint32_t pathHash) {
  return !path.empty() && pathHash == TempName::hashOf(path);
}

// Empties path and hash together, which ends the ownership. Returns: the path.
std::string releasePath(std::string &path, std::uint32_t &pathHash) {
  pathHash = 0;
  return std::exchange(path, std::string());
}

// The text into which mkstemp and mkdtemp write the name.
struct FreeText {
  void operator()(char *text) const { std::free(text); }
};
using NameBuffer = std::unique_ptr<char, FreeText>;

NameBuffer copyOf(const std::string &text) {
  return NameBuffer(::strdup(text.c_str()));
}

// The absolute path of a file or folder that was just created. On bad_alloc it is removed again,
// since no object would own it.
std::string absPathOf(const char *created) {
  try {
    return Path::absPath(created);
  } catch (...) {
    (void)std::remove(created);
    throw;
  }
}

// mkstemp takes no flags, so close-on-exec is set afterwards, which cannot fail for an open
// descriptor. A program that another thread starts in between inherits the descriptor.
Base::UniqueFd makeFile(char *name) {
  Base::UniqueFd fd(::mkstemp(name));
  if (fd) {
    (void)::fcntl(fd.get(), F_SETFD, FD_CLOEXEC);
  }
  return fd;
}

// The second attempt, for a name that was too long. Returns: the name of the file, or null.
NameBuffer makeShortenedFile(const std::string &name, Base::UniqueFd &fd) {
  const std::string shorter = TempName::shortened(name);
  if (shorter.empty()) {
    return nullptr;
  }
  NameBuffer buffer = copyOf(shorter + ".XXXXXX");
  if (!buffer) {
    return nullptr;
  }
  fd = makeFile(buffer.get());
  if (!fd) {
    Log::bare(LOG_ERR, kModule, 203, "mkstemp failed, %m [%s]", buffer.get());
    return nullptr;
  }
  return buffer;
}

NameBuffer makeFileFor(const std::string &name, Base::UniqueFd &fd) {
  NameBuffer buffer = copyOf(TempName::templateFor(name, "/tmp/scoped_temp_file.XXXXXX"));
  if (!buffer) {
    return nullptr;
  }
  const int before = errno;
  fd = makeFile(buffer.get());
  if (fd) {
    return buffer;
  }
  if (errno != ENAMETOOLONG || name.empty() || TempName::isTemplate(name)) {
    Log::bare(LOG_DEBUG, kModule, 207, "mkstemp failed, %m [%s]", buffer.get());
    return nullptr;
  }
  errno = before;
  return makeShortenedFile(name, fd);
}

// Finds the directory for a file or folder of that name on the filter's volume.
// Returns: false on failure; a bad argument is logged under the caller's numbers.
bool findDirOnVolume(const boost::shared_ptr<FilterVolume> &filter, const std::string &name,
                     int nullFilterNumber, int badNameNumber, std::string &dir) {
  if (!filter) {
    Log::error(kModule, nullFilterNumber, "volume temp filter is null!");
    return false;
  }
  if (name.find('/') != std::string::npos) {
    Log::error(kModule, badNameNumber, "name is invalid!");
    return false;
  }
  return VolumePathManager::getInstance().getVolumePath(filter, dir);
}

int dropEntry(const char *path, const struct stat * /*info*/, int type, struct FTW * /*position*/) {
  (void)TreeRemoval::removeEntry(path,
                                 type); // an entry that cannot be removed stays; the walk goes on
  return 0;
}

// A walk requires memory and descriptors, whereas an empty folder can be removed without either.
bool isShortage(int code) {
  return code == ENOMEM || code == EMFILE || code == ENFILE;
}

} // namespace

ScopedTempFile::ScopedTempFile(int /*ignored*/) : fd_(-1), pathHash_(0) {}

ScopedTempFile::ScopedTempFile(const std::string &name, bool closeFd) : ScopedTempFile() {
  if (create(name) && closeFd) {
    close();
  }
}

ScopedTempFile::~ScopedTempFile() {
  close();
  unlink();
}

bool ScopedTempFile::create(const std::string &name) {
  close();
  unlink();
  releasePath(path_, pathHash_);
  Base::UniqueFd fd;
  const NameBuffer created = makeFileFor(name, fd);
  if (!created || ::chmod(created.get(), 0600) != 0) {
    return false; // a file whose mode cannot be set deliberately stays
  }
  path_ = absPathOf(created.get());
  pathHash_ = TempName::hashOf(path_);
  fd_ = fd.release();
  return true;
}

bool ScopedTempFile::isValid() const {
  return owns(path_, pathHash_);
}

std::string ScopedTempFile::getPath() const {
  return path_;
}

int ScopedTempFile::getFileDescripter() const {
  return fd_;
}

void ScopedTempFile::close() {
  if (fd_ >= 0) {
    const Base::ErrnoGuard guard;
    (void)::close(std::exchange(fd_, -1)); // on Linux it is closed whatever close returns
  }
}

void ScopedTempFile::unlink() {
  if (isValid()) {
    const Base::ErrnoGuard guard;
    (void)::unlink(path_.c_str());
    releasePath(path_, pathHash_);
  }
}

bool ScopedTempFile::rename(const std::string &newPath) {
  if (!isValid()) {
    return false;
  }
  const std::string target = Path::absPath(newPath);
  if (target == path_) {
    Log::error(kModule, 249, "rename temp file to the same path[%s]", target.c_str());
    return false;
  }
  if (::rename(path_.c_str(), target.c_str()) != 0) {
    return false;
  }
  releasePath(path_, pathHash_);
  close();
  return true;
}

std::string ScopedTempFile::preserve() {
  if (!isValid()) {
    return "";
  }
  close();
  return releasePath(path_, pathHash_);
}

// NOLINTNEXTLINE(performance-unnecessary-value-param): part of the interface
ScopedVolumeTempFile::ScopedVolumeTempFile(boost::shared_ptr<FilterVolume> filter,
                                           const std::string &name, bool closeFd) {
  std::string dir;
  if (!findDirOnVolume(filter, name, 335, 339, dir)) {
    return;
  }
  if (create(Path::join(dir, name.empty() ? "scoped_volume_temp_file.XXXXXX" : name)) && closeFd) {
    close();
  }
}

ScopedVolumeTempFile::~ScopedVolumeTempFile() = default;

ScopedTempFolder::ScopedTempFolder(int /*ignored*/) : pathHash_(0) {}

ScopedTempFolder::ScopedTempFolder(const std::string &name) : ScopedTempFolder() {
  (void)create(name); // isValid reports a failure
}

ScopedTempFolder::~ScopedTempFolder() {
  unlink();
}

bool ScopedTempFolder::create(const std::string &name) {
  unlink();
  releasePath(path_, pathHash_);
  const NameBuffer created = copyOf(TempName::templateFor(name, "/tmp/scoped_temp_folder.XXXXXX"));
  if (!created || ::mkdtemp(created.get()) == nullptr) {
    return false;
  }
  if (::chmod(created.get(), 0700) != 0) {
    return false; // the folder deliberately stays
  }
  path_ = absPathOf(created.get());
  pathHash_ = TempName::hashOf(path_);
  return true;
}

bool ScopedTempFolder::isValid() const {
  return owns(path_, pathHash_);
}

std::string ScopedTempFolder::getPath() const {
  return path_;
}

void ScopedTempFolder::unlink() {
  if (isValid()) {
    const Base::ErrnoGuard guard;
    if (!TreeRemoval::walk(path_, &dropEntry) && isShortage(errno)) {
      (void)::rmdir(path_.c_str()); // a folder that was just created is empty
    }
    releasePath(path_, pathHash_);
  }
}

bool ScopedTempFolder::rename(const std::string &newPath) {
  if (!isValid()) {
    return false;
  }
  const std::string target = Path::absPath(newPath);
  if (target == path_) {
    Log::error(kModule, 446, "rename temp folder to the same path[%s]", target.c_str());
    return false;
  }
  if (::rename(path_.c_str(), target.c_str()) != 0) {
    return false;
  }
  releasePath(path_, pathHash_);
  return true;
}

std::string ScopedTempFolder::preserve() {
  return isValid() ? releasePath(path_, pathHash_) : "";
}

// NOLINTNEXTLINE(performance-unnecessary-value-param): part of the interface
ScopedVolumeTempFolder::ScopedVolumeTempFolder(boost::shared_ptr<FilterVolume> filter,
                                               const std::string &name) {
  std::string dir;
  if (findDirOnVolume(filter, name, 477, 481, dir)) {
    // isValid reports a failure.
    (void)create(Path::join(dir, name.empty() ? "scoped_volume_temp_folder.XXXXXX" : name));
  }
}

ScopedVolumeTempFolder::~ScopedVolumeTempFolder() = default;

boost::shared_ptr<FilterVolume> TempManager::maxVolume() {
  return boost::make_shared<FilterMaxVolume>();
}

boost::shared_ptr<FilterVolume> TempManager::maxVolume(bool fallbackTmp) {
  return boost::make_shared<FilterMaxVolume>(fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::maxVolume(int location, int enumFlags,
                                                       bool fallbackTmp) {
  return boost::make_shared<FilterMaxVolume>(location, enumFlags, fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::maxExtVolume() {
  return boost::make_shared<FilterMaxExtVolume>();
}

boost::shared_ptr<FilterVolume> TempManager::maxExtVolume(bool fallbackTmp) {
  return boost::make_shared<FilterMaxExtVolume>(fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::maxExtVolume(int location, int enumFlags,
                                                          bool fallbackTmp) {
  return boost::make_shared<FilterMaxExtVolume>(location, enumFlags, fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::maxExtBtrfsVolume() {
  return boost::make_shared<FilterMaxExtBtrfsVolume>();
}

boost::shared_ptr<FilterVolume> TempManager::maxExtBtrfsVolume(bool fallbackTmp) {
  return boost::make_shared<FilterMaxExtBtrfsVolume>(fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::maxExtBtrfsVolume(int location, int enumFlags,
                                                               bool fallbackTmp) {
  return boost::make_shared<FilterMaxExtBtrfsVolume>(location, enumFlags, fallbackTmp);
}

boost::shared_ptr<FilterVolume> TempManager::sameVolume(const std::string &path) {
  return boost::make_shared<FilterSameVolume>(path);
}

} // namespace KOVA::Backup
