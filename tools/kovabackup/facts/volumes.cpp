#include "tools/kovabackup/facts/volumes.h"

#include "kovabackup/path_util.h"
#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"
#ifdef KOVA_TOOL_STANDIN
#include "platform/config/config.h"
#endif

#include <array>
#include <cerrno>
#include <climits>
#include <fmt/format.h>
#include <map>
#include <memory>
#include <sys/stat.h>
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

// The platform finds mounts where they are; only a path that was typed can lead nowhere.
std::string whyNotMounted(const Volume &volume) {
  struct stat info = {};
  if (::stat(volume.path.c_str(), &info) == 0) {
    return S_ISDIR(info.st_mode) ? "not mounted" : "not a directory";
  }
  return errno == ENOENT || errno == ENOTDIR ? "does not exist" : "not mounted";
}

std::string whyNoFolder(const std::string &volume) {
  std::string why;
#ifdef KOVA_TOOL_STANDIN // elsewhere the directory has another name
  const std::string folder = Path::join(volume, ".kova_tmp");
  struct stat info = {};
  if (::lstat(folder.c_str(), &info) == 0 && !S_ISDIR(info.st_mode)) {
    why = folder + " is not a directory";
  } else if (::access(volume.c_str(), W_OK | X_OK) != 0) {
    why = fmt::format("cannot write to {}: {}", volume, reasonAlone(errno));
  }
#endif
  return "has no temporary directory: " + (why.empty() ? platformError() : platformError(why));
}

// The conditions of the library in its order, each with the reason that it keeps to itself.
Usability usability(const Volume &volume) {
  if (volume.path.empty() || !volume.mounted) {
    const std::string why = whyNotMounted(volume);
    return {"", why, false, why != "not mounted"};
  }
  if (!volume.writable) {
    return {"", "read-only"};
  }
  std::array<char, PATH_MAX> folder{};
  if (KOVAShareTmpPathGet(volume.path.c_str(), folder.data(), PATH_MAX - 1) < 0) {
    const bool denied = ::access(volume.path.c_str(), W_OK | X_OK) != 0 && mayHelpAsRoot(errno);
    return {"", whyNoFolder(volume.path), denied};
  }
  // The directory may exist since an earlier run as another user.
  if (::access(folder.data(), W_OK) != 0) {
    const int error = errno;
    return {"", fmt::format("cannot write to {}: {}", folder.data(), reasonAlone(error)),
            mayHelpAsRoot(error)};
  }
  return {folder.data(), ""};
}

#ifdef KOVA_TOOL_STANDIN
std::string volumeConfiguration() {
  return KovaPlatform::configPath();
}

const char *volumeAdvice() {
  return "mount a data volume, or name a directory as one: see platform.conf(5)";
}
#else
std::string volumeConfiguration() {
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
