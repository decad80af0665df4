#ifndef KOVABACKUP_TESTS_LAUNCH_FIXTURE_H
#define KOVABACKUP_TESTS_LAUNCH_FIXTURE_H

/// @file The fixture of tests that launch a command: a folder, and the log of parent and children.

#include "kovabackup/subprocess.h"
#include "tests/proc/process_helper.h"
#include "tests/support/child_process.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstring>
#include <functional>
#include <gmock/gmock.h>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <syslog.h>
#include <vector>

namespace KovaTest {

class Launch : public testing::Test {
protected:
  using SubProcess = KOVA::Backup::SubProcess;

  /// The lines logged so far by parent and children, "<priority> (PID) ...".
  std::vector<std::string> logged() const {
    std::vector<std::string> lines;
    std::istringstream in(readFile(folder_ / "log"));
    for (std::string line; std::getline(in, line);) {
      lines.push_back(line);
    }
    return lines;
  }

  /// The same without the lines at LOG_DEBUG.
  std::vector<std::string> failures() const {
    std::vector<std::string> lines;
    for (const std::string &line : logged()) {
      if (line.rfind(std::to_string(LOG_DEBUG) + " ", 0) != 0) {
        lines.push_back(line);
      }
    }
    return lines;
  }

  /// A failure of the launcher as it appears in that list.
  static std::string failure(int number, const std::string &text) {
    return std::to_string(LOG_ERR) + " (PID) [err] proc/subprocess:" + std::to_string(number) +
           " " + text;
  }
  static std::string failure(int number, const std::string &text, int error) {
    return failure(number, text + " failed, " + std::strerror(error));
  }

  std::string file(const std::string &name) const { return folder_ / name; }
  std::string fifo(const std::string &name) const { return makeFifo(folder_ / name); }

  /// The helper's command line.
  static std::vector<std::string> helperArgs(std::vector<std::string> words) {
    words.insert(words.begin(), kHelper);
    return words;
  }

  /// Runs the helper's "report" with the settings that amend makes, and returns the report.
  Report reportWith(const std::function<void(SubProcess &)> &amend) {
    SubProcess command(helperArgs({"report", file("report")}));
    amend(command);
    EXPECT_EQ(0, command.call());
    return parseReport(readFile(file("report")));
  }

private:
  const TestFolder folder_;
  LogCapture log_{folder_ / "log"};
};

} // namespace KovaTest

#endif
