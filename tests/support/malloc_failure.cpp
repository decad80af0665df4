#include "tests/support/alloc_failure.h"

#include <cerrno>
#include <cstdlib>

namespace KovaTest {
namespace {

// A compiler may turn a realloc of nothing into a call of malloc, which would call itself.
void *(*const volatile allocate)(void *, std::size_t) = &std::realloc;

bool mayFail = false;

} // namespace

MallocFailure::MallocFailure(int nth, bool lasting) : fault_("malloc", nth, ENOMEM, lasting) {
  mayFail = true;
}

MallocFailure::~MallocFailure() {
  mayFail = false;
}

} // namespace KovaTest

// Sanitizers call it before they can check any access. Faults are not looked up then.
extern "C" [[gnu::no_sanitize_address, gnu::no_sanitize_thread]] void *
malloc(std::size_t size) noexcept {
  if (KovaTest::mayFail && KovaTest::failsNow("malloc")) {
    return nullptr;
  }
  return KovaTest::allocate(nullptr, size == 0 ? 1 : size);
}
