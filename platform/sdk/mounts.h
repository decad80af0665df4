#ifndef KOVAPLATFORM_SDK_MOUNTS_H
#define KOVAPLATFORM_SDK_MOUNTS_H

/// @file The mount table.

#include <string>
#include <sys/types.h>
#include <vector>

namespace KovaPlatform {

struct Mount {
  int id = 0;
  dev_t device = 0;   ///< of the file system; the same for every mount of it
  std::string root;   ///< the part of the file system that is mounted: "/", or a directory in it
  std::string target; ///< where it is mounted
  std::string fsType;
  std::string source;
};

/// Reads a table in the format of /proc/self/mountinfo, in its order, with the escapes in names
/// decoded.
/// Returns: true on success; on false mounts is unchanged.
bool readMounts(const char *path, std::vector<Mount> &mounts);

/// Whether path is dir or lies below it. Both are absolute and have no trailing slash.
bool isWithin(const std::string &dir, const std::string &path);

/// The part of a path after dir and the slash; "" for dir itself. The path must lie within dir.
std::string below(const std::string &dir, const std::string &path);

/// dir and name with one slash between them; dir itself when name is "".
std::string joined(const std::string &dir, const std::string &name);

} // namespace KovaPlatform

#endif
