#include "tests/support/alloc_failure.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

namespace KovaTest {
namespace {

std::size_t largestSize = 0;

} // namespace

std::size_t takeReallocSize() {
  return std::exchange(largestSize, 0);
}

} // namespace KovaTest

extern "C" void *realloc(void *memory, std::size_t size) noexcept {
  static auto *const real = KovaTest::realFunction<void *(void *, std::size_t)>("realloc");
  if (KovaTest::failsNow("realloc")) {
    return nullptr;
  }
  KovaTest::largestSize = std::max(KovaTest::largestSize, size);
  return real(memory, size);
}
