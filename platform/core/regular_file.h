#ifndef KOVAPLATFORM_CORE_REGULAR_FILE_H
#define KOVAPLATFORM_CORE_REGULAR_FILE_H

/// @file Opening and reading regular files, and nothing else that has a path.
///
/// Failure:  false, with the error recorded.
/// errno:    as the failing call set it.

#include "base/unique_fd.h"

#include <string>
#include <sys/stat.h>

namespace KovaPlatform {

struct RegularFile {
  KOVA::Base::UniqueFd fd;
  struct stat status = {};
};

/// Opens a path, links followed. Neither waits for a writer of a FIFO nor reads from a device;
/// waits while another process gives up a lease on the file. access is O_RDONLY or O_RDWR.
bool openRegular(const char *path, int access, RegularFile &file);

/// Reads a file to its end.
bool readAll(const RegularFile &file, std::string &text);

/// Where the name stands that finally means a file, after all symbolic links.
struct DirectoryEntry {
  KOVA::Base::UniqueFd dir; ///< open for reading, so that it can be synced
  std::string name;         ///< in dir; no link
};

enum class Located { Yes, Elsewhere, Failed };

/// Finds the place of the file that was opened by this path. Elsewhere means that the path has
/// come to lead to another file meanwhile: open it again.
Located locate(const char *path, const RegularFile &file, DirectoryEntry &entry);

} // namespace KovaPlatform

#endif
