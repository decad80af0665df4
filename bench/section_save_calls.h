#ifndef KOVABACKUP_BENCH_SECTION_SAVE_CALLS_H
#define KOVABACKUP_BENCH_SECTION_SAVE_CALLS_H

/// @file The system calls of a save, and nothing else: what a durable replacement of a file costs
/// before anything is done with its text.

#include <fcntl.h>
#include <memory>
#include <string>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace KovaBench {

/// Reads the file in the working directory at once, writes the text to an unnamed file and puts
/// that in the file's place.
inline bool saveByCalls(const char *path, const std::string &text) {
  struct stat status {};
  char target[4096];
  const int old = ::open(path, O_RDWR | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
  bool done = ::fstat(old, &status) == 0;
  const auto size = static_cast<std::size_t>(status.st_size);
  const std::unique_ptr<char[]> buffer(new char[size + 1]); // not zeroed
  done = ::read(old, buffer.get(), size + 1) == status.st_size &&
         ::read(old, buffer.get() + size, 1) == 0 && done;
  (void)!::readlinkat(AT_FDCWD, path, target, sizeof target);
  const int dir = ::open(".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  done = ::fstatat(dir, path, &status, AT_SYMLINK_NOFOLLOW) == 0 && done;
  for (int slot = 0; slot < 16; ++slot) {
    const std::string name = ".kovacore." + std::to_string(slot) + ".tmp";
    (void)::openat(dir, name.c_str(), O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC); // ENOENT
  }
  const int fd = ::openat(dir, ".", O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
  done = ::flock(fd, LOCK_EX | LOCK_NB) == 0 && done;
  const std::size_t section = text.size() < 1000 ? 0 : text.size() - 500; // the last one
  done = (section == 0 || ::write(fd, text.data(), section) > 0) &&
         ::write(fd, text.data() + section, text.size() - section) > 0 && done;
  done = ::fstat(fd, &status) == 0 && ::fchmod(fd, 0644) == 0 && done;
  (void)::flistxattr(old, nullptr, 0);
  (void)::fgetxattr(fd, "system.posix_acl_access", nullptr, 0);
  done = ::fsync(fd) == 0 && ::linkat(fd, "", dir, ".kovacore.0.tmp", AT_EMPTY_PATH) == 0 &&
         ::renameat(dir, ".kovacore.0.tmp", dir, path) == 0 && ::fsync(dir) == 0 && done;
  (void)::close(fd);
  (void)::close(dir);
  (void)::close(old);
  return done;
}

} // namespace KovaBench

#endif
