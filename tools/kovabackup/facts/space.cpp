#include "tools/kovabackup/facts/space.h"

#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {

// Divided first where the product could overflow.
int Space::freePercent() const {
  const std::uint64_t percent = total < 1000 ? free * 100 / total : free / (total / 100);
  return static_cast<int>(percent > 100 ? 100 : percent);
}

bool Space::isBelow(int percent) const {
  return isFull() || freePercent() < percent;
}

std::optional<Space> spaceOf(const std::string &path) {
  struct statvfs info = {};
  if (::statvfs(path.c_str(), &info) != 0 || info.f_blocks == 0) {
    return std::nullopt;
  }
  Space space;
  space.free = static_cast<std::uint64_t>(info.f_bavail) * info.f_frsize;
  space.total = static_cast<std::uint64_t>(info.f_blocks) * info.f_frsize;
  space.hasInodes = info.f_files == 0 || info.f_favail > 0; // some file systems do not count them
  return space;
}

bool isFullForThisUser(const std::string &path) {
  struct statvfs info = {};
  if (::statvfs(path.c_str(), &info) != 0 || info.f_blocks == 0) {
    return false;
  }
  const bool root = ::geteuid() == 0;
  const bool noInodes = info.f_files > 0 && (root ? info.f_ffree : info.f_favail) == 0;
  return (root ? info.f_bfree : info.f_bavail) == 0 || noInodes;
}

std::string describe(const Space &space) {
  if (space.isFull()) {
    return space.free == 0 ? "full" : "no inodes left";
  }
  return fmt::format("{} free ({}%)", humanBytes(space.free), space.freePercent());
}

} // namespace KOVA::Backup::Tool
