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

// As a shell does: an empty component, also the last one, is the working directory.
std::string findProgram(const std::string &name) {
  const char *path = std::getenv("PATH");
  std::istringstream folders((path == nullptr ? std::string("/usr/bin:/bin") : path) + ':');
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
