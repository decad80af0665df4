#ifndef KOVABACKUP_TESTS_FAULTS_REPORT_H
#define KOVABACKUP_TESTS_FAULTS_REPORT_H

/// @file What a traced process says while its system calls fail: through shared memory, so that
/// saying it takes no system call.

#include <array>
#include <atomic>
#include <cstdarg>
#include <cstddef>
#include <string>
#include <string_view>

namespace KovaTest::Faults {

/// Text that several processes append to; what does not fit is cut.
class SharedText {
public:
  void append(std::string_view text);
  std::string text() const;
  void clear() { used_ = 0; }

private:
  std::atomic<std::size_t> used_{0};
  std::array<char, 65536> bytes_{};
};

struct Report {
  SharedText said;                 ///< "key=value" lines: what the library reported to the scenario
  SharedText log;                  ///< lines that went to the system log
  std::atomic<int> allocations{0}; ///< counted since the marker
  std::atomic<int> kept{0};        ///< allocations that were not released
  std::atomic<int> failAllocation{0};      ///< the one that fails; 0 for none
  std::atomic<bool> failAfterwards{false}; ///< all after it fail, too
};

/// The variable that holds the number of the descriptor of a report, for programs.
constexpr const char *kReportVariable = "KOVA_FAULTS_REPORT";

/// The report of this process, made with its first call. Inherited by fork.
Report &report();
/// The same for a program: maps the report behind a descriptor.
void useReport(int fd);
/// A descriptor of the report, for programs.
int reportDescriptor();

/// Appends "key=value" to what was said.
void say(const char *key, std::string_view value);
void say(const char *key, bool value);
void say(const char *key, int value);

/// Appends a line of the system log, as syslog(3) formats it.
void noteLogLine(const char *format, va_list args) __attribute__((format(printf, 1, 0)));

} // namespace KovaTest::Faults

#endif
