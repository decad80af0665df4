#ifndef KOVABACKUP_TESTS_CRASH_FILES_H
#define KOVABACKUP_TESTS_CRASH_FILES_H

/// @file What the workloads ask about files.

#include "tests/crash/shared.h"

#include <string>
#include <vector>

namespace KovaTest::Crash {

/// Throws std::runtime_error unless the condition holds; for the process that checks.
void mustHold(bool condition, const std::string &what);

/// Makes a folder, and those above it, that stay after a power cut. Returns: its path.
std::string makeFolder(const std::string &path);

/// The names in a folder, in order; none when it cannot be read.
std::vector<std::string> namesIn(const std::string &folder);

/// The content of a file; "" when it cannot be read.
std::string contentOf(const std::string &path);

/// The temporary names beside a file, that is, the hidden names of its folder.
std::string leftovers(const std::string &path);

/// "WHAT: 5 on the disk, 6 kept, 7 attempted"
std::string differing(const std::string &what, const Progress &progress, int found);

} // namespace KovaTest::Crash

#endif
