#include "tests/faults/report.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <sys/mman.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

Report *shared = nullptr;
int descriptor = -1;

// Above the numbers that scenarios get for their own files.
constexpr int kDescriptor = 900;

Report *map(int fd) {
  void *const memory = ::mmap(nullptr, sizeof(Report), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  return memory == MAP_FAILED ? nullptr : static_cast<Report *>(memory);
}

void createReport() {
  const int fd = ::memfd_create("report", 0);
  descriptor = ::dup2(fd, kDescriptor);
  ::close(fd);
  if (descriptor < 0 || ::ftruncate(descriptor, sizeof(Report)) != 0 ||
      (shared = map(descriptor)) == nullptr) {
    std::perror("no shared memory for reports");
    std::exit(EXIT_FAILURE);
  }
  new (shared) Report();
}

} // namespace

void SharedText::append(std::string_view text) {
  const std::size_t at = used_.fetch_add(text.size());
  if (at < bytes_.size()) {
    const std::size_t length = std::min(text.size(), bytes_.size() - at);
    std::memcpy(bytes_.data() + at, text.data(), length);
  }
}

std::string SharedText::text() const {
  return {bytes_.data(), std::min(used_.load(), bytes_.size())};
}

Report &report() {
  if (shared == nullptr) {
    createReport();
  }
  return *shared;
}

void useReport(int fd) {
  shared = map(fd);
}

int reportDescriptor() {
  (void)report();
  return descriptor;
}

void say(const char *key, std::string_view value) {
  std::array<char, 512> line{};
  const int length = std::snprintf(line.data(), line.size(), "%s=%.*s\n", key,
                                   static_cast<int>(value.size()), value.data());
  report().said.append({line.data(), std::min(static_cast<std::size_t>(length), line.size() - 1)});
}

void say(const char *key, bool value) {
  say(key, value ? std::string_view("true") : std::string_view("false"));
}

void say(const char *key, int value) {
  std::array<char, 16> digits{};
  std::snprintf(digits.data(), digits.size(), "%d", value);
  say(key, std::string_view(digits.data()));
}

void noteLogLine(const char *format, va_list args) {
  const int saved = errno;
  std::array<char, 2048> line{};
  const int length = std::vsnprintf(line.data(), line.size() - 1, format, args);
  if (length >= 0 && shared != nullptr) {
    const std::size_t used = std::min(static_cast<std::size_t>(length), line.size() - 2);
    line[used] = '\n';
    shared->log.append({line.data(), used + 1});
  }
  errno = saved;
}

} // namespace KovaTest::Faults

// The functions through which a library writes to the system log; a fortified build calls the last
// two.
extern "C" {

__attribute__((format(printf, 2, 3), visibility("default"))) void syslog(int, const char *format,
                                                                         ...) {
  va_list args;
  va_start(args, format);
  KovaTest::Faults::noteLogLine(format, args);
  va_end(args);
}

__attribute__((format(printf, 2, 0), visibility("default"))) void vsyslog(int, const char *format,
                                                                          va_list args) {
  KovaTest::Faults::noteLogLine(format, args);
}

__attribute__((format(printf, 3, 4), visibility("default"))) void
__syslog_chk(int, int, const char *format, ...) {
  va_list args;
  va_start(args, format);
  KovaTest::Faults::noteLogLine(format, args);
  va_end(args);
}

__attribute__((format(printf, 3, 0), visibility("default"))) void
__vsyslog_chk(int, int, const char *format, va_list args) {
  KovaTest::Faults::noteLogLine(format, args);
}
}
