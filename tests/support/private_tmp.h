#ifndef KOVABACKUP_TESTS_PRIVATE_TMP_H
#define KOVABACKUP_TESTS_PRIVATE_TMP_H

/// @file A private /tmp for the test program, so that no test sees sessions and locks of the
/// machine.

#include <string>

namespace KovaTest {

/// Moves the process into a private mount namespace (inside a user namespace when it is not root)
/// with an empty file system on /tmp. Build and source tree keep their paths, even under /tmp.
/// Returns: "" on success, otherwise the reason of the failure.
std::string enterPrivateTmp();

} // namespace KovaTest

#endif
