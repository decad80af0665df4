#include "kovabackup/volume_path_manager.h"

#include "common/log.h"
#include "kovaplatform/kovasdk.h"

#include <array>
#include <cstring>
#include <memory>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr const char *kModule = "temp_manager/volume_path_manager";

// The size that is passed to the platform. The buffer has one byte more, which stays NUL whatever
// the platform writes.
constexpr int kTmpPathBytes = 4095;

std::string mountPathOf(const KOVAVOLInfo &info) {
  return {info.mountPath, ::strnlen(info.mountPath, sizeof info.mountPath)};
}

// The share temporary directory of a volume, "" when the platform cannot name it.
std::string shareTmpPathOf(const std::string &volumePath) {
  std::array<char, kTmpPathBytes + 1> buffer{};
  if (KOVAShareTmpPathGet(volumePath.c_str(), buffer.data(), kTmpPathBytes) < 0) {
    const auto error = PlatformError::last();
    Log::error(kModule, 19, "KOVAShareTmpPathGet(%s) fail, [0x%04X %s:%d]", volumePath.c_str(),
               error.code, error.file, error.line);
    return "";
  }
  return buffer.data();
}

// What the three maximum filters share are functions, not a base class or a record: code compiled
// against the header relies on each filter deriving from FilterVolume directly and on its fields
// being direct members.

bool isLarger(const KOVAVOLInfo &info, std::uint64_t &maxSize) {
  if (maxSize >= info.size) {
    return false;
  }
  maxSize = info.size;
  return true;
}

// Type codes start at 1. Subtracting 1 makes any lower code a large unsigned number, which is
// refused as well.
bool isTypeUpTo(const KOVAVOLInfo &info, std::uint32_t lastCode) {
  return static_cast<std::uint32_t>(info.fsType) - 1U <= lastCode - 1U;
}

bool enumParameter(int ownLocation, int ownFlags, int &location, int &enumFlags) {
  location = ownLocation;
  enumFlags = ownFlags;
  return true;
}

std::string fallbackPath(bool fallbackTmp) {
  return fallbackTmp ? "/tmp" : "";
}

std::string maxSignature(const char *tag, int location, int enumFlags, bool fallbackTmp) {
  return std::string(tag) + ":" + std::to_string(location) + ":" + std::to_string(enumFlags) + ":" +
         (fallbackTmp ? "1" : "0");
}

} // namespace

FilterVolume::~FilterVolume() = default;

bool FilterVolume::getVolumeEnumParameter(int &location, int &enumFlags) const {
  const int supported = KOVAVolumeSupportLocGet();
  if (supported == 0) {
    return false;
  }
  location = supported;
  enumFlags = 1;
  return true;
}

std::string FilterVolume::defaultPath() const {
  return "";
}

FilterMaxVolume::FilterMaxVolume() : FilterMaxVolume(false) {}

FilterMaxVolume::FilterMaxVolume(bool fallbackTmp) : FilterMaxVolume(0, 0, fallbackTmp) {
  (void)FilterVolume::getVolumeEnumParameter(location_, enumFlags_); // false: they stay 0
}

FilterMaxVolume::FilterMaxVolume(int location, int enumFlags, bool fallbackTmp)
    : location_(location), enumFlags_(enumFlags), fallbackTmp_(fallbackTmp), maxSize_(0) {}

FilterMaxVolume::~FilterMaxVolume() = default;

bool FilterMaxVolume::getVolumeEnumParameter(int &location, int &enumFlags) const {
  return enumParameter(location_, enumFlags_, location, enumFlags);
}

bool FilterMaxVolume::isAccept(const KOVAVOLInfo &info) {
  return isLarger(info, maxSize_);
}

std::string FilterMaxVolume::defaultPath() const {
  return fallbackPath(fallbackTmp_);
}

std::string FilterMaxVolume::getSignature() const {
  return maxSignature("FilterMaxVolume", location_, enumFlags_, fallbackTmp_);
}

FilterMaxExtVolume::FilterMaxExtVolume() : FilterMaxExtVolume(false) {}

FilterMaxExtVolume::FilterMaxExtVolume(bool fallbackTmp) : FilterMaxExtVolume(0, 0, fallbackTmp) {
  (void)FilterVolume::getVolumeEnumParameter(location_, enumFlags_); // false: they stay 0
}

FilterMaxExtVolume::FilterMaxExtVolume(int location, int enumFlags, bool fallbackTmp)
    : location_(location), enumFlags_(enumFlags), fallbackTmp_(fallbackTmp), maxSize_(0) {}

FilterMaxExtVolume::~FilterMaxExtVolume() = default;

bool FilterMaxExtVolume::getVolumeEnumParameter(int &location, int &enumFlags) const {
  return enumParameter(location_, enumFlags_, location, enumFlags);
}

bool FilterMaxExtVolume::isAccept(const KOVAVOLInfo &info) {
  return isTypeUpTo(info, 2) && isLarger(info, maxSize_);
}

std::string FilterMaxExtVolume::defaultPath() const {
  return fallbackPath(fallbackTmp_);
}

std::string FilterMaxExtVolume::getSignature() const {
  return maxSignature("FilterMaxExtVolume", location_, enumFlags_, fallbackTmp_);
}

FilterMaxExtBtrfsVolume::FilterMaxExtBtrfsVolume() : FilterMaxExtBtrfsVolume(false) {}

FilterMaxExtBtrfsVolume::FilterMaxExtBtrfsVolume(bool fallbackTmp)
    : FilterMaxExtBtrfsVolume(0, 0, fallbackTmp) {
  (void)FilterVolume::getVolumeEnumParameter(location_, enumFlags_); // false: they stay 0
}

FilterMaxExtBtrfsVolume::FilterMaxExtBtrfsVolume(int location, int enumFlags, bool fallbackTmp)
    : location_(location), enumFlags_(enumFlags), fallbackTmp_(fallbackTmp), maxSize_(0) {}

FilterMaxExtBtrfsVolume::~FilterMaxExtBtrfsVolume() = default;

bool FilterMaxExtBtrfsVolume::getVolumeEnumParameter(int &location, int &enumFlags) const {
  return enumParameter(location_, enumFlags_, location, enumFlags);
}

bool FilterMaxExtBtrfsVolume::isAccept(const KOVAVOLInfo &info) {
  return isTypeUpTo(info, 3) && isLarger(info, maxSize_);
}

std::string FilterMaxExtBtrfsVolume::defaultPath() const {
  return fallbackPath(fallbackTmp_);
}

std::string FilterMaxExtBtrfsVolume::getSignature() const {
  return maxSignature("FilterMaxExtBtrfsVolume", location_, enumFlags_, fallbackTmp_);
}

FilterSameVolume::FilterSameVolume(const std::string &path) {
  KOVAVOLInfo info{}; // zeroed: the platform fills only a part of it
  if (KOVAMountVolInfoGet(path.c_str(), &info) < 0) {
    const auto error = PlatformError::last();
    Log::error(kModule, 30, "KOVAMountVolInfoGet(%s) failed, [0x%04X %s:%d]", path.c_str(),
               error.code, error.file, error.line);
    return;
  }
  volumePath_ = mountPathOf(info);
}

FilterSameVolume::~FilterSameVolume() = default;

bool FilterSameVolume::getVolumeEnumParameter(int & /*location*/, int & /*enumFlags*/) const {
  return false;
}

bool FilterSameVolume::isAccept(const KOVAVOLInfo & /*info*/) {
  return false;
}

std::string FilterSameVolume::defaultPath() const {
  return volumePath_.empty() ? "" : shareTmpPathOf(volumePath_);
}

std::string FilterSameVolume::getSignature() const {
  return "FilterSameVolume:" + volumePath_;
}

namespace {

using VolumeList = std::unique_ptr<KOVAVOLInfo, decltype(&KOVAMountVolInfoFree)>;

// The directory in which temporary data may be made on a volume, "" when there is none.
std::string usableDir(const KOVAVOLInfo &info) {
  const std::string mountPath = mountPathOf(info);
  if (mountPath.empty() || info.status == 0 || info.accessStatus == 0) {
    return "";
  }
  std::string dir = shareTmpPathOf(mountPath);
  if (!dir.empty() && ::access(dir.c_str(), W_OK) != 0) {
    dir.clear();
  }
  return dir;
}

// The directory of the volume that the filter prefers, "" when it accepts none.
std::string preferredDir(FilterVolume &filter) {
  int location = 0;
  int enumFlags = 0;
  if (!filter.getVolumeEnumParameter(location, enumFlags)) {
    return "";
  }
  const VolumeList volumes(KOVAMountVolAllEnum(0, location, enumFlags), &KOVAMountVolInfoFree);
  std::string preferred;
  for (const KOVAVOLInfo *info = volumes.get(); info != nullptr; info = info->next) {
    std::string dir = usableDir(*info);
    if (!dir.empty() && filter.isAccept(*info)) {
      preferred = std::move(dir);
    }
  }
  return preferred;
}

} // namespace

VolumePathManager::VolumePathManager() = default;

VolumePathManager::~VolumePathManager() = default;

VolumePathManager &VolumePathManager::getInstance() {
  static VolumePathManager instance;
  return instance;
}

// The filter is passed by value, so that it outlives the call even if its own operations release
// other references to it.
// NOLINTNEXTLINE(performance-unnecessary-value-param): part of the interface
bool VolumePathManager::getVolumePath(boost::shared_ptr<FilterVolume> filter, std::string &path) {
  if (!filter) {
    return false;
  }
  path.clear();
  const auto known = volumePathCache_.find(filter->getSignature());
  if (known != volumePathCache_.end()) {
    path = known->second;
    return true;
  }
  path = preferredDir(*filter);
  if (path.empty()) {
    path = filter->defaultPath();
  }
  if (path.empty()) {
    return false;
  }
  // The signature is read again: a filter may report another one once it has seen the volumes. On
  // bad_alloc nothing may be remembered; operator[] could leave "" in the cache.
  volumePathCache_.insert_or_assign(filter->getSignature(), path);
  return true;
}

} // namespace KOVA::Backup
