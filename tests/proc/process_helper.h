#ifndef KOVABACKUP_TESTS_PROCESS_HELPER_H
#define KOVABACKUP_TESTS_PROCESS_HELPER_H

/// @file What tests share that start tests/proc/process_helper.cpp.

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest {

/// The helper's path.
inline const std::string kHelper = KOVA_PROCESS_HELPER;

/// A folder of the test's own, gone with the object.
class TestFolder {
public:
  TestFolder() {
    char path[] = "/tmp/proc.XXXXXX";
    path_ = ::mkdtemp(path);
  }
  ~TestFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  TestFolder(const TestFolder &) = delete;
  TestFolder &operator=(const TestFolder &) = delete;

  std::string file(const std::string &name) const { return path_ + "/" + name; }

  /// Makes a FIFO to meet at.
  std::string fifo(const std::string &name) const {
    (void)::mkfifo(file(name).c_str(), 0600);
    return file(name);
  }

private:
  std::string path_;
};

inline std::string readFile(const std::string &path) {
  std::ifstream in(path);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

/// Lets a helper go on that reads a gate: opens the FIFO for writing, which waits for the reader,
/// and closes it.
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

/// The entries whose names begin with prefix, without it.
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
