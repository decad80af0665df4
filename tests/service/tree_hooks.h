#ifndef KOVABACKUP_TESTS_SERVICE_TREE_HOOKS_H
#define KOVABACKUP_TESTS_SERVICE_TREE_HOOKS_H

/// @file The system calls of a walk or a removal, for tests that act before one or make it fail, as
/// fault.h does. Their names are openat, openat2, statx, getdents64 and unlinkat.
///
///     beforeCall = [&](const std::string &call, const char *name) { ... };

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace KovaTest {

/// Runs before each call, with its name and the path in it, "" when it has none. Calls that it
/// makes itself do not run it again.
extern std::function<void(const std::string &call, const char *name)> beforeCall;

/// While true, the open_how::resolve of each openat2 is added to resolvedWith.
extern bool recordsResolve;
extern std::vector<std::uint64_t> resolvedWith;

/// While true, getdents64 gives no types, as some file systems do.
extern bool withoutTypes;

/// While true, statx gives no ids of mounts, as kernels before 5.8.
extern bool withoutMountIds;

} // namespace KovaTest

#endif
