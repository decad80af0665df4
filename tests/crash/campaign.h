#ifndef KOVABACKUP_TESTS_CRASH_CAMPAIGN_H
#define KOVABACKUP_TESTS_CRASH_CAMPAIGN_H

/// @file What both programs of this folder have in common: their arguments, the namespaces in which
/// they run, and how they report.

#include "tests/crash/workload.h"

#include <cstdint>
#include <functional>
#include <string>

namespace KovaTest::Crash {

struct Options {
  int count = 100;
  std::uint64_t seed = 0; ///< a random one by default
  std::string broken;     ///< what is made wrong on purpose
};

/// Reads "[NUMBER] [--seed SEED] [--broken WHAT]".
/// Returns: false on wrong usage.
bool parse(int argc, char **argv, Options &options);

/// Runs work in a mount namespace and a PID namespace of its own, with a private /tmp, where it is
/// the first process. What work returns is printed after "skipped: " unless it is empty.
/// Returns: an exit status.
int runInNamespaces(const std::function<std::string()> &work);

/// The world of a work: a private /tmp, and a volume without a file system of its own. Returns: ""
/// or why there is none.
std::string enterWorld();

/// The exit status of the work, unless it was skipped.
void setFailed();

/// Prints a line each time that another tenth of all is done.
void showProgress(int before, int now, int all, const char *what);

/// Prints what was found, the first few of all.
void show(const std::string &where, const Findings &findings);

} // namespace KovaTest::Crash

#endif
