#ifndef KOVABACKUP_TESTS_COMMAND_FIXTURE_H
#define KOVABACKUP_TESTS_COMMAND_FIXTURE_H

/// @file What the tests of Command share.

#include "kovabackup/service/command.h"
#include "tests/proc/process_helper.h"
#include "tests/support/child_process.h"
#include "tests/support/log_capture.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>
#include <vector>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr bool kBuiltWithSanitizer = true;
#else
inline constexpr bool kBuiltWithSanitizer = false;
#endif

namespace KovaTest {

inline const std::string kCommandHelper = KOVA_COMMAND_HELPER;

/// A pipe whose ends close with the object.
class Pipe {
public:
  Pipe() { EXPECT_EQ(0, ::pipe2(ends_.data(), O_CLOEXEC)); }
  ~Pipe() {
    closeReadEnd();
    closeWriteEnd();
  }
  Pipe(const Pipe &) = delete;
  Pipe &operator=(const Pipe &) = delete;

  int readEnd() const { return ends_[0]; }
  int writeEnd() const { return ends_[1]; }
  void closeReadEnd() { close(ends_[0]); }
  void closeWriteEnd() { close(ends_[1]); }

  /// Reads until the last holder of the other end has closed it.
  std::string readToEnd() {
    closeWriteEnd();
    std::string text;
    std::array<char, 4096> buffer;
    ssize_t got = 0;
    while ((got = ::read(readEnd(), buffer.data(), buffer.size())) > 0 ||
           (got < 0 && errno == EINTR)) {
      text.append(buffer.data(), got > 0 ? static_cast<std::size_t>(got) : 0);
    }
    return text;
  }

private:
  static void close(int &fd) {
    if (fd >= 0) {
      ::close(std::exchange(fd, -1));
    }
  }

  std::array<int, 2> ends_{-1, -1};
};

/// A handler for a signal while the object exists; it calls a function, or does nothing.
class Handler {
public:
  explicit Handler(
      int sig, void (*handler)(int) = [](int) {})
      : sig_(sig) {
    struct sigaction action = {};
    action.sa_handler = handler;
    ::sigaction(sig_, &action, &before_);
  }
  ~Handler() { ::sigaction(sig_, &before_, nullptr); }
  Handler(const Handler &) = delete;
  Handler &operator=(const Handler &) = delete;

private:
  int sig_;
  struct sigaction before_ = {};
};

class CommandTest : public testing::Test {
protected:
  using Cancel = KOVA::Backup::Service::Cancel;
  using Command = KOVA::Backup::Service::Command;
  using Error = KOVA::Backup::Service::Error;
  using Millis = KOVA::Backup::Service::Millis;
  using Result = KOVA::Backup::Service::Result;
  using Running = KOVA::Backup::Service::Running;
  using Stream = KOVA::Backup::Service::Stream;
  using End = Result::End;

  /// A command of tests/proc/process_helper.cpp.
  static Command given(std::vector<std::string> words) {
    words.insert(words.begin(), kHelper);
    return Command(std::move(words));
  }

  /// A command of tests/service/command_helper.cpp.
  static Command helper(std::vector<std::string> words) {
    words.insert(words.begin(), kCommandHelper);
    return Command(std::move(words));
  }

  /// Runs "report" under what amend sets, and returns the report.
  Report reportWith(const std::function<void(Command &)> &amend) {
    Command command = given({"report", folder_ / "report"});
    amend(command);
    const Result result = command.run();
    EXPECT_TRUE(result.ok()) << result.code << " " << result.error.step << " " << result.error.path
                             << " " << result.error.code;
    return parseReport(readFile(folder_ / "report"));
  }

  /// The line of a failure before the child exists, and of one in it.
  static LogLine notStarted(const std::string &program, const std::string &step,
                            const std::string &path, int error) {
    return errLine("service/command", 101,
                   "[" + program + "] was not started: " + step + " [" + path + "] failed, " +
                       std::strerror(error));
  }
  static LogLine notExecuted(const std::string &program, const std::string &step,
                             const std::string &path, int error) {
    return errLine("service/command", 102,
                   "[" + program + "] was not executed: " + step + " [" + path + "] failed, " +
                       std::strerror(error));
  }

  const TestFolder folder_;
  LogCapture log_;
};

} // namespace KovaTest

#endif
