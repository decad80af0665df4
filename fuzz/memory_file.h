#ifndef KOVABACKUP_FUZZ_MEMORY_FILE_H
#define KOVABACKUP_FUZZ_MEMORY_FILE_H

/// @file A file in memory, whose content each input replaces.

#include "fuzz/support.h"

#include <string>
#include <sys/mman.h>
#include <unistd.h>

namespace KovaFuzz {

class MemoryFile {
public:
  MemoryFile() : fd_(::memfd_create("fuzz", MFD_CLOEXEC)) {}
  ~MemoryFile() { ::close(fd_); }
  MemoryFile(const MemoryFile &) = delete;
  MemoryFile &operator=(const MemoryFile &) = delete;

  void write(const std::string &content) const {
    const auto size = static_cast<ssize_t>(content.size());
    require(::ftruncate(fd_, size) == 0);
    require(::pwrite(fd_, content.data(), content.size(), 0) == size);
    require(::lseek(fd_, 0, SEEK_SET) == 0);
  }

  int fd() const { return fd_; }
  std::string path() const { return "/proc/self/fd/" + std::to_string(fd_); }

private:
  int fd_;
};

} // namespace KovaFuzz

#endif
