#include "tests/service/replaced_files.h"

#include "tests/support/fault.h"
#include "tests/support/interpose.h"

#include <cstdarg>

namespace KovaTest {

std::map<std::string, std::string> &replacedFiles() {
  static std::map<std::string, std::string> files;
  return files;
}

} // namespace KovaTest

using namespace KovaTest;

extern "C" int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  const auto found = replacedFiles().find(path);
  return failsNow("open")
             ? -1
             : real(found == replacedFiles().end() ? path : found->second.c_str(), flags, mode);
}
