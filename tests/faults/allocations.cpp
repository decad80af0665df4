#include "tests/faults/allocations.h"

#include "tests/faults/report.h"

#include <cerrno>
#include <cstddef>

namespace KovaTest::Faults {
namespace {

// Not in the report: a program that another one starts does not count.
bool counting = false;
int live = 0;

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

void *counted(void *memory) {
  live += memory == nullptr ? 0 : 1;
  return memory;
}

} // namespace

void countAllocations(bool on) {
  counting = on;
}

int liveAllocations() {
  return live;
}

} // namespace KovaTest::Faults

// The C library offers its own functions under these names, to programs that define the usual ones.
extern "C" {

void *__libc_malloc(std::size_t size);
void *__libc_calloc(std::size_t count, std::size_t size);
void *__libc_realloc(void *memory, std::size_t size);
void __libc_free(void *memory);

__attribute__((visibility("default"))) void *malloc(std::size_t size) {
  using namespace KovaTest::Faults;
  return failsNow() ? nullptr : counted(__libc_malloc(size));
}

__attribute__((visibility("default"))) void *calloc(std::size_t count, std::size_t size) {
  using namespace KovaTest::Faults;
  return failsNow() ? nullptr : counted(__libc_calloc(count, size));
}

__attribute__((visibility("default"))) void *realloc(void *memory, std::size_t size) {
  using namespace KovaTest::Faults;
  if (failsNow()) {
    return nullptr;
  }
  void *const grown = __libc_realloc(memory, size);
  return memory == nullptr ? counted(grown) : grown;
}

__attribute__((visibility("default"))) void free(void *memory) {
  KovaTest::Faults::live -= memory == nullptr ? 0 : 1;
  __libc_free(memory);
}
}
