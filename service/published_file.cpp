// A published file goes through these states:
//
//   state       create    fd     publish               destruction
//   new         created   -1     EINVAL                nothing
//   created     EINVAL    open   done, in both cases   removes the file
//   done        EINVAL    -1     EINVAL                nothing

#include "kovabackup/service/published_file.h"

#include "base/retry_on_eintr.h"
#include "base/temp_file.h"
#include "service/failed.h"

#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

constexpr mode_t kPermissions = 07777;

// What a slot's name adds to the target's, with the longest number. Leftovers are removed, so no
// other program may have the same idea of a temporary name.
constexpr std::string_view kLongestSlot = "..kova.15.tmp";

std::string folderOf(const std::string &target) {
  const std::size_t slash = target.rfind('/');
  if (slash == std::string::npos) {
    return ".";
  }
  return target.substr(0, slash == 0 ? 1 : slash);
}

std::string nameOf(const std::string &target) {
  return target.substr(target.rfind('/') + 1); // npos + 1 is 0
}

// The beginning of a name, not cut inside a UTF-8 character, which some file systems would refuse.
std::string shortened(const std::string &name, std::size_t limit) {
  if (name.size() <= limit) {
    return name;
  }
  std::size_t end = limit;
  while (end > 0 && (static_cast<unsigned char>(name[end]) & 0xC0U) == 0x80U) {
    --end;
  }
  return name.substr(0, end);
}

bool hasRoom(const struct statvfs &system, std::uint64_t room) {
  if (system.f_blocks == 0 || system.f_frsize == 0) {
    return true; // the file system does not report its size
  }
  const std::uint64_t blocks = room / system.f_frsize + (room % system.f_frsize != 0 ? 1 : 0);
  return blocks <= system.f_bavail;
}

// Without privilege, an unnamed file gets a name through /proc only. Found out before anything is
// written to it.
bool canBeLinked(int fd) {
  return ::access(("/proc/self/fd/" + std::to_string(fd)).c_str(), F_OK) == 0;
}

} // namespace

class PublishedFilePrivate {
public:
  PublishedFilePrivate(const std::string &target, mode_t mode)
      : target_(target),
        folder_(folderOf(target)),
        name_(nameOf(target)),
        mode_(mode & kPermissions) {}

  bool create(Error &error, std::uint64_t room);
  bool publish(Error &error);
  int fd() const { return file_ ? file_->fd() : -1; }

private:
  bool openFolder(Error &error);
  bool checkTarget(Error &error) const;
  bool makeFile(Error &error, std::uint64_t room);
  bool putInPlace(Base::TempFile &file, Error &error) const;

  const std::string target_;
  const std::string folder_;
  const std::string name_;
  const mode_t mode_;
  Base::UniqueFd dir_;
  std::unique_ptr<Base::TempFile> file_; // after dir_, which it uses to the end
  bool unnamed_ = false;
  bool done_ = false;
};

bool PublishedFilePrivate::openFolder(Error &error) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;
  dir_.reset(Base::retryOnEintr([&] { return ::open(folder_.c_str(), kFlags); }));
  if (!dir_) {
    return failed(error, "open", folder_);
  }
  return true;
}

// A target that cannot be replaced is found out before the content is made, which may take hours.
bool PublishedFilePrivate::checkTarget(Error &error) const {
  struct stat present = {};
  if (::fstatat(dir_.get(), name_.c_str(), &present, AT_SYMLINK_NOFOLLOW) != 0) {
    if (errno == ENOENT) {
      return true;
    }
    return failed(error, "fstatat", target_);
  }
  if (S_ISDIR(present.st_mode)) {
    return failed(error, "fstatat", target_, EISDIR);
  }
  return true;
}

bool PublishedFilePrivate::makeFile(Error &error, std::uint64_t room) {
  struct statvfs system = {};
  if (::fstatvfs(dir_.get(), &system) != 0) {
    return failed(error, "fstatvfs", folder_);
  }
  if (!hasRoom(system, room)) {
    return failed(error, "fstatvfs", folder_, ENOSPC);
  }
  const std::size_t longest =
      system.f_namemax > kLongestSlot.size() ? system.f_namemax - kLongestSlot.size() : 1;
  const std::string prefix = "." + shortened(name_, longest) + ".kova.";
  Base::clearLeftovers(dir_.get(), prefix);
  file_ = std::make_unique<Base::TempFile>(dir_.get(), prefix);
  unnamed_ = file_->make(Base::TempFile::Kind::Unnamed) && canBeLinked(file_->fd());
  // Whatever the reason was, the named file reports its own.
  if (!unnamed_ && !file_->make(Base::TempFile::Kind::Named)) {
    return failed(error, "openat", folder_);
  }
  return true;
}

bool PublishedFilePrivate::create(Error &error, std::uint64_t room) {
  if (file_ || done_ || name_.empty() || target_.find('\0') != std::string::npos) {
    return failed(error, "openat", target_, EINVAL);
  }
  if (openFolder(error) && checkTarget(error) && makeFile(error, room)) {
    return true;
  }
  file_.reset();
  dir_.reset();
  return false;
}

// A new name is linked directly, so that a kill leaves nothing. Replacing one takes a slot's name
// for an instant, since linkat never replaces and renameat needs a name.
bool PublishedFilePrivate::putInPlace(Base::TempFile &file, Error &error) const {
  if (::fchmod(file.fd(), mode_) != 0) {
    return failed(error, "fchmod", target_);
  }
  // Never repeated: after a failure the kernel drops what it could not write, and a second call
  // would report success.
  if (::fsync(file.fd()) != 0) {
    return failed(error, "fsync", target_);
  }
  if (unnamed_ && file.linkFinal(name_)) {
    return true;
  }
  if (!file.link()) {
    return failed(error, "linkat", target_);
  }
  if (!file.rename(name_)) {
    return failed(error, "renameat", target_);
  }
  return true;
}

bool PublishedFilePrivate::publish(Error &error) {
  if (!file_) {
    return failed(error, "renameat", target_, EINVAL);
  }
  done_ = true;
  const Base::UniqueFd dir = std::move(dir_);
  const std::unique_ptr<Base::TempFile> file = std::move(file_);
  if (!putInPlace(*file, error)) {
    return false;
  }
  // File systems on which folders cannot be synced report EINVAL; nothing more can be done on them.
  if (::fsync(dir.get()) != 0 && errno != EINVAL) {
    return failed(error, "fsync", folder_);
  }
  return true;
}

PublishedFile::PublishedFile(const std::string &target, mode_t mode)
    : private_(std::make_unique<PublishedFilePrivate>(target, mode)) {}

PublishedFile::~PublishedFile() = default;

bool PublishedFile::create(Error &error, std::uint64_t room) {
  return private_->create(error, room);
}

int PublishedFile::fd() const noexcept {
  return private_->fd();
}

bool PublishedFile::publish(Error &error) {
  return private_->publish(error);
}

} // namespace KOVA::Backup::Service
