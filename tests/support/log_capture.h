#ifndef KOVABACKUP_TESTS_LOG_CAPTURE_H
#define KOVABACKUP_TESTS_LOG_CAPTURE_H

/// @file The system log as a list: the test program defines syslog, so that complete lines arrive
/// here and nothing reaches the log of the machine.
///
///     LogCapture log;
///     EXPECT_FALSE(load(""));
///     EXPECT_THAT(log.take(), ElementsAre(errLine("session", 174, "invalid parameter, ...")));
///
/// A line written while no LogCapture exists fails the test: silence is part of every contract.

#include <ostream>
#include <string>
#include <vector>

namespace KovaTest {

struct LogLine {
  int priority;
  std::string text;

  bool operator==(const LogLine &other) const {
    return priority == other.priority && text == other.text;
  }
};

std::ostream &operator<<(std::ostream &os, const LogLine &line);

/// A line as the library writes failures: LOG_ERR "(<this pid>) [err] <module>:<number> <text>".
LogLine errLine(const std::string &module, int number, const std::string &text);

/// LOG_DEBUG "(<this pid>) [debug] <module>:<number> <text>".
LogLine debugLine(const std::string &module, int number, const std::string &text);

/// A line without PID and tag: "<module>:<number> <text>".
LogLine bareLine(int priority, const std::string &module, int number, const std::string &text);

/// Collects the lines written during its lifetime. Do not nest. Lines that a forked child writes
/// stay in the child, unless the absolute path of a file is given: then every line is also appended
/// to that file, as "<priority> <text>\n", with the PID of the writer replaced by "PID".
class LogCapture {
public:
  LogCapture();
  explicit LogCapture(const std::string &file);
  ~LogCapture();
  LogCapture(const LogCapture &) = delete;
  LogCapture &operator=(const LogCapture &) = delete;

  /// The lines so far; the list is empty afterwards.
  std::vector<LogLine> take();
};

} // namespace KovaTest

#endif
