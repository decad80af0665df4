// Any text, expanded by the library's scan and by the plain rules: both results must be equal.

#include "kovabackup/string_util.h"

#include "tests/string/plain_replace.h"

#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  const std::string text(data, data + size);
  if (KOVA::Backup::replaceMustache(text, &KovaTest::tellNames) !=
      KovaTest::plainReplace(text, &KovaTest::tellNames)) {
    std::abort();
  }
  return 0;
}
