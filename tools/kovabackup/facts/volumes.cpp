#include "tools/kovabackup/facts/volumes.h"

#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <array>
#include <cerrno>
#include <climits>
#include <fmt/format.h>
#include <map>
#include <memory>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// The platform's selector for every volume, even one that is not mounted or is read-only.
constexpr int kAllVolumes = 2;

// An empty list and a failure both return null; only the error record distinguishes them.
void addVolumes(int location, std::vector<Volume> &volumes) {
  clearPlatformError();
  const std::unique_ptr<KOVAVOLInfo, void (*)(KOVAVOLInfo *)> list(
      KOVAMountVolAllEnum(0, location, kAllVolumes), &KOVAMountVolInfoFree);
  if (!list && hasPlatformError()) {
    throw Failure(kFailed, whyNotListed());
  }
  for (const KOVAVOLInfo *info = list.get(); info != nullptr; info = info->next) {
    volumes.push_back({info->mountPath, info->fsType, info->size, info->status != 0,
                       info->accessStatus != 0, location});
  }
}

} // namespace

std::vector<Volume> listVolumes() {
  std::vector<Volume> volumes;
  clearPlatformError();
  const int mask = KOVAVolumeSupportLocGet();
  if (mask == 0 && hasPlatformError()) {
    throw Failure(kFailed, whyNotListed());
  }
  // One location at a time: a volume's record does not say where it is.
  for (int bit = 1; bit > 0 && bit <= mask; bit <<= 1) {
    if ((mask & bit) != 0) {
      addVolumes(bit, volumes);
    }
  }
  return volumes;
}

std::string whyNotListed() {
  return "cannot list the volumes: " + platformError();
}

// The conditions of the library in its order, each with the reason that it keeps to itself.
Usability usability(const Volume &volume) {
  if (volume.path.empty() || !volume.mounted) {
    return {"", "not mounted"};
  }
  if (!volume.writable) {
    return {"", "read-only"};
  }
  std::array<char, PATH_MAX> folder{};
  if (KOVAShareTmpPathGet(volume.path.c_str(), folder.data(), PATH_MAX - 1) < 0) {
    return {"", "has no temporary directory: " + platformError()};
  }
  // The directory may exist since an earlier run as another user.
  if (::access(folder.data(), W_OK) != 0) {
    return {"", fmt::format("cannot write to {}: {}", folder.data(), reason(errno))};
  }
  return {folder.data(), ""};
}

#ifdef KOVA_TOOL_STANDIN
const char *volumeConfiguration() {
  return "platform.conf(5)";
}

const char *volumeAdvice() {
  return "mount a data volume, or name a directory as one: see platform.conf(5)";
}
#else
const char *volumeConfiguration() {
  return "the platform's configuration";
}

const char *volumeAdvice() {
  return "mount a data volume, or name a directory as one in the platform's configuration";
}
#endif

std::string typeName(int fsType) {
  static const std::map<int, const char *> kNames = {
      {KOVA_VOL_FS_EXT, "ext2/3"},  {KOVA_VOL_FS_EXT4, "ext4"}, {KOVA_VOL_FS_BTRFS, "btrfs"},
#ifdef KOVA_TOOL_STANDIN // every platform defines the remaining numbers itself
      {KOVA_VOL_FS_OTHER, "other"}, {KOVA_VOL_FS_XFS, "xfs"},   {KOVA_VOL_FS_F2FS, "f2fs"},
      {KOVA_VOL_FS_ZFS, "zfs"},     {KOVA_VOL_FS_NTFS, "ntfs"}, {KOVA_VOL_FS_EXFAT, "exfat"},
      {KOVA_VOL_FS_VFAT, "vfat"},
#endif
  };
  const auto found = kNames.find(fsType);
  return found == kNames.end() ? fmt::format("type {}", fsType) : found->second;
}

} // namespace KOVA::Backup::Tool
