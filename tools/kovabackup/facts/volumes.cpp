#include "tools/kovabackup/facts/volumes.h"

#include "kovabackup/temp_manager.h"
#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
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

// Also volumes that are not mounted and those that are read-only.
constexpr int kAllVolumes = 2;

void addVolumes(int location, std::vector<Volume> &volumes) {
  clearPlatformError();
  const std::unique_ptr<KOVAVOLInfo, void (*)(KOVAVOLInfo *)> list(
      KOVAMountVolAllEnum(0, location, kAllVolumes), &KOVAMountVolInfoFree);
  if (!list && hasPlatformError()) {
    throw Failure(kFailed, "cannot list the volumes: " + platformError());
  }
  for (const KOVAVOLInfo *info = list.get(); info != nullptr; info = info->next) {
    volumes.push_back({info->mountPath, info->fsType, info->size, info->status != 0,
                       info->accessStatus != 0, location});
  }
}

std::string whyNot(const Volume &volume, const Usability &use, const VolumeRule &rule) {
  if (use.folder.empty()) {
    return use.why;
  }
  if (!rule.takesType(volume.fsType)) {
    return fmt::format("wrong type: {}", typeName(volume.fsType));
  }
  return volume.size == 0 ? "its size is unknown" : "no larger than the chosen one";
}

Choice chooseSame(const VolumeRule &rule, const boost::shared_ptr<FilterVolume> &filter) {
  struct stat info;
  if (::stat(rule.path().c_str(), &info) != 0) {
    const int error = errno;
    throw Failure(error == ENOENT || error == ENOTDIR ? kNegative : kFailed,
                  fmt::format("cannot look at {}: {}", rule.path(), reason(error)));
  }
  Choice choice;
  KOVAVOLInfo volume = {};
  clearPlatformError();
  if (KOVAMountVolInfoGet(rule.path().c_str(), &volume) < 0) {
    choice.rejected.push_back({rule.path(), platformError()});
    return choice;
  }
  choice.volume = volume.mountPath;
  if (!VolumePathManager::getInstance().getVolumePath(filter, choice.folder)) {
    choice.rejected.push_back({choice.volume, "has no temporary directory: " + platformError()});
  }
  return choice;
}

} // namespace

std::vector<Volume> seenVolumes() {
  std::vector<Volume> volumes;
  clearPlatformError();
  const int mask = KOVAVolumeSupportLocGet();
  if (mask == 0 && hasPlatformError()) {
    throw Failure(kFailed, "cannot list the volumes: " + platformError());
  }
  for (int bit = 1; bit > 0 && bit <= mask; bit <<= 1) {
    if ((mask & bit) != 0) {
      addVolumes(bit, volumes);
    }
  }
  return volumes;
}

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
  if (::access(folder.data(), W_OK) != 0) {
    return {"", fmt::format("cannot write to {}: {}", folder.data(), reason(errno))};
  }
  return {folder.data(), ""};
}

std::string typeName(int fsType) {
  static const std::map<int, const char *> kNames = {
      {KOVA_VOL_FS_EXT, "ext2/3"},  {KOVA_VOL_FS_EXT4, "ext4"}, {KOVA_VOL_FS_BTRFS, "btrfs"},
#ifdef KOVA_TOOL_STANDIN // the other numbers are each platform's own
      {KOVA_VOL_FS_OTHER, "other"}, {KOVA_VOL_FS_XFS, "xfs"},   {KOVA_VOL_FS_F2FS, "f2fs"},
      {KOVA_VOL_FS_ZFS, "zfs"},     {KOVA_VOL_FS_NTFS, "ntfs"}, {KOVA_VOL_FS_EXFAT, "exfat"},
      {KOVA_VOL_FS_VFAT, "vfat"},
#endif
  };
  const auto found = kNames.find(fsType);
  return found == kNames.end() ? fmt::format("type {}", fsType) : found->second;
}

std::string locationName(int location) {
  return location == 1   ? "internal"
         : location == 2 ? "removable"
                         : fmt::format("location {}", location);
}

VolumeRule::VolumeRule(const std::string &text) {
  static const std::string kSame = "same:";
  if (text == "max") {
    kind_ = Kind::Max;
  } else if (text == "max-ext") {
    kind_ = Kind::MaxExt;
  } else if (text == "max-ext-btrfs") {
    kind_ = Kind::MaxExtBtrfs;
  } else if (text.rfind(kSame, 0) == 0 && text.size() > kSame.size()) {
    kind_ = Kind::Same;
    path_ = text.substr(kSame.size());
  } else {
    throw Failure(kUsage, fmt::format("'{}' is no rule: use {}", text, names()));
  }
}

const char *VolumeRule::names() {
  return "max, max-ext, max-ext-btrfs or same:PATH";
}

bool VolumeRule::takesType(int fsType) const {
  const int most = kind_ == Kind::MaxExt ? 2 : 3;
  return kind_ == Kind::Max || kind_ == Kind::Same || (fsType >= 1 && fsType <= most);
}

boost::shared_ptr<FilterVolume> VolumeRule::filter(bool fallbackTmp) const {
  switch (kind_) {
  case Kind::Max:
    return TempManager::maxVolume(fallbackTmp);
  case Kind::MaxExt:
    return TempManager::maxExtVolume(fallbackTmp);
  case Kind::MaxExtBtrfs:
    return TempManager::maxExtBtrfsVolume(fallbackTmp);
  case Kind::Same:
    break;
  }
  return TempManager::sameVolume(path_);
}

Choice choose(const VolumeRule &rule, bool fallbackTmp) {
  const boost::shared_ptr<FilterVolume> filter = rule.filter(fallbackTmp);
  if (rule.isSame()) {
    return chooseSame(rule, filter);
  }
  Choice choice;
  const std::vector<Volume> volumes = seenVolumes();
  (void)VolumePathManager::getInstance().getVolumePath(filter, choice.folder); // "" says no
  for (const Volume &volume : volumes) {
    const Usability use = usability(volume);
    if (choice.volume.empty() && !use.folder.empty() && use.folder == choice.folder) {
      choice.volume = volume.path;
    } else {
      choice.rejected.push_back({volume.path, whyNot(volume, use, rule)});
    }
  }
  return choice;
}

} // namespace KOVA::Backup::Tool
