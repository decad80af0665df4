#ifndef KOVABACKUP_TOOLS_SPACE_H
#define KOVABACKUP_TOOLS_SPACE_H

/// @file How much room a file system has.

#include <cstdint>
#include <optional>
#include <string>

namespace KOVA::Backup::Tool {

/// The share of free space below which a file system counts as nearly full.
constexpr int kMinFreePercent = 5;

struct Space {
  std::uint64_t free = 0;  ///< bytes that ordinary users may still write
  std::uint64_t total = 0; ///< bytes
  bool hasInodes = true;   ///< false when no further file can be created

  int freePercent() const; ///< rounded down
  bool isFull() const { return free == 0 || !hasInodes; }
  bool isBelow(int percent) const;
};

/// Returns: nullopt when it cannot be found out, or when the file system has no size.
std::optional<Space> spaceOf(const std::string &path);

/// Whether the user of this process can write nothing more to a file system. Root may also use what
/// is reserved for it. False when it cannot be found out.
bool isFullForThisUser(const std::string &path);

/// "12.0 KiB free (3%)", "full", "no inodes left".
std::string describe(const Space &space);

} // namespace KOVA::Backup::Tool

#endif
