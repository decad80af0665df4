#include "tests/support/alloc_failure.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace KovaTest {
namespace {

bool fails(const char *function) {
  return failsNow(function) || failsInChild(function);
}

void *allocate(std::size_t size) {
  void *const memory = fails("operator new") ? nullptr : std::malloc(size == 0 ? 1 : size);
  if (memory == nullptr) {
    throw std::bad_alloc();
  }
  return memory;
}

} // namespace

AllocFailure::AllocFailure(int nth, bool lasting) : fault_("operator new", nth, ENOMEM, lasting) {}

} // namespace KovaTest

void *operator new(std::size_t size) {
  return KovaTest::allocate(size);
}
void *operator new[](std::size_t size) {
  return KovaTest::allocate(size);
}
// Never fails: the standard library calls it only where it has a fallback. Defined because a
// sanitizer's own would not match our delete.
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
