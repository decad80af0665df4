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
  std::string root;   ///< what of the file system is mounted: "/", or a directory of it
  std::string target; ///< where
  std::string fsType;
  std::string source;
};

/// Reads a table in the format of /proc/self/mountinfo, names unescaped, in its order.
/// Returns: true when done; on false mounts is as it was.
bool readMounts(const char *path, std::vector<Mount> &mounts);

/// Whether path is dir or lies below it, both absolute and without slash at their ends.
bool isWithin(const std::string &dir, const std::string &path);

/// What follows dir and its slash in a path within it; "" for dir itself.
std::string below(const std::string &dir, const std::string &path);

/// dir and name with one slash between; dir itself when name is "".
std::string joined(const std::string &dir, const std::string &name);

} // namespace KovaPlatform

#endif
