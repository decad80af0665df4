#ifndef KOVABACKUP_BENCH_OPEN_DESCRIPTORS_H
#define KOVABACKUP_BENCH_OPEN_DESCRIPTORS_H

/// @file Descriptors that a process has open, for benchmarks of starting programs.

#include <cstdint>
#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>
#include <vector>

namespace KovaBench {

/// Raises the limit on descriptors to its maximum, for good, and keeps count descriptors open for
/// its lifetime. A started program inherits them unless it is kept from doing so.
class OpenDescriptors {
public:
  explicit OpenDescriptors(std::int64_t count) {
    ::getrlimit(RLIMIT_NOFILE, &limit_);
    limit_.rlim_cur = limit_.rlim_max;
    ::setrlimit(RLIMIT_NOFILE, &limit_);
    for (std::int64_t i = 0; i < count; ++i) {
      descriptors_.push_back(::open("/dev/null", O_RDONLY));
    }
  }
  ~OpenDescriptors() {
    for (const int fd : descriptors_) {
      ::close(fd);
    }
  }
  OpenDescriptors(const OpenDescriptors &) = delete;
  OpenDescriptors &operator=(const OpenDescriptors &) = delete;

  bool areThere() const { return descriptors_.empty() || descriptors_.back() >= 0; }
  rlim_t limit() const { return limit_.rlim_cur; }

private:
  rlimit limit_ = {};
  std::vector<int> descriptors_;
};

} // namespace KovaBench

#endif
