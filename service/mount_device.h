#ifndef KOVABACKUP_SERVICE_MOUNT_DEVICE_H
#define KOVABACKUP_SERVICE_MOUNT_DEVICE_H

/// @file The device number that the kernel uses for a file outside of stat(2).

#include <string>
#include <sys/types.h>

namespace KOVA::Backup::Service {

/// Finds the device number of the file system that holds a file. stat(2) reports another one for a
/// file in a subvolume and on some overlays.
/// Returns: true with out set; false when it cannot be found out.
bool findMountDevice(const std::string &path, dev_t &out);

} // namespace KOVA::Backup::Service

#endif
