#include "tools/kovabackup/facts/processes.h"

#include <fmt/format.h>
#include <fstream>

namespace KOVA::Backup::Tool {

std::string commandOf(pid_t pid) {
  std::ifstream in(fmt::format("/proc/{}/comm", pid));
  std::string name;
  std::getline(in, name);
  return name;
}

} // namespace KOVA::Backup::Tool
