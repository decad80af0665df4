#ifndef KOVAPLATFORM_SDK_LOCATION_H
#define KOVAPLATFORM_SDK_LOCATION_H

/// @file Whether a disk stays or may be taken away, read from sysfs.

#include <cstdint>
#include <string>
#include <sys/types.h>

namespace KovaPlatform {

/// Location of a block device: KOVA_VOL_LOC_REMOVABLE when its disk, or one of the disks under it,
/// has removable media or hangs on USB; else KOVA_VOL_LOC_INTERNAL, also when sysfs knows nothing
/// of it.
std::int32_t locationOf(const std::string &sysfs, dev_t device);

} // namespace KovaPlatform

#endif
