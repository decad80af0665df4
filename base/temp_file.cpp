#include "base/temp_file.h"

#include "base/retry_on_eintr.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Base {
namespace {

// So many writers can work in one directory at a time. Every writer looks at all of the slots, so
// the number is small.
constexpr int kSlots = 16;

// Until the attributes of the old file are copied, no other user may read the new content.
constexpr mode_t kMode = 0600;

std::string slotName(const std::string &prefix, int slot) {
  return prefix + std::to_string(slot) + ".tmp";
}

bool sameFile(const struct stat &a, const struct stat &b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// An flock belongs to the open file: it also excludes another thread of this process, and the
// kernel releases it when the writer is killed. It never waits, because an answer is all that is
// needed.
bool tryLock(int fd) {
  return ::flock(fd, LOCK_EX | LOCK_NB) == 0;
}

// Only the holder of its lock removes or renames a slot's file. While this function holds the lock,
// the name therefore cannot change its meaning between the comparison and the removal. The
// comparison itself is necessary: before the lock was taken, another writer may have cleared the
// slot and a third one may have taken it.
//
// The directory may be open to other users. O_NOFOLLOW keeps a planted link from leading elsewhere,
// O_NONBLOCK keeps a planted FIFO from blocking the open. O_RDWR because network file systems grant
// an exclusive lock to writers only.
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
    (void)::unlinkat(dir_, name_.c_str(), 0); // on failure the next writer clears it
  }
}

bool TempFile::make(Kind kind) {
  if (kind == Kind::Named) {
    return makeNamed();
  }
  // Without O_EXCL, which together with O_TMPFILE would forbid giving the file a name later.
  fd_.reset(
      retryOnEintr([&] { return ::openat(dir_, ".", O_TMPFILE | O_RDWR | O_CLOEXEC, kMode); }));
  if (!fd_) {
    return false;
  }
  // The result does not matter. No other process knows the file yet, so only a file system without
  // locks refuses. Clearing fails to lock there as well and leaves every slot alone.
  (void)tryLock(fd_.get());
  return true;
}

bool TempFile::makeNamed() {
  for (int slot = 0; slot < kSlots; ++slot) {
    std::string name = slotName(prefix_, slot);
    fd_.reset(retryOnEintr([&] {
      return ::openat(dir_, name.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, kMode);
    }));
    if (fd_ && lockNamed()) {
      name_ = std::move(name); // cannot fail: the file would be left
      return true;
    }
    if (!fd_ && errno != EEXIST) {
      return false;
    }
  }
  errno = EBUSY;
  return false;
}

// Between creation and lock another writer may take the new file for a leftover. Then that writer
// holds the lock, or has already removed the name; the file is left to it, and the next slot is
// tried. Any other failure to lock means a file system without locks, where clearing does nothing.
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
  // Linking a bare descriptor takes CAP_DAC_READ_SEARCH on older kernels; linking its name under
  // /proc takes no privilege, but a mounted /proc.
  const std::string path = "/proc/self/fd/" + std::to_string(fd_.get());
  return ::linkat(AT_FDCWD, path.c_str(), dir_, name, AT_SYMLINK_FOLLOW) == 0;
}

// linkat never replaces a name and renameat needs one, so a file that is to replace another goes
// through a slot.
bool TempFile::link() {
  if (!name_.empty()) {
    return true;
  }
  for (int slot = 0; slot < kSlots; ++slot) {
    std::string name = slotName(prefix_, slot);
    if (linkAs(name.c_str())) {
      name_ = std::move(name); // cannot fail: the file would be left
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
  name_.clear(); // the destructor must not remove what is now in place
  return true;
}

// By linkat in both cases, because renameat would replace what is already there. A named file keeps
// its slot's name as a second one, which the destructor removes.
bool TempFile::linkFinal(const std::string &name) {
  return name_.empty() ? linkAs(name.c_str())
                       : ::linkat(dir_, name_.c_str(), dir_, name.c_str(), 0) == 0;
}

void clearLeftovers(int dir, const std::string &prefix) {
  const ErrnoGuard guard;
  for (int slot = 0; slot < kSlots; ++slot) {
    clearSlot(dir, slotName(prefix, slot).c_str());
  }
}

} // namespace KOVA::Base
