#include "tests/faults/process_state.h"

#include <filesystem>
#include <fstream>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;

std::string folderOf(pid_t pid) {
  return "/proc/" + std::to_string(pid);
}

} // namespace

std::set<std::string> openDescriptors(pid_t pid) {
  std::set<std::string> open;
  std::error_code ignored;
  for (const fs::directory_entry &entry : fs::directory_iterator(folderOf(pid) + "/fd", ignored)) {
    open.insert(entry.path().filename().string() + " -> " +
                fs::read_symlink(entry.path(), ignored).string());
  }
  return open;
}

std::string signalState(pid_t pid) {
  std::ifstream status(folderOf(pid) + "/status");
  std::string state;
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("SigBlk", 0) == 0 || line.rfind("SigIgn", 0) == 0 ||
        line.rfind("SigCgt", 0) == 0) {
      state += line + "\n";
    }
  }
  return state;
}

int countChildren(pid_t pid) {
  const std::string number = std::to_string(pid);
  std::ifstream list(folderOf(pid) + "/task/" + number + "/children");
  int count = 0;
  for (std::string child; list >> child;) {
    ++count;
  }
  return count;
}

} // namespace KovaTest::Faults
