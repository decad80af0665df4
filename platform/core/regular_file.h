#ifndef KOVAPLATFORM_CORE_REGULAR_FILE_H
#define KOVAPLATFORM_CORE_REGULAR_FILE_H

/// @file Opens regular files; everything else that a path can name is refused.
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
/// waits while another process releases a lease on the file. access is O_RDONLY or O_RDWR.
bool openRegular(const char *path, int access, RegularFile &file);

/// The directory entry to which a path leads after all symbolic links.
struct DirectoryEntry {
  KOVA::Base::UniqueFd dir; ///< open for reading, so that it can be synced
  std::string name;         ///< in dir; not a symbolic link
};

enum class Located { Yes, Elsewhere, Failed };

/// Finds the entry of the file that was opened by this path. Elsewhere means that the path leads to
/// another file by now, or to none: open it again.
Located locate(const char *path, const RegularFile &file, DirectoryEntry &entry);

} // namespace KovaPlatform

#endif
