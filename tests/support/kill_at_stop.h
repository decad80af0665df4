#ifndef KOVABACKUP_TESTS_KILL_AT_STOP_H
#define KOVABACKUP_TESTS_KILL_AT_STOP_H

/// @file A process that is killed at each of its system calls in turn.
///
///     const std::string why = whyNoStops();
///     if (!why.empty()) GTEST_SKIP() << why;
///     bool killed = true;
///     for (int nth = 1; killed; ++nth) {
///       killed = killAtStop(nth, [&] { ...the operation... });
///       ...what must hold afterwards...
///     }

#include <functional>
#include <string>
#include <sys/types.h>

namespace KovaTest {

/// Why processes cannot be stopped at system calls here; "" when they can.
std::string whyNoStops();

/// Forks a child that does the work. It exits with 1 when an expectation failed in it, else with 0.
pid_t startWork(const std::function<void()> &work);

/// Lets a child do the work up to its nth stop (from 1), at the start or end of a system call, and
/// kills it there. Returns: false when the child ended before that; its exit status must be 0.
bool killAtStop(int nth, const std::function<void()> &work);

} // namespace KovaTest

#endif
