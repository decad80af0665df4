#include "platform/sdk/volume_table.h"

#include "kovaplatform/kovasdk.h"
#include "platform/sdk/file_system.h"

#include <algorithm>
#include <iterator>

namespace KovaPlatform {
namespace {

// Mounts of the system only at these very paths: /usr/local or /var/lib/data may be a data disk.
constexpr const char *kSystemPaths[] = {"/", "/efi", "/usr", "/var", "/tmp"};

// Whatever is mounted here is a package, a container or a log. Their tools mount and unmount at any
// time, and a backup on one would vanish with it.
constexpr const char *kSystemTrees[] = {"/snap",
                                        "/var/snap",
                                        "/var/lib/snapd",
                                        "/run/snapd",
                                        "/var/lib/docker",
                                        "/var/lib/containerd",
                                        "/var/lib/containers",
                                        "/run/containerd",
                                        "/run/docker",
                                        "/var/lib/kubelet",
                                        "/var/lib/lxc",
                                        "/var/lib/lxd",
                                        "/var/lib/incus",
                                        "/var/lib/machines",
                                        "/var/log",
                                        "/var/tmp"};

// Another mount at the same path, or above it, covers this one; then the path leads to a mount with
// another id. A file can be mounted as well, but can hold no data of ours.
bool isUsable(const Mount &mount, const SystemProbe &probe) {
  const std::optional<PathFacts> facts = probe.facts(mount.target);
  return facts && facts->isDirectory &&
         (!facts->mountId || *facts->mountId == static_cast<std::uint64_t>(mount.id));
}

// The reachable mounts of one device. Those that show its root come first: a bind mount shows only
// a part of the file system, whatever its place in the table.
std::vector<const Mount *> mountsOf(dev_t device, const std::vector<Mount> &mounts,
                                    const SystemProbe &probe) {
  std::vector<const Mount *> found;
  for (const Mount &mount : mounts) {
    if (mount.device == device && isUsable(mount, probe)) {
      found.push_back(&mount);
    }
  }
  std::stable_partition(found.begin(), found.end(),
                        [](const Mount *mount) { return mount->root == "/"; });
  return found;
}

// The mount id lets a caller check later that the same mount is still there.
Volume volumeOf(const Mount &mount, const SystemProbe &probe) {
  Volume volume;
  volume.mountPath = mount.target;
  volume.realPath = mount.target; // the table holds no links
  volume.mountId = mount.id;
  volume.device = mount.device;
  volume.root = mount.root;
  volume.fsType = fileSystemCode(mount.fsType);
  volume.location = probe.location(mount);
  return volume;
}

bool pathFitsRecord(const std::string &path) {
  return path.size() < sizeof KOVAVOLInfo::mountPath;
}

// The mount that is the volume of its device; null when the device belongs to the system, or when
// all of its mounts are the system's or excluded. The first mount decides for the device: a data
// folder of the system disk that is bound elsewhere must not make the system disk a volume.
const Mount *chosenOf(const std::vector<const Mount *> &sameDevice, const Config &config) {
  if (sameDevice.empty() || isSystemMount(sameDevice.front()->target)) {
    return nullptr;
  }
  const Mount *tooLong = nullptr; // kept so that the volume can be reported as left out
  for (const Mount *mount : sameDevice) {
    const auto &excluded = config.mountExcludes;
    if (isSystemMount(mount->target) ||
        std::find(excluded.begin(), excluded.end(), mount->target) != excluded.end()) {
      continue;
    }
    if (pathFitsRecord(mount->target)) {
      return mount;
    }
    tooLong = tooLong != nullptr ? tooLong : mount;
  }
  return tooLong;
}

// What the configuration does not set remains as the file system has it.
void applySettings(Volume &volume, const NamedVolume &named) {
  volume.fsType = named.fsType.value_or(volume.fsType);
  volume.size = named.size;
  if (named.removable) {
    volume.location = *named.removable ? KOVA_VOL_LOC_REMOVABLE : KOVA_VOL_LOC_INTERNAL;
  }
}

} // namespace

bool Volume::fitsRecord() const {
  return pathFitsRecord(mountPath);
}

bool isSystemMount(const std::string &target) {
  return target.compare(0, 5, "/boot") == 0 || // /boot/efi and /boot-backup as well
         std::any_of(std::begin(kSystemPaths), std::end(kSystemPaths),
                     [&](const char *path) { return target == path; }) ||
         std::any_of(std::begin(kSystemTrees), std::end(kSystemTrees),
                     [&](const char *tree) { return isWithin(tree, target); });
}

std::optional<VolumeTable> VolumeTable::read(const SystemProbe &probe, const Config &config) {
  VolumeTable table;
  if (!probe.mounts(table.mounts_)) {
    return std::nullopt;
  }
  table.addMounted(probe, config);
  table.addHiddenRoot(probe);
  for (const NamedVolume &named : config.volumes) {
    table.addNamed(probe, named);
  }
  return table;
}

void VolumeTable::addMounted(const SystemProbe &probe, const Config &config) {
  std::vector<dev_t> seen;
  for (const Mount &mount : mounts_) {
    // A device appears once for each of its mounts, but is looked at once.
    if (findFileSystem(mount.fsType) == nullptr ||
        std::find(seen.begin(), seen.end(), mount.device) != seen.end()) {
      continue;
    }
    seen.push_back(mount.device);
    const Mount *chosen = chosenOf(mountsOf(mount.device, mounts_, probe), config);
    if (chosen != nullptr) {
      volumes_.push_back(volumeOf(*chosen, probe));
    }
  }
}

// After addMounted, since it must not make the system's out of a file system of which another part
// is mounted in the chroot. The part that is visible as "/" is unknown; "/" serves, because only
// paths on the same mount are compared with it.
void VolumeTable::addHiddenRoot(const SystemProbe &probe) {
  const std::optional<PathFacts> facts = probe.facts("/");
  if (!facts || !facts->mountId) {
    return;
  }
  const auto isRoot = [&](const Mount &mount) {
    return static_cast<std::uint64_t>(mount.id) == *facts->mountId;
  };
  if (std::any_of(mounts_.begin(), mounts_.end(), isRoot)) {
    return;
  }
  Mount root;
  root.id = static_cast<int>(*facts->mountId);
  root.device = facts->device;
  root.root = "/";
  root.target = "/";
  mounts_.push_back(std::move(root));
}

void VolumeTable::addNamed(const SystemProbe &probe, const NamedVolume &named) {
  Volume volume;
  volume.location = KOVA_VOL_LOC_INTERNAL;
  const std::optional<std::string> realPath = probe.resolve(named.path);
  const std::optional<PathFacts> facts = realPath ? probe.facts(*realPath) : std::nullopt;
  if (facts && facts->isDirectory) {
    const auto known = std::find_if(volumes_.begin(), volumes_.end(), [&](const Volume &other) {
      return other.realPath == *realPath;
    });
    if (known != volumes_.end()) {
      if (!known->isNamed) { // of two names for one directory the first in the file counts
        applySettings(*known, named);
      }
      return; // one directory is one volume, whatever names lead to it
    }
    const Mount *mount = mountOf(*realPath, probe);
    if (mount != nullptr) {
      volume = volumeOf(*mount, probe);
      volume.root = joined(mount->root, below(mount->target, *realPath));
    }
    volume.realPath = *realPath;
  }
  volume.mountPath = named.path;
  volume.isNamed = true;
  applySettings(volume, named);
  volumes_.push_back(std::move(volume));
}

// By the mount's id, because mounts may cover each other at one path. Where the kernel reports no
// ids, by path: the longest one holds the file, and of equal ones the last, which covers the
// others.
const Mount *VolumeTable::mountOf(const std::string &realPath, const SystemProbe &probe) const {
  const std::optional<PathFacts> facts = probe.facts(realPath);
  const Mount *best = nullptr;
  for (const Mount &mount : mounts_) {
    const bool holds = facts && facts->mountId
                           ? *facts->mountId == static_cast<std::uint64_t>(mount.id)
                           : isWithin(mount.target, realPath);
    if (holds && (best == nullptr || mount.target.size() >= best->target.size())) {
      best = &mount;
    }
  }
  return best;
}

PathOnVolume VolumeTable::pathOnVolume(const std::string &realPath,
                                       const SystemProbe &probe) const {
  const Mount *mount = mountOf(realPath, probe);
  if (mount == nullptr) {
    return {};
  }
  // Path and volumes are compared by their position on the file system, not by their names. So a
  // path on a bind mount is found on the volume that holds its data.
  const std::string path = joined(mount->root, below(mount->target, realPath));
  PathOnVolume found;
  for (const Volume &volume : volumes_) {
    if (!volume.isMounted() || volume.device != mount->device) {
      continue;
    }
    const bool holds = isWithin(volume.root, path);
    // Volumes may lie within each other; the innermost holds the path, and the first of equals.
    const bool isInner = found.inside && volume.root.size() <= found.volume->root.size();
    if (holds && !isInner) {
      found = {&volume, below(volume.root, path)};
    } else if (found.volume == nullptr && !volume.isNamed) { // same file system, other subvolume
      found.volume = &volume;
    }
  }
  return found;
}

const Volume *VolumeTable::findMountPath(const std::string &path) const {
  std::string plain = path;
  while (plain.size() > 1 && plain.back() == '/') {
    plain.pop_back();
  }
  const auto volume = std::find_if(volumes_.begin(), volumes_.end(), [&](const Volume &other) {
    return other.isMounted() && other.mountPath == plain;
  });
  return volume == volumes_.end() ? nullptr : &*volume;
}

} // namespace KovaPlatform
