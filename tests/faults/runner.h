#ifndef KOVABACKUP_TESTS_FAULTS_RUNNER_H
#define KOVABACKUP_TESTS_FAULTS_RUNNER_H

/// @file Runs scenarios and checks what they leave.

#include "tests/faults/scenario.h"

#include <string>
#include <vector>

namespace KovaTest::Faults {

/// Runs a scenario in a fresh world (world.h).
Seen runScenario(const Scenario &scenario, const Injection &injection);

/// What is wrong with a run; nothing is when the list is empty.
std::vector<std::string> assess(const Scenario &scenario, const Seen &seen);

/// The same for a run in which nothing fails, which must succeed: a scenario that fails anyway
/// would pass all checks of what is reported.
std::vector<std::string> assessClean(const Scenario &scenario, const Seen &seen);

enum class Mode { Failures, Kills, Memory };

/// All injections of a mode into a scenario, from the calls of its clean run.
std::vector<Injection> injectionsFor(const Seen &clean, Mode mode);

/// "open fails with EIO at call 7 and after"
std::string describe(const Injection &injection, const Seen &seen);

} // namespace KovaTest::Faults

#endif
