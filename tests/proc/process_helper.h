#ifndef KOVABACKUP_TESTS_PROCESS_HELPER_H
#define KOVABACKUP_TESTS_PROCESS_HELPER_H

/// @file For tests that start tests/proc/process_helper.cpp.

#include "tests/support/files.h"

#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <sys/stat.h>

namespace KovaTest {

/// The path of the helper.
inline const std::string kHelper = KOVA_PROCESS_HELPER;

/// Creates a FIFO to synchronise at. Returns path.
inline std::string makeFifo(const std::string &path) {
  (void)::mkfifo(path.c_str(), 0600);
  return path;
}

/// Lets a helper that reads a gate continue: opens the FIFO for writing, which waits for the
/// reader, and closes it.
inline void openGate(const std::string &fifo) {
  const std::ofstream gate(fifo);
}

/// The report of a helper: "fd 0" -> "/dev/null", "env PATH" -> "/bin", "cwd" -> "/".
using Report = std::map<std::string, std::string>;

inline Report parseReport(const std::string &text) {
  Report report;
  std::istringstream in(text);
  for (std::string line; std::getline(in, line);) {
    const std::size_t equals = line.find('=');
    report[line.substr(0, equals)] = line.substr(equals + 1);
  }
  return report;
}

/// The entries whose names start with prefix, with the prefix removed.
inline Report withPrefix(const Report &report, const std::string &prefix) {
  Report some;
  for (const auto &[name, value] : report) {
    if (name.rfind(prefix, 0) == 0) {
      some[name.substr(prefix.size())] = value;
    }
  }
  return some;
}

} // namespace KovaTest

#endif
