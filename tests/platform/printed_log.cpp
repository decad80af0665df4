// Prints what a child program logs: "log: <priority> <text>".

#include <cstdarg>
#include <cstdio>

// Exported, so that the libraries find it before libc's.
extern "C" __attribute__((visibility("default"), format(printf, 2, 3))) void
syslog(int priority, const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::printf("log: %d ", priority);
  std::vprintf(format, args);
  std::printf("\n");
  va_end(args);
}
