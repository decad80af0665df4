#include "tools/kovabackup/frame/program.h"

#include "kovabackup/path_util.h"

#include <cstdlib>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {

bool isProgram(const std::string &path) {
  struct stat info;
  return ::stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
         ::access(path.c_str(), X_OK) == 0;
}

std::string findProgram(const std::string &name) {
  const char *path = std::getenv("PATH");
  std::istringstream folders(path == nullptr ? "/usr/bin:/bin" : path);
  std::string folder;
  while (!name.empty() && std::getline(folders, folder, ':')) {
    std::string candidate = Path::join(Path::absPath(folder), name);
    if (isProgram(candidate)) {
      return candidate;
    }
  }
  return "";
}

} // namespace KOVA::Backup::Tool
