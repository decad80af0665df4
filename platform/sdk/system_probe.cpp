#include "platform/sdk/system_probe.h"

#include "platform/sdk/location.h"

#include <cstdlib>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>

namespace KovaPlatform {
namespace {

// The volumes are read in every call, so a look must cost little and change nothing.
// AT_NO_AUTOMOUNT: looking at a mount point must not mount it. AT_STATX_DONT_SYNC: the type of a
// file never goes stale, so no server has to be asked. The mask names the two facts that are used,
// because a file system may have to work for each field.
std::optional<PathFacts> factsAt(int dir, const char *path, int flags) {
  struct statx status {};
  const unsigned wanted = STATX_TYPE | STATX_MNT_ID;
  if (::statx(dir, path, flags | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC, wanted, &status) != 0) {
    return std::nullopt;
  }
  PathFacts facts;
  facts.isDirectory = S_ISDIR(status.stx_mode);
  facts.device = ::makedev(status.stx_dev_major, status.stx_dev_minor);
  if ((status.stx_mask & STATX_MNT_ID) != 0) { // not reported before Linux 5.8
    facts.mountId = status.stx_mnt_id;
  }
  return facts;
}

// A file system on several disks, or one that manages its disks itself, has a device number that no
// disk has; its major number is 0. The source of the mount then names one of the disks, or a pool,
// whose disks are not known here.
dev_t diskOf(const Mount &mount) {
  struct stat status {};
  if (::major(mount.device) == 0 && ::stat(mount.source.c_str(), &status) == 0 &&
      S_ISBLK(status.st_mode)) {
    return status.st_rdev;
  }
  return mount.device;
}

} // namespace

// The table of this process: its paths lead to the mounts of its own mount namespace.
bool SystemProbe::mounts(std::vector<Mount> &out) const {
  return readMounts("/proc/self/mountinfo", out);
}

// realpath allocates the result itself: PATH_MAX does not limit a resolved path.
std::optional<std::string> SystemProbe::resolve(const std::string &path) const {
  const std::unique_ptr<char, decltype(&std::free)> real(::realpath(path.c_str(), nullptr),
                                                         &std::free);
  return real ? std::optional<std::string>(real.get()) : std::nullopt;
}

std::optional<PathFacts> SystemProbe::facts(const std::string &path) const {
  return factsAt(AT_FDCWD, path.c_str(), 0);
}

std::optional<Space> SystemProbe::space(const std::string &path) const {
  struct statvfs status {};
  if (::statvfs(path.c_str(), &status) != 0) {
    return std::nullopt;
  }
  // Blocks are counted in units of f_frsize; f_bsize is only the size that suits I/O.
  return Space{std::uint64_t{status.f_blocks} * status.f_frsize, (status.f_flag & ST_RDONLY) != 0};
}

std::int32_t SystemProbe::location(const Mount &mount) const {
  return locationOf("/sys", diskOf(mount));
}

std::optional<PathFacts> factsOf(int fd) {
  return factsAt(fd, "", AT_EMPTY_PATH);
}

} // namespace KovaPlatform
