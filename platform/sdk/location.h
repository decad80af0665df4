#ifndef KOVAPLATFORM_SDK_LOCATION_H
#define KOVAPLATFORM_SDK_LOCATION_H

/// @file Whether a disk is built in or removable, read from sysfs.

#include <cstdint>
#include <string>
#include <sys/types.h>

namespace KovaPlatform {

/// Location of a block device: KOVA_VOL_LOC_REMOVABLE when its disk, or one of the disks below it,
/// has removable media or is connected by USB; else KOVA_VOL_LOC_INTERNAL, also for a device that
/// sysfs does not list.
std::int32_t locationOf(const std::string &sysfs, dev_t device);

} // namespace KovaPlatform

#endif
