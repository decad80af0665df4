// The libc functions on streams that a test may make fail. Weak, so that a test which needs another
// behaviour defines its own.

#include "tests/support/interpose.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>

extern "C" {

KOVA_INTERPOSE(FILE *, fopen, nullptr, (const char *path, const char *mode), (path, mode))
KOVA_INTERPOSE(int, fflush, EOF, (FILE * file), (file))
KOVA_INTERPOSE(int, fgetc, EOF, (FILE * file), (file))
KOVA_INTERPOSE(int, fseeko, -1, (FILE * file, off_t offset, int whence), (file, offset, whence))
KOVA_INTERPOSE(off_t, ftello, -1, (FILE * file), (file))

__attribute__((weak, format(printf, 2, 3))) int fprintf(FILE *file, const char *format, ...) {
  if (KovaTest::failsNow("fprintf")) {
    return -1;
  }
  va_list args;
  va_start(args, format);
  const int written = std::vfprintf(file, format, args);
  va_end(args);
  return written;
}

// A close that fails has closed the stream nevertheless.
__attribute__((weak)) int fclose(FILE *file) {
  static auto *const real = KovaTest::realFunction<int(FILE *)>("fclose");
  const int closed = real(file);
  return KovaTest::failsNow("fclose") ? EOF : closed;
}
}
