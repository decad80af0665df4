// Gives a target that makes real files a /tmp of its own, and ends it where that is not possible,
// with a code that libFuzzer does not use.

#include "tests/support/private_tmp.h"

#include <cstdio>
#include <cstdlib>

namespace {

constexpr int kNoPrivateTmp = 78;

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
  const std::string why = KovaTest::enterPrivateTmp();
  if (!why.empty()) {
    std::fprintf(stderr, "no private /tmp: %s\n", why.c_str());
    std::exit(kNoPrivateTmp);
  }
  return 0;
}
