#include "tests/support/alloc_failure.h"

#include <cstdlib>

namespace KovaTest {
namespace {
int allocationsLeft = 0; // 0: none fails
bool thrown = false;
} // namespace

AllocFailure::AllocFailure(int nth) {
  thrown = false;
  allocationsLeft = nth;
}

AllocFailure::~AllocFailure() {
  allocationsLeft = 0;
}

bool AllocFailure::fired() const {
  return thrown;
}

namespace {
void *allocate(std::size_t size) {
  if (allocationsLeft > 0 && --allocationsLeft == 0) {
    thrown = true;
    throw std::bad_alloc();
  }
  void *memory = std::malloc(size == 0 ? 1 : size);
  if (memory == nullptr) {
    throw std::bad_alloc();
  }
  return memory;
}
} // namespace
} // namespace KovaTest

void *operator new(std::size_t size) {
  return KovaTest::allocate(size);
}
void *operator new[](std::size_t size) {
  return KovaTest::allocate(size);
}
// Never fails: who asks so can do without. Here because a sanitizer's own would not fit our delete.
void *operator new(std::size_t size, const std::nothrow_t &) noexcept {
  return std::malloc(size == 0 ? 1 : size);
}
void operator delete(void *memory) noexcept {
  std::free(memory);
}
void operator delete[](void *memory) noexcept {
  std::free(memory);
}
void operator delete(void *memory, std::size_t) noexcept {
  std::free(memory);
}
void operator delete[](void *memory, std::size_t) noexcept {
  std::free(memory);
}
