#include "tools/kovabackup/facts/lock_keepers.h"

#include "tools/kovabackup/facts/folder_names.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <climits>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

bool isNumber(const std::string &name) {
  return std::all_of(name.begin(), name.end(),
                     [](unsigned char c) { return std::isdigit(c) != 0; });
}

std::string targetOf(const std::string &link) {
  std::array<char, PATH_MAX> target{};
  const ssize_t length = ::readlink(link.c_str(), target.data(), target.size());
  return length > 0 ? std::string(target.data(), static_cast<std::size_t>(length)) : "";
}

// A line of fdinfo about an flock reads "lock:\t1: FLOCK  ADVISORY  WRITE 4711 00:2e:77 0 EOF". The
// kernel writes one only for a lock that this descriptor has.
bool hasFlock(const std::string &fdinfo) {
  std::ifstream lines(fdinfo);
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind("lock:", 0) == 0 && line.find(" FLOCK ") != std::string::npos) {
      return true;
    }
  }
  return false;
}

// The name is compared first: following a link to a file on a server that does not answer would
// never end.
bool isOn(const std::string &link, const std::string &name, const struct stat &file) {
  const std::string target = targetOf(link);
  struct stat info = {};
  return target.substr(target.rfind('/') + 1) == name && ::stat(link.c_str(), &info) == 0 &&
         info.st_dev == file.st_dev && info.st_ino == file.st_ino;
}

bool keeps(const std::string &process, const std::string &name, const struct stat &file) {
  std::vector<std::string> descriptors; // none of another user's process or of one that has ended
  (void)addNamesIn(process + "/fd", descriptors);
  return std::any_of(descriptors.begin(), descriptors.end(), [&](const std::string &fd) {
    return isOn(process + "/fd/" + fd, name, file) && hasFlock(process + "/fdinfo/" + fd);
  });
}

std::string commandOf(const std::string &process) {
  std::ifstream text(process + "/comm");
  std::string command;
  std::getline(text, command);
  return command;
}

} // namespace

std::vector<LockKeeper> lockKeepersOf(const std::string &file) {
  std::vector<LockKeeper> keepers;
  struct stat info = {};
  if (::stat(file.c_str(), &info) != 0) {
    return keepers;
  }
  const std::string name = file.substr(file.rfind('/') + 1);
  const std::string self = std::to_string(::getpid());
  std::vector<std::string> numbers;
  (void)addNamesIn("/proc", numbers);
  for (const std::string &number : numbers) {
    const std::string process = "/proc/" + number;
    if (isNumber(number) && number != self && keeps(process, name, info)) {
      keepers.push_back({static_cast<pid_t>(std::stol(number)), commandOf(process)});
    }
  }
  return keepers;
}

// The first PID namespace always has this number (PROC_PID_INIT_INO of the kernel).
bool seesAllProcesses() {
  return targetOf("/proc/self/ns/pid") == "pid:[4026531836]";
}

} // namespace KOVA::Backup::Tool
