// Saving, creating and removing the section of a map, each under the map's lock.

#include "common/log.h"
#include "kovabackup/option_map.h"
#include "kovaplatform/kovacore.h"
#include "option/option_map_private.h"

namespace KOVA::Backup {
namespace {

// Holds a map's lock until release, or until it goes out of scope, which an exception may cause.
class HeldLock {
public:
  explicit HeldLock(OptionMap &map) : map_(map), held_(map.lock()) {}
  ~HeldLock() { (void)release(); }
  HeldLock(const HeldLock &) = delete;
  HeldLock &operator=(const HeldLock &) = delete;

  explicit operator bool() const { return held_; }

  // Returns: false when unlocking failed, which is not tried again, or when nothing was held.
  bool release() {
    if (!held_) {
      return false;
    }
    held_ = false;
    return map_.unlock();
  }

private:
  OptionMap &map_;
  bool held_;
};

bool removeSection(const SectionInfo &section) {
  if (platformCanCarry(section.name, KLIBC_ERR_BAD_SECTION_NAME, 719) &&
      KLIBCFileRemoveSection(section.path.c_str(), section.name.c_str()) == 1) {
    return true;
  }
  const auto error = PlatformError::last();
  Log::error(kOptionModule, 719, "rm [%s][%s]: [0x%04X %s:%d]", section.path.c_str(),
             section.name.c_str(), error.code, error.file, error.line);
  return false;
}

} // namespace

bool OptionMap::optSectionSave() {
  if (!d->isBound()) {
    Log::error(kOptionModule, 644, "not bind before save");
    return false;
  }
  HeldLock held(*this);
  return held && optSectionExport(d->section.path, d->section.name, false) && held.release();
}

bool OptionMap::optSectionCreate(const std::string &path, const std::string &prefix, int id) {
  if (id < 1 || d->section.loaded || path.empty() || prefix.empty()) {
    return false;
  }
  HeldLock held(*this);
  if (!held || !optSectionCreateUniqueId(path, prefix, id) || !held.release()) {
    return false;
  }
  d->bind(path, prefix, id);
  return true;
}

bool OptionMap::optSectionCreate(const std::string &path, const std::string &prefix, bool withId) {
  if (d->section.loaded || path.empty() || prefix.empty()) {
    return false;
  }
  HeldLock held(*this);
  if (!held) {
    return false;
  }
  int id = -1;
  if (withId) {
    id = optSectionGetUniqueId(path, prefix);
    if (id < 1) {
      return false;
    }
  } else if (!optSectionCreateUniqueName(path, prefix)) {
    return false;
  }
  if (!held.release()) {
    return false;
  }
  d->bind(path, prefix, id);
  return true;
}

bool OptionMap::optSectionRemove() {
  if (!d->isBound()) {
    Log::error(kOptionModule, 709, "not bind before remove");
    return false;
  }
  HeldLock held(*this);
  return held && removeSection(d->section) && held.release();
}

} // namespace KOVA::Backup
