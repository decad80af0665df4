// The IPC area: the directory in which the processes of a host share files, and its lock files.

#include "kovabackup/path_util.h"

#include "common/log.h"
#include "path/path_util_module.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>

namespace KOVA::Backup::Path {
namespace {

constexpr char kIpcRoot[] = "/tmp/kovabackup";

// Creates a directory and sets its mode. Whatever already has the name is accepted, even a file.
// mkdir alone would apply the umask and leave the mode of an existing directory as it is. The
// numbers are those under which the two failures are logged.
bool makeDirectory(const std::string &dir, mode_t mode, int mkdirNumber, int chmodNumber) {
  if (::mkdir(dir.c_str(), mode) != 0 && errno != EEXIST) {
    Log::error(kPathUtilModule, mkdirNumber, "mkdir %s path failed. %m", dir.c_str());
    return false;
  }
  if (::chmod(dir.c_str(), mode) != 0) {
    Log::error(kPathUtilModule, chmodNumber, "chmod %s path failed. %m", dir.c_str());
    return false;
  }
  return true;
}

} // namespace

std::string getIpcTempPath() {
  return kIpcRoot;
}

std::string createIpcTempPath(const std::string &name, unsigned int mode) {
  if (name.empty() || name.find('/') != std::string::npos) {
    Log::error(kPathUtilModule, 387, "bad %s name.", name.c_str());
    return "";
  }
  const std::string root = getIpcTempPath();
  if (!makeDirectory(root, 0755, 395, 402)) {
    return "";
  }
  std::string dir = join(root, name);
  if (!makeDirectory(dir, mode, 409, 414)) {
    return "";
  }
  return dir;
}

// Deliberate: the name is not checked, and a failed open is not logged.
int createIpcLockFile(const std::string &name) {
  const std::string dir = createIpcTempPath("lock", 0770);
  if (dir.empty()) {
    return -1;
  }
  // Deliberately without O_CLOEXEC, so that a caller who locks the file can pass the lock on to a
  // program.
  return ::open(join(dir, name).c_str(), O_RDWR | O_CREAT, 0666);
}

} // namespace KOVA::Backup::Path
