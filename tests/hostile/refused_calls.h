#ifndef KOVABACKUP_TESTS_HOSTILE_REFUSED_CALLS_H
#define KOVABACKUP_TESTS_HOSTILE_REFUSED_CALLS_H

/// @file System calls that the kernel refuses to this process and its children, as the filters of
/// containers do. The steps throw Lacking where there are no such filters.

#include <vector>

namespace KovaTest::Hostile {

/// Refuses the calls of these numbers (SYS_...) with this errno.
void refuseCalls(const std::vector<long> &numbers, int error);

/// Refuses to make unnamed files (O_TMPFILE), as many file systems do.
void refuseUnnamedFiles(int error);

} // namespace KovaTest::Hostile

#endif
