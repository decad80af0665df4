#include "path/tree_removal.h"

#include <unistd.h>

namespace KOVA::Backup::TreeRemoval {
namespace {
constexpr int kOpenDirectories = 20;
}

bool walk(const std::string &path, Callback callback) {
  return ::nftw(path.c_str(), callback, kOpenDirectories, FTW_PHYS | FTW_MOUNT | FTW_DEPTH) == 0;
}

bool isDirectory(int type) {
  return type == FTW_D || type == FTW_DNR || type == FTW_DP;
}

int removeEntry(const char *path, int type) {
  return isDirectory(type) ? ::rmdir(path) : ::unlink(path);
}

} // namespace KOVA::Backup::TreeRemoval
