#ifndef KOVABACKUP_TESTS_FAULTS_ALLOCATIONS_H
#define KOVABACKUP_TESTS_FAULTS_ALLOCATIONS_H

/// @file Memory that runs out: the nth allocation of a process fails, once or for good. Covers
/// malloc, calloc and realloc, and so operator new and the memory of C libraries.

namespace KovaTest::Faults {

/// Counts the allocations of this process and its children from now on, in the report, and makes
/// those fail that the report names.
void countAllocations(bool on);

} // namespace KovaTest::Faults

#endif
