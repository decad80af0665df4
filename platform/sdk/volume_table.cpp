#include "platform/sdk/volume_table.h"

#include "kovaplatform/kovasdk.h"
#include "platform/sdk/file_system.h"

#include <algorithm>
#include <iterator>

namespace KovaPlatform {
namespace {

constexpr const char *kSystemPaths[] = {"/", "/efi", "/usr", "/var", "/tmp"};

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

bool isUsable(const Mount &mount, const SystemProbe &probe) {
  const std::optional<PathFacts> facts = probe.facts(mount.target);
  return facts && facts->isDirectory &&
         (!facts->mountId || *facts->mountId == static_cast<std::uint64_t>(mount.id));
}

// The reachable mounts of one device, those that show its root first.
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

// The mount that is the volume of its device; null when the device is the system's or excluded.
const Mount *chosenOf(const std::vector<const Mount *> &sameDevice, const Config &config) {
  if (sameDevice.empty() || isSystemMount(sameDevice.front()->target)) {
    return nullptr;
  }
  const Mount *tooLong = nullptr;
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
  return target.compare(0, 5, "/boot") == 0 ||
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
  for (const NamedVolume &named : config.volumes) {
    table.addNamed(probe, named);
  }
  return table;
}

void VolumeTable::addMounted(const SystemProbe &probe, const Config &config) {
  std::vector<dev_t> seen;
  for (const Mount &mount : mounts_) {
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
      if (!known->isNamed) {
        applySettings(*known, named);
      }
      return; // a directory is one volume, by whatever names it goes
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

// By the mount's id, since a mount may be hidden under another; by its path, the longest and then
// the last, where the kernel tells no ids.
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
  // Both are told by where they lie on the file system, so that a bind mount cannot hide it.
  const std::string path = joined(mount->root, below(mount->target, realPath));
  PathOnVolume found;
  for (const Volume &volume : volumes_) {
    if (!volume.isMounted() || volume.device != mount->device) {
      continue;
    }
    const bool holds = isWithin(volume.root, path);
    const bool isInner = found.inside && volume.root.size() <= found.volume->root.size();
    if (holds && !isInner) {
      found = {&volume, below(volume.root, path)};
    } else if (found.volume == nullptr && !volume.isNamed) {
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
