#ifndef KOVAPLATFORM_SDK_VOLUME_TABLE_H
#define KOVAPLATFORM_SDK_VOLUME_TABLE_H

/// @file Which mounts are volumes.
///
/// From the mount table to the volumes, in the order of the table:
///   1. Only file systems that hold data count (file_system.h), and of those only mounts that are
///      directories and can be reached, not one that another mount covers.
///   2. All mounts of one device are one file system. The first that shows its root represents it,
///      or the first of all when none does (subvolumes).
///   3. When that one is one of the system's own mounts, the file system is the system's, even if
///      it is mounted elsewhere as well. Otherwise the volume is the first of its mounts, in the
///      same order, that neither belongs to the system nor is excluded by the configuration, and
///      whose path fits the record. One whose path is too long is taken only when none fits.
///   4. Directories that the configuration names are added at the end, in the file's order. One
///      that is a volume's mount path only changes the settings of that volume. One that does not
///      exist is a volume that is not mounted.
///
/// In a chroot whose root is not a mount point the table lacks the mount of "/". It is added with
/// an unknown type, so that directories on it can be named as volumes.

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
  std::string realPath; ///< the same without links; "" when it does not exist
  int mountId = 0;
  dev_t device = 0;
  std::string root; ///< the directory of the file system that is found at mountPath
  std::int32_t fsType = 0;
  std::int32_t location = 0;
  std::optional<std::uint64_t> size; ///< set by the configuration; otherwise read when needed
  bool isNamed = false;              ///< a directory that the configuration names

  bool isMounted() const { return !realPath.empty(); }
  /// Whether the path fits the record with its NUL.
  bool fitsRecord() const;
};

/// Whether a mount path is the system's own: / /boot* /efi /usr /var /tmp themselves, and
/// everything at or below the directories of snaps, containers, logs and /var/tmp.
bool isSystemMount(const std::string &target);

/// Where a path lies among the volumes.
struct PathOnVolume {
  const Volume *volume = nullptr; ///< null when it lies on no volume
  /// Path relative to the volume's mount path, "" for the mount path itself; none when the path
  /// lies on the volume's file system but not below its mount path (another subvolume).
  std::optional<std::string> inside;
};

class VolumeTable {
public:
  /// Reads the system's mounts. Returns none when they cannot be read.
  static std::optional<VolumeTable> read(const SystemProbe &probe, const Config &config);

  const std::vector<Volume> &volumes() const { return volumes_; }

  /// Finds the volume of a path that the probe has resolved.
  PathOnVolume pathOnVolume(const std::string &realPath, const SystemProbe &probe) const;

  /// The mounted volume whose mount path is path, trailing slashes ignored; else null.
  const Volume *findMountPath(const std::string &path) const;

private:
  void addMounted(const SystemProbe &probe, const Config &config);
  void addHiddenRoot(const SystemProbe &probe);
  void addNamed(const SystemProbe &probe, const NamedVolume &named);
  const Mount *mountOf(const std::string &realPath, const SystemProbe &probe) const;

  std::vector<Mount> mounts_;
  std::vector<Volume> volumes_;
};

} // namespace KovaPlatform

#endif
