#ifndef KOVABACKUP_TOOLS_DIRECTORY_H
#define KOVABACKUP_TOOLS_DIRECTORY_H

/// @file An open directory stream, closed when its handle is destroyed.

#include <dirent.h>
#include <memory>
#include <string>

namespace KOVA::Backup::Tool {

using Directory = std::unique_ptr<DIR, int (*)(DIR *)>;

/// Returns: null when the directory cannot be opened; errno is then as opendir(3) left it.
inline Directory openDirectory(const std::string &path) {
  return {::opendir(path.c_str()), &::closedir};
}

} // namespace KOVA::Backup::Tool

#endif
