#ifndef KOVABACKUP_TESTS_LOG_INTERRUPTION_H
#define KOVABACKUP_TESTS_LOG_INTERRUPTION_H

/// @file Simulates a signal that arrives while the system log holds its lock.
///
///     LogCapture log;
///     const LogInterruption signal([] { ::raise(SIGTERM); });
///     ...                                     // interrupts the next line only

#include <functional>

namespace KovaTest {

/// Calls a function once, in the middle of writing the next line. One at a time.
class LogInterruption {
public:
  explicit LogInterruption(std::function<void()> what);
  ~LogInterruption();
  LogInterruption(const LogInterruption &) = delete;
  LogInterruption &operator=(const LogInterruption &) = delete;

private:
  const std::function<void()> what_;
};

} // namespace KovaTest

#endif
