#ifndef KOVAPLATFORM_SDK_VOLUMES_H
#define KOVAPLATFORM_SDK_VOLUMES_H

/// @file The volumes as the services see them: the system's mounts under the current configuration.

#include "platform/config/config.h"
#include "platform/sdk/system_probe.h"
#include "platform/sdk/volume_table.h"
#include "platform/support/failure.h"

#include <optional>

namespace KovaPlatform {

/// Reads configuration and volumes as they are now. Returns none with an error recorded.
std::optional<VolumeTable> currentVolumes(const SystemProbe &probe);

/// A caller's path on the volumes, and the volumes, to which position refers.
struct LocatedPath {
  VolumeTable volumes;
  PathOnVolume position;
};

/// Finds where a path is now. Returns none with an error recorded: unresolved when the path cannot
/// be resolved, else that of currentVolumes.
std::optional<LocatedPath> locatePath(const char *path, const SystemProbe &probe,
                                      const Failure &unresolved);

} // namespace KovaPlatform

#endif
