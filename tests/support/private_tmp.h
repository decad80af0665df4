#ifndef KOVABACKUP_TESTS_PRIVATE_TMP_H
#define KOVABACKUP_TESTS_PRIVATE_TMP_H

/// @file A /tmp of the test program's own, so that no test meets the machine's sessions and locks.

#include <string>

namespace KovaTest {

/// Moves the process into a private mount namespace (inside a user namespace when it is not root)
/// with an empty file system on /tmp. Build and source tree stay where they are, even when they
/// lie under /tmp. Returns "" when done, else why it cannot be done.
std::string enterPrivateTmp();

} // namespace KovaTest

#endif
