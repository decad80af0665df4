#ifndef KOVABACKUP_TESTS_FAULTS_LOG_LINES_H
#define KOVABACKUP_TESTS_FAULTS_LOG_LINES_H

/// @file The lines that may appear in the system log.

#include <string>

namespace KovaTest::Faults {

/// Whether docs/messages.toml lists the line, by module, number and the beginning of its text; or
/// whether it is a line of the platform's stand-ins.
bool isKnownLogLine(const std::string &line);

} // namespace KovaTest::Faults

#endif
