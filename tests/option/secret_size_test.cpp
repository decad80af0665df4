// A secret whose buffer has more bytes than the platform's int can count. Compiled as C++23, which
// can make so long a text without touching its memory.

#include "option/secret.h"
#include "tests/support/log_capture.h"

#include <cstddef>
#include <gmock/gmock.h>
#include <string>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;

namespace {

// As long as given, and never read.
std::string untouchedText(std::size_t length) {
  std::string text;
  text.resize_and_overwrite(length, [](char *, std::size_t size) { return size; });
  return text;
}

TEST(SecretSize, OfAGigabyteIsStoredAsTheEmptyText) {
  const std::string clear = untouchedText(std::size_t{1} << 30);
  LogCapture log;
  EXPECT_EQ("", secretEncrypt(clear));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 148, "calloc: Cannot allocate memory")));
}

} // namespace
