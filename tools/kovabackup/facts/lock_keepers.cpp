#include "tools/kovabackup/facts/lock_keepers.h"

#include "kovabackup/path_util.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

namespace fs = std::filesystem;

bool isNumber(const std::string &name) {
  return std::all_of(name.begin(), name.end(),
                     [](unsigned char c) { return std::isdigit(c) != 0; });
}

// A line of fdinfo about an flock reads "lock:\t1: FLOCK  ADVISORY  WRITE 4711 00:2e:77 0 EOF". The
// kernel writes one only for a lock that this descriptor has.
bool hasFlock(const fs::path &fdinfo) {
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
bool isOn(const fs::path &link, const std::string &name, const struct stat &file) {
  std::error_code error;
  const fs::path target = fs::read_symlink(link, error);
  struct stat info = {};
  return !error && target.filename() == name && ::stat(link.c_str(), &info) == 0 &&
         info.st_dev == file.st_dev && info.st_ino == file.st_ino;
}

bool keeps(const fs::path &process, const std::string &name, const struct stat &file) {
  std::error_code error;
  for (fs::directory_iterator it(process / "fd", error), end; !error && it != end;
       it.increment(error)) {
    if (isOn(it->path(), name, file) && hasFlock(process / "fdinfo" / it->path().filename())) {
      return true;
    }
  }
  return false;
}

std::string commandOf(const fs::path &process) {
  std::ifstream text(process / "comm");
  std::string command;
  std::getline(text, command);
  return command;
}

} // namespace

std::vector<LockKeeper> lockKeepersOf(const std::string &file) {
  std::vector<LockKeeper> keepers;
  struct stat info = {};
  std::error_code error;
  if (::stat(file.c_str(), &info) != 0) {
    return keepers;
  }
  const std::string name = fs::path(file).filename();
  const std::string self = std::to_string(::getpid());
  for (fs::directory_iterator it("/proc", error), end; !error && it != end; it.increment(error)) {
    const std::string number = it->path().filename();
    if (isNumber(number) && number != self && keeps(it->path(), name, info)) {
      keepers.push_back({static_cast<pid_t>(std::stol(number)), commandOf(it->path())});
    }
  }
  return keepers;
}

// The first PID namespace always has this number (PROC_PID_INIT_INO of the kernel).
bool seesAllProcesses() {
  std::error_code error;
  return fs::read_symlink("/proc/self/ns/pid", error) == "pid:[4026531836]";
}

} // namespace KOVA::Backup::Tool
