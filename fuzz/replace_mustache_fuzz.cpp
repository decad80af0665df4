// Any text, expanded by the library's scan and by the plain rules: both results must be equal.

#include "kovabackup/string_util.h"

#include "fuzz/support.h"
#include "tests/string/plain_replace.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  const std::string text = KovaFuzz::Input(data, size).rest();
  KovaFuzz::require(KOVA::Backup::replaceMustache(text, &KovaTest::tellNames) ==
                    KovaTest::plainReplace(text, &KovaTest::tellNames));
  return 0;
}
