#ifndef KOVABACKUP_TESTS_CRASH_PROGRAMS_H
#define KOVABACKUP_TESTS_CRASH_PROGRAMS_H

/// @file Programs whose output goes to a file.

#include <string>
#include <vector>

namespace KovaTest::Crash {

/// Replaces this process by a program.
[[noreturn]] void becomeProgram(const std::vector<std::string> &arguments,
                                const std::string &output = "/dev/null");

/// Runs a program to its end. Returns: its exit status, -1 when a signal ended it.
int runProgram(const std::vector<std::string> &arguments, const std::string &output = "/dev/null");

} // namespace KovaTest::Crash

#endif
