#ifndef KOVABACKUP_SERVICE_FOLDER_ID_H
#define KOVABACKUP_SERVICE_FOLDER_ID_H

/// @file Examines entries by descriptor: what they are, and whether two are the same folder.

#include <cstdint>
#include <sys/stat.h>
#include <sys/types.h>

namespace KOVA::Backup::Service {

struct FolderId {
  dev_t device = 0;
  std::uint64_t inode = 0;
  bool operator==(const FolderId &other) const {
    return device == other.device && inode == other.inode;
  }
};

/// A system call that failed; code 0 when none did.
struct Failed {
  const char *step = "";
  int code = 0;
  explicit operator bool() const { return code != 0; }
};

/// statx with the fields of stat(2) and the id of the mount, which kernels before 5.8 do not give,
/// without following a link or triggering an automount. An empty name means the descriptor itself.
Failed statEntry(int folder, const char *name, struct statx &out);

FolderId idOf(const struct statx &entry);

} // namespace KOVA::Backup::Service

#endif
