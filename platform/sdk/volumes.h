#ifndef KOVAPLATFORM_SDK_VOLUMES_H
#define KOVAPLATFORM_SDK_VOLUMES_H

/// @file The volumes as the services see them: the system's mounts under the current configuration.

#include "platform/config/config.h"
#include "platform/sdk/system_probe.h"
#include "platform/sdk/volume_table.h"

#include <optional>

namespace KovaPlatform {

/// Reads configuration and volumes as they are now. Returns none with an error recorded.
std::optional<VolumeTable> currentVolumes(const SystemProbe &probe);

} // namespace KovaPlatform

#endif
