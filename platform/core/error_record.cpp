#include "kovaplatform/kovacore.h"

#include <cstring>

namespace {

// Long enough for every source path in use. A longer one is cut, but always NUL-terminated. The
// text has a fixed place in the record, because recording a failure to allocate must not allocate.
constexpr int kFileBytes = 256;

struct ErrorRecord {
  int code;
  int line;
  char file[kFileBytes];
};

// One record for each thread, so that a failure in one thread never overwrites that of another.
thread_local ErrorRecord lastError = {0, 0, ""};

} // namespace

int KLIBCErrGet(void) {
  return lastError.code;
}

const char *KLIBCErrorGetFile(void) {
  return lastError.file;
}

int KLIBCErrorGetLine(void) {
  return lastError.line;
}

void KLIBCErrSetEx(int code, const char *file, int line) {
  lastError.code = code;
  lastError.line = line;
  char copy[kFileBytes] = ""; // file may be the record's own text
  if (file != nullptr) {
    std::strncpy(copy, file, kFileBytes - 1);
  }
  std::memcpy(lastError.file, copy, kFileBytes);
}
