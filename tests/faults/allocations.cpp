#include "tests/faults/allocations.h"

#include "tests/faults/report.h"

#include <cerrno>
#include <cstddef>

namespace KovaTest::Faults {
namespace {

// Not in the report: a program that another one starts does not count.
bool counting = false;

bool failsNow() {
  if (!counting) {
    return false;
  }
  Report &shared = report();
  const int number = ++shared.allocations;
  const int failing = shared.failAllocation;
  const bool fails =
      failing > 0 && (number == failing || (number > failing && shared.failAfterwards));
  if (fails) {
    errno = ENOMEM;
  }
  return fails;
}

} // namespace

void countAllocations(bool on) {
  counting = on;
}

} // namespace KovaTest::Faults

// The C library offers its own functions under these names, to programs that define the usual ones.
extern "C" {

void *__libc_malloc(std::size_t size);
void *__libc_calloc(std::size_t count, std::size_t size);
void *__libc_realloc(void *memory, std::size_t size);

__attribute__((visibility("default"))) void *malloc(std::size_t size) {
  return KovaTest::Faults::failsNow() ? nullptr : __libc_malloc(size);
}

__attribute__((visibility("default"))) void *calloc(std::size_t count, std::size_t size) {
  return KovaTest::Faults::failsNow() ? nullptr : __libc_calloc(count, size);
}

__attribute__((visibility("default"))) void *realloc(void *memory, std::size_t size) {
  return KovaTest::Faults::failsNow() ? nullptr : __libc_realloc(memory, size);
}
}
