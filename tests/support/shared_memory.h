#ifndef KOVABACKUP_TESTS_SHARED_MEMORY_H
#define KOVABACKUP_TESTS_SHARED_MEMORY_H

/// @file Objects that a test shares with the children that it forks.

#include <new>
#include <sys/mman.h>

namespace KovaTest {

/// A default-constructed object in shared memory, which munmap releases; nullptr when memory runs
/// out.
template <typename Object>
Object *makeShared() {
  void *const memory =
      ::mmap(nullptr, sizeof(Object), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  return memory == MAP_FAILED ? nullptr : new (memory) Object();
}

} // namespace KovaTest

#endif
