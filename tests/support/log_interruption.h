#ifndef KOVABACKUP_TESTS_LOG_INTERRUPTION_H
#define KOVABACKUP_TESTS_LOG_INTERRUPTION_H

/// @file What may come in while the system log holds its lock.
///
///     LogCapture log;
///     const LogInterruption signal([] { ::raise(SIGTERM); });
///     ...                                     // the next line is interrupted, those after it not

#include <functional>

namespace KovaTest {

/// Runs something once, in the midst of the writing of the next line. One at a time.
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
