#include "platform/sdk/volumes.h"

#include "kovaplatform/kovasdk.h"
#include "platform/support/failure.h"

#include <atomic>
#include <cstring>
#include <memory>
#include <syslog.h>
#include <utility>

namespace KovaPlatform {
namespace {

constexpr const char *kFile = "sdk/volumes.cpp";

struct VolumeListDeleter {
  void operator()(KOVAVOLInfo *list) const { KOVAMountVolInfoFree(list); }
};
using VolumeList = std::unique_ptr<KOVAVOLInfo, VolumeListDeleter>;

// Fills a record, or returns false with an error recorded. The record is zeroed first: its reserved
// bytes go to the caller, and must not carry what was in memory before.
bool describe(const Volume &volume, const SystemProbe &probe, KOVAVOLInfo &info) {
  std::memset(&info, 0, sizeof info);
  if (!volume.fitsRecord()) {
    return fail({KOVA_SDK_ERR_TOO_LONG, kFile}, false);
  }
  std::memcpy(info.mountPath, volume.mountPath.c_str(), volume.mountPath.size());
  info.fsType = volume.fsType;
  info.size = volume.size.value_or(0);
  if (!volume.isMounted()) {
    return true;
  }
  const std::optional<Space> space = probe.space(volume.realPath);
  if (!space) {
    return fail({KOVA_SDK_ERR_SIZE, kFile}, false);
  }
  info.size = volume.size.value_or(space->totalBytes);
  info.status = 1;
  info.accessStatus = space->isReadOnly ? 0 : 1;
  return true;
}

// A system may never have any volumes; a line for every scan would fill the log.
void warnOnceOfNoVolumes() {
  static std::atomic<bool> said{false};
  if (!said.exchange(true)) {
    ::syslog(LOG_WARNING,
             "kovasdk: no file system but the system's own is mounted: there are no volumes "
             "until one is named in %s",
             configPath().c_str());
  }
}

// Volumes that are not mounted have no access status, so the flag for read-only ones is not theirs.
bool isWanted(const Volume &volume, const KOVAVOLInfo &info, int enumFlags) {
  if (!volume.isMounted()) {
    return (enumFlags & KOVA_VOL_ENUM_MOUNTED) == 0;
  }
  return info.accessStatus != 0 || (enumFlags & KOVA_VOL_ENUM_READ_ONLY) != 0;
}

// Returns null for a volume that is not to be listed. A volume that cannot be described is left out
// with a warning, so that one broken disk does not hide all the others.
VolumeList recordOf(const Volume &volume, const SystemProbe &probe, int enumFlags) {
  if (!volume.fitsRecord()) {
    ::syslog(LOG_WARNING, "kovasdk: mount path %s is longer than %zu bytes: left out",
             volume.mountPath.c_str(), sizeof KOVAVOLInfo::mountPath - 1);
    return nullptr;
  }
  KOVAVOLInfo info;
  if (!describe(volume, probe, info)) {
    ::syslog(LOG_WARNING, "kovasdk: the size of %s cannot be read: left out: %m",
             volume.mountPath.c_str());
    return nullptr;
  }
  if (!isWanted(volume, info, enumFlags)) {
    return nullptr;
  }
  return VolumeList(new KOVAVOLInfo(info));
}

VolumeList enumerate(int location, int enumFlags) {
  const SystemProbe probe;
  const std::optional<VolumeTable> table = currentVolumes(probe);
  if (!table) {
    return nullptr;
  }
  if (table->volumes().empty()) {
    warnOnceOfNoVolumes();
  }
  VolumeList head;
  KOVAVOLInfo *last = nullptr;
  for (const Volume &volume : table->volumes()) {
    if ((volume.location & location) == 0) {
      continue;
    }
    // The list owns what is linked to it, so an allocation that fails later frees all of it.
    VolumeList record = recordOf(volume, probe, enumFlags);
    if (!record) {
      continue;
    }
    KOVAVOLInfo *const added = record.release();
    if (last == nullptr) {
      head.reset(added);
    } else {
      last->next = added;
    }
    last = added;
  }
  return head;
}

// Only volumes that the enumeration may list count; a caller scans the locations of the mask.
int currentLocations() {
  const SystemProbe probe;
  const std::optional<VolumeTable> table = currentVolumes(probe);
  int mask = 0;
  if (table) {
    for (const Volume &volume : table->volumes()) {
      mask |= volume.fitsRecord() ? volume.location : 0;
    }
  }
  return mask;
}

int describeVolumeOf(const char *path, KOVAVOLInfo *info) {
  if (path == nullptr || info == nullptr) {
    return fail({KOVA_SDK_ERR_ARGUMENT, kFile});
  }
  const SystemProbe probe;
  const std::optional<LocatedPath> located = locatePath(path, probe, {KOVA_SDK_ERR_PATH, kFile});
  if (!located) {
    return -1;
  }
  const Volume *volume = located->position.volume;
  if (volume == nullptr) {
    return fail({KOVA_SDK_ERR_NO_VOLUME, kFile});
  }
  KOVAVOLInfo found;
  if (!describe(*volume, probe, found)) {
    return -1;
  }
  // The caller's buffer may end where the filled part ends: before next, which only lists use.
  std::memcpy(static_cast<void *>(info), &found, KOVA_VOL_INFO_FILLED_BYTES);
  return 0;
}

} // namespace

std::optional<VolumeTable> currentVolumes(const SystemProbe &probe) {
  Config config;
  if (!loadConfig(config)) {
    return std::nullopt;
  }
  std::optional<VolumeTable> table = VolumeTable::read(probe, config);
  if (!table) {
    ::syslog(LOG_ERR, "kovasdk: the mount table cannot be read");
    return fail({KOVA_SDK_ERR_MOUNTS, kFile}, std::nullopt);
  }
  return table;
}

std::optional<LocatedPath> locatePath(const char *path, const SystemProbe &probe,
                                      const Failure &unresolved) {
  std::optional<VolumeTable> table = currentVolumes(probe);
  if (!table) {
    return std::nullopt;
  }
  const std::optional<std::string> realPath = probe.resolve(path);
  if (!realPath) {
    return fail(unresolved, std::nullopt);
  }
  const PathOnVolume position = table->pathOnVolume(*realPath, probe);
  return LocatedPath{std::move(*table), position}; // moving keeps the volumes where they are
}

} // namespace KovaPlatform

using namespace KovaPlatform;

int KOVAVolumeSupportLocGet(void) {
  return guarded({KOVA_SDK_ERR_NO_MEMORY, kFile}, 0, [] { return currentLocations(); });
}

KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags) {
  if (reserved != 0) {
    return fail({KOVA_SDK_ERR_ARGUMENT, kFile}, nullptr);
  }
  return guarded({KOVA_SDK_ERR_NO_MEMORY, kFile}, nullptr,
                 [&] { return enumerate(location, enumFlags).release(); });
}

int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info) {
  return guarded({KOVA_SDK_ERR_NO_MEMORY, kFile}, -1, [&] { return describeVolumeOf(path, info); });
}

void KOVAMountVolInfoFree(KOVAVOLInfo *list) {
  while (list != nullptr) {
    KOVAVOLInfo *const next = list->next;
    delete list;
    list = next;
  }
}
