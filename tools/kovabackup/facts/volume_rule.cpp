#include "tools/kovabackup/facts/volume_rule.h"

#include "kovabackup/temp_manager.h"
#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fmt/format.h>
#include <sys/stat.h>

namespace KOVA::Backup::Tool {
namespace {

// The library only answers with the folder that it chose. The reasons are derived from the same
// conditions in the order in which it applies them.
std::string whyNot(const Volume &volume, const Usability &use, const VolumeRule &rule) {
  if (use.folder.empty()) {
    return use.why + (use.forRoot ? "; try as root" : "");
  }
  if (!rule.takesType(volume.fsType)) {
    return fmt::format("wrong type: {}", typeName(volume.fsType));
  }
  return volume.size == 0 ? "its size is unknown" : "no larger than the chosen one";
}

// "same:" looks at one volume only, so there are no others to give reasons for.
Choice chooseSame(const VolumeRule &rule, const boost::shared_ptr<FilterVolume> &filter) {
  struct stat info;
  if (::stat(rule.path().c_str(), &info) != 0) {
    const int error = errno;
    throw Failure(error == ENOENT || error == ENOTDIR ? kNegative : kFailed,
                  fmt::format("cannot access {}: {}", rule.path(), reason(error)));
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
    choice.rejected.push_back({choice.volume, whyNoFolder(choice.volume)});
  }
  return choice;
}

} // namespace

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
    throw Failure(kUsage, fmt::format("'{}' is not a valid rule: use {}", text, names()));
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
  const std::vector<Volume> volumes = listVolumes();
  (void)VolumePathManager::getInstance().getVolumePath(filter,
                                                       choice.folder); // "" when it chose none
  for (const Volume &volume : volumes) {
    const Usability use = usability(volume);
    // With a fallback the folder belongs to no volume, and every volume gets a reason.
    if (choice.volume.empty() && !use.folder.empty() && use.folder == choice.folder) {
      choice.volume = volume.path;
    } else {
      choice.rejected.push_back({volume.path, whyNot(volume, use, rule)});
    }
  }
  return choice;
}

} // namespace KOVA::Backup::Tool
