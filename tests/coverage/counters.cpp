// Linked into every program and shared object of a coverage build, and of no other: places the
// counters of the compiler's instrumentation in a file, which all processes of that program map.
//
// Usually a process writes its counters to the disk when it exits. That misses the code in front of
// _exit, execve and a fatal signal, which is much of what is tested here; and the writing itself
// makes system calls, in processes that a test has left without a folder, memory or descriptors.
// With a shared mapping, every count is in the file at once, whatever becomes of the process, and
// after its start there is no further system call. A forked child counts into the same pages.
//
// counters.ld.in collects the counters in pages of their own.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

struct gcov_info;

extern "C" {
// Of the linker script.
extern char kova_counters_begin[];
extern char kova_counters_end[];
extern const char kova_counters_name[];
extern gcov_info *const kova_counters_units[];
extern gcov_info *const kova_counters_units_end[];
// Of libgcov.
void __gcov_init(gcov_info *unit);
void __gcov_dump(void);
}

namespace {

// Calls the kernel without libc's functions, which tests replace.
int openCounters() {
  char path[4096] = KOVA_COUNTERS_DIR "/";
  std::strncat(path, kova_counters_name, sizeof(path) - sizeof(KOVA_COUNTERS_DIR) - 1);
  const long fd = ::syscall(SYS_openat, AT_FDCWD, path, O_RDWR | O_CREAT | O_CLOEXEC, 0666);
  return static_cast<int>(fd);
}

// Does nothing where the file cannot be opened: what this process runs is not counted then.
void shareCounters() {
  const std::size_t size = static_cast<std::size_t>(kova_counters_end - kova_counters_begin);
  const int fd = openCounters();
  if (fd < 0)
    return;
  if (::syscall(SYS_ftruncate, fd, size) == 0) {
    ::syscall(SYS_mmap, kova_counters_begin, size, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED,
              fd, 0L);
  }
  ::syscall(SYS_close, fd);
}

// Adds the counters to the .gcda files, which gcov reads.
void writeCounters() {
  for (gcov_info *const *unit = kova_counters_units; unit != kova_counters_units_end; unit++) {
    __gcov_init(*unit);
  }
  __gcov_dump();
}

// Before all other constructors, which are counted too.
[[gnu::constructor(101)]] void start() {
  if (kova_counters_begin == kova_counters_end)
    return;
  shareCounters();
  const char *const wanted = std::getenv("KOVA_WRITE_COUNTERS"); // set by scripts/coverage
  if (wanted == nullptr || std::strcmp(wanted, kova_counters_name) != 0)
    return;
  writeCounters();
  ::_exit(0);
}

} // namespace
