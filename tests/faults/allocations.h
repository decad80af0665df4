#ifndef KOVABACKUP_TESTS_FAULTS_ALLOCATIONS_H
#define KOVABACKUP_TESTS_FAULTS_ALLOCATIONS_H

/// @file Memory that runs out: the nth allocation of a process fails, once or for good. Covers
/// malloc, calloc and realloc, and so operator new and the memory of C libraries.

namespace KovaTest::Faults {

/// Counts the allocations of this process and its children from now on, in the report, and makes
/// those fail that the report names.
void countAllocations(bool on);

/// How many allocations this process has made and not released, except those of aligned memory.
int liveAllocations();

/// Allocations of a scenario itself, which neither count nor fail.
class UncountedAllocations {
public:
  UncountedAllocations() { countAllocations(false); }
  ~UncountedAllocations() { countAllocations(true); }
  UncountedAllocations(const UncountedAllocations &) = delete;
  UncountedAllocations &operator=(const UncountedAllocations &) = delete;
};

} // namespace KovaTest::Faults

#endif
