#include "tests/support/alloc_failure.h"

#include <cstdlib>
#include <cstring>
#include <utility>

namespace KovaTest {
namespace {

std::size_t lastSize = 0;

// An optimising compiler would turn malloc and memset into the calloc that this is.
void *(*const volatile fill)(void *, int, std::size_t) = &std::memset;

} // namespace

std::size_t takeCallocSize() {
  return std::exchange(lastSize, 0);
}

} // namespace KovaTest

extern "C" void *calloc(std::size_t count, std::size_t size) noexcept {
  if (KovaTest::failsNow("calloc") || KovaTest::failsInChild("calloc")) {
    return nullptr;
  }
  KovaTest::lastSize = count * size;
  void *const memory = std::malloc(count * size);
  if (memory != nullptr) {
    KovaTest::fill(memory, 0, count * size);
  }
  return memory;
}
