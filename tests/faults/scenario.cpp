#include "tests/faults/scenario.h"

#include "tests/faults/calls.h"

#include <fnmatch.h>

namespace KovaTest::Faults {

std::string Seen::valueOf(const std::string &key) const {
  const auto found = said.find(key);
  return found == said.end() ? "" : found->second;
}

std::string Seen::contentOf(const std::string &path) const {
  const auto found = disk.find(path);
  return found == disk.end() ? "" : found->second;
}

std::vector<std::string> Seen::matching(const std::string &pattern) const {
  std::vector<std::string> paths;
  for (const auto &entry : disk) {
    if (::fnmatch(pattern.c_str(), entry.first.c_str(), FNM_PATHNAME | FNM_PERIOD) == 0) {
      paths.push_back(entry.first);
    }
  }
  return paths;
}

bool Seen::failedIn(const std::string &calls) const {
  return trace.failedCall >= 0 &&
         (" " + calls + " ").find(" " + std::string(callName(trace.failedCall)) + " ") !=
             std::string::npos;
}

} // namespace KovaTest::Faults
