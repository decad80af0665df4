#include "tests/support/log_capture.h"

#include "tests/support/log_interruption.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>
#include <utility>

namespace KovaTest {
namespace {

bool capturing = false;
int sharedFd = -1;
std::string sharedPath;
const std::function<void()> *interruption = nullptr;

// Created on first use: a library may log before the objects of this file are initialised.
std::vector<LogLine> &lines() {
  static std::vector<LogLine> list;
  return list;
}

void share(const LogLine &line) {
  const std::string own = "(" + std::to_string(::getpid()) + ")";
  std::string text = line.text;
  if (text.compare(0, own.size(), own) == 0) {
    text.replace(0, own.size(), "(PID)");
  }
  text = std::to_string(line.priority) + " " + text + "\n";
  if (::write(sharedFd, text.data(), text.size()) >= 0 || errno != EBADF) {
    return;
  }
  // A child that has closed its inherited descriptors. Bypasses libc's open and close, which a test
  // may count.
  const long fd = ::syscall(SYS_openat, AT_FDCWD, sharedPath.c_str(), O_WRONLY | O_APPEND, 0);
  (void)!::write(static_cast<int>(fd), text.data(), text.size());
  (void)::syscall(SYS_close, fd);
}

void record(int priority, const char *format, va_list args) {
  const int saved = errno;
  va_list again;
  va_copy(again, args);
  const int length = std::vsnprintf(nullptr, 0, format, args);
  std::string text(static_cast<std::size_t>(length), '\0');
  errno = saved;
  std::vsnprintf(text.data(), text.size() + 1, format, again);
  va_end(again);
  if (const auto *const now = std::exchange(interruption, nullptr)) {
    (*now)();
  }
  const LogLine line{priority, text};
  if (sharedFd >= 0) {
    share(line);
  }
  if (capturing) {
    lines().push_back(line);
  } else {
    ADD_FAILURE() << "unexpected log line: " << line;
  }
  errno = EXFULL; // since the real syslog may leave any value there
}

} // namespace

std::ostream &operator<<(std::ostream &os, const LogLine &line) {
  return os << line.priority << " \"" << line.text << "\"";
}

LogLine errLine(const std::string &module, int number, const std::string &text) {
  return {LOG_ERR, "(" + std::to_string(::getpid()) + ") [err] " + module + ":" +
                       std::to_string(number) + " " + text};
}

LogLine debugLine(const std::string &module, int number, const std::string &text) {
  return {LOG_DEBUG, "(" + std::to_string(::getpid()) + ") [debug] " + module + ":" +
                         std::to_string(number) + " " + text};
}

LogLine bareLine(int priority, const std::string &module, int number, const std::string &text) {
  return {priority, module + ":" + std::to_string(number) + " " + text};
}

LogCapture::LogCapture() {
  capturing = true;
  lines().clear();
}

LogCapture::LogCapture(const std::string &file) : LogCapture() {
  sharedPath = file;
  // Out of the way of tests that reassign low descriptors.
  const int low = ::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  sharedFd = ::fcntl(low, F_DUPFD_CLOEXEC, 500);
  ::close(low);
}

LogCapture::~LogCapture() {
  capturing = false;
  lines().clear();
  if (sharedFd >= 0) {
    ::close(std::exchange(sharedFd, -1));
  }
}

std::vector<LogLine> LogCapture::take() {
  return std::exchange(lines(), {});
}

LogInterruption::LogInterruption(std::function<void()> what) : what_(std::move(what)) {
  interruption = &what_;
}

LogInterruption::~LogInterruption() {
  interruption = nullptr;
}

} // namespace KovaTest

// The functions through which a library may write to the system log; a fortified build calls the
// last two instead of the first two.
extern "C" {

__attribute__((format(printf, 2, 3))) void syslog(int priority, const char *format, ...) {
  va_list args;
  va_start(args, format);
  KovaTest::record(priority, format, args);
  va_end(args);
}

__attribute__((format(printf, 2, 0))) void vsyslog(int priority, const char *format, va_list args) {
  KovaTest::record(priority, format, args);
}

__attribute__((format(printf, 3, 4))) void __syslog_chk(int priority, int, const char *format,
                                                        ...) {
  va_list args;
  va_start(args, format);
  KovaTest::record(priority, format, args);
  va_end(args);
}

__attribute__((format(printf, 3, 0))) void __vsyslog_chk(int priority, int, const char *format,
                                                         va_list args) {
  KovaTest::record(priority, format, args);
}
}
