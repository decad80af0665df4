#ifndef KOVAPLATFORM_SDK_VOLUME_TABLE_H
#define KOVAPLATFORM_SDK_VOLUME_TABLE_H

/// @file Which mounts are volumes.
///
/// From the mount table to the volumes, in its order:
///   1. Only file systems that hold data (file_system.h), and of those only mounts that can be
///      reached: a mount that another one covers, or that is a file, does not count.
///   2. The mounts of one device are one file system. The first that shows its root stands for it,
///      or the first of all when none does (subvolumes).
///   3. When that one is a mount of the system's own, the file system is the system's, whatever
///      else it is bound to. Else the volume is the first of its mounts, in the same order, that is
///      neither the system's nor excluded by the configuration, and whose path fits the record; one
///      that is too long stands only where none fits.
///   4. Directories that the configuration names are added at the end, in the file's order; one
///      that is a volume's mount path only changes what is told of that volume. One whose
///      directory is not there is a volume that is not mounted.

#include "platform/config/config.h"
#include "platform/sdk/mounts.h"
#include "platform/sdk/system_probe.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KovaPlatform {

struct Volume {
  std::string mountPath;
  std::string realPath; ///< the same without links; "" when it is not there
  int mountId = 0;
  dev_t device = 0;
  std::string root; ///< directory of the file system that lies at mountPath
  std::int32_t fsType = 0;
  std::int32_t location = 0;
  std::optional<std::uint64_t> size; ///< set by the configuration; else asked for when needed
  bool isNamed = false;              ///< a directory that the configuration names

  bool isMounted() const { return !realPath.empty(); }
  /// Whether the path fits the record with its NUL.
  bool fitsRecord() const;
};

/// Whether a mount path is the system's own: / /boot* /efi /usr /var /tmp themselves, and all that
/// lies at or below the places of snaps, containers, logs and the system's other temporary files.
bool isSystemMount(const std::string &target);

/// Where a path lies.
struct PathOnVolume {
  const Volume *volume = nullptr; ///< null when it lies on no volume
  /// Path below the volume's mount path, "" for itself; none when the path lies on the volume's
  /// file system, but not below its mount path (another subvolume).
  std::optional<std::string> inside;
};

class VolumeTable {
public:
  /// Reads the machine's mounts. Returns none when they cannot be read.
  static std::optional<VolumeTable> read(const SystemProbe &probe, const Config &config);

  const std::vector<Volume> &volumes() const { return volumes_; }

  /// The place of a path that the machine has resolved.
  PathOnVolume pathOnVolume(const std::string &realPath, const SystemProbe &probe) const;

  /// The mounted volume whose mount path is path, slashes at its end aside; else null.
  const Volume *findMountPath(const std::string &path) const;

private:
  void addMounted(const SystemProbe &probe, const Config &config);
  void addNamed(const SystemProbe &probe, const NamedVolume &named);
  const Mount *mountOf(const std::string &realPath, const SystemProbe &probe) const;

  std::vector<Mount> mounts_;
  std::vector<Volume> volumes_;
};

} // namespace KovaPlatform

#endif
