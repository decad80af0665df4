#include "platform/core/temp_file.h"

#include "base/retry_on_eintr.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaPlatform {
namespace {

using KOVA::Base::ErrnoGuard;
using KOVA::Base::retryOnEintr;
using KOVA::Base::UniqueFd;

constexpr int kSlots = 16; // so many writers can be at work in one directory
constexpr mode_t kMode = 0600;

std::string slotName(int slot) {
  return ".kovacore." + std::to_string(slot) + ".tmp";
}

bool sameFile(const struct stat &a, const struct stat &b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

bool tryLock(int fd) {
  return ::flock(fd, LOCK_EX | LOCK_NB) == 0;
}

// Only the holder of its lock removes or renames a slot's file, so that what the name means cannot
// change between the look at it and the removal.
void clearSlot(int dir, const char *name) {
  const UniqueFd fd(::openat(dir, name, O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat opened {};
  struct stat named {};
  const bool dead = fd && ::fstat(fd.get(), &opened) == 0 && S_ISREG(opened.st_mode) &&
                    tryLock(fd.get()) && ::fstatat(dir, name, &named, AT_SYMLINK_NOFOLLOW) == 0 &&
                    sameFile(opened, named);
  if (dead) {
    (void)::unlinkat(dir, name, 0);
  }
}

} // namespace

TempFile::~TempFile() {
  if (!name_.empty()) {
    const ErrnoGuard guard;
    (void)::unlinkat(dir_, name_.c_str(), 0); // else it is a leftover for the next writer
  }
}

bool TempFile::make(Kind kind) {
  if (kind == Kind::Named) {
    return makeNamed();
  }
  fd_.reset(
      retryOnEintr([&] { return ::openat(dir_, ".", O_TMPFILE | O_RDWR | O_CLOEXEC, kMode); }));
  if (!fd_) {
    return false;
  }
  // Where locks do not work, a leftover's cannot be taken either, so it counts as alive.
  (void)tryLock(fd_.get());
  return true;
}

bool TempFile::makeNamed() {
  for (int slot = 0; slot < kSlots; ++slot) {
    const std::string name = slotName(slot);
    fd_.reset(retryOnEintr([&] {
      return ::openat(dir_, name.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, kMode);
    }));
    if (fd_ && lockNamed()) {
      name_ = name;
      return true;
    }
    if (!fd_ && errno != EEXIST) {
      return false;
    }
  }
  errno = EBUSY;
  return false;
}

// Another writer may take the new file for a leftover until the lock is held: then it is given up
// to that writer, who removes it.
bool TempFile::lockNamed() {
  struct stat status {};
  const bool taken = !tryLock(fd_.get()) && errno == EWOULDBLOCK;
  const bool removed = ::fstat(fd_.get(), &status) == 0 && status.st_nlink == 0;
  return !taken && !removed;
}

bool TempFile::linkAs(const char *name) {
  if (::linkat(fd_.get(), "", dir_, name, AT_EMPTY_PATH) == 0) {
    return true;
  }
  if (errno == EEXIST) {
    return false;
  }
  // Without privilege older kernels want the file's name under /proc.
  const std::string path = "/proc/self/fd/" + std::to_string(fd_.get());
  return ::linkat(AT_FDCWD, path.c_str(), dir_, name, AT_SYMLINK_FOLLOW) == 0;
}

bool TempFile::link() {
  if (!name_.empty()) {
    return true;
  }
  for (int slot = 0; slot < kSlots; ++slot) {
    const std::string name = slotName(slot);
    if (linkAs(name.c_str())) {
      name_ = name;
      return true;
    }
    if (errno != EEXIST) {
      return false;
    }
  }
  errno = EBUSY;
  return false;
}

bool TempFile::rename(const std::string &name) {
  if (::renameat(dir_, name_.c_str(), dir_, name.c_str()) != 0) {
    return false;
  }
  name_.clear();
  return true;
}

bool TempFile::linkFinal(const std::string &name) {
  return name_.empty() ? linkAs(name.c_str())
                       : ::linkat(dir_, name_.c_str(), dir_, name.c_str(), 0) == 0;
}

void clearLeftovers(int dir) {
  const ErrnoGuard guard;
  for (int slot = 0; slot < kSlots; ++slot) {
    clearSlot(dir, slotName(slot).c_str());
  }
}

} // namespace KovaPlatform
