#ifndef KOVABACKUP_TOOLS_DIRECTORY_H
#define KOVABACKUP_TOOLS_DIRECTORY_H

/// @file An open directory that closes itself.

#include <dirent.h>
#include <memory>
#include <string>

namespace KOVA::Backup::Tool {

using Directory = std::unique_ptr<DIR, int (*)(DIR *)>;

/// Returns: null when the directory cannot be opened. errno: opendir(3)'s.
inline Directory openDirectory(const std::string &path) {
  return {::opendir(path.c_str()), &::closedir};
}

} // namespace KOVA::Backup::Tool

#endif
