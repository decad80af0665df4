#ifndef KOVAPLATFORM_SDK_BOUNDARY_H
#define KOVAPLATFORM_SDK_BOUNDARY_H

/// @file The edge between C callers and the C++ inside.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"
#include "platform/config/config.h"
#include "platform/sdk/system_probe.h"
#include "platform/sdk/volume_table.h"

#include <exception>
#include <optional>

namespace KovaPlatform {

/// Records an error. Returns -1.
inline int fail(int code, const char *file, int line) {
  KLIBCErrSetEx(code, file, line);
  return -1;
}

/// Runs a service. Nothing is thrown inside but for want of memory, and nothing may leave: a C
/// caller cannot catch it. Returns the service's result, or failed with an error recorded.
template <typename Result, typename Service>
Result guarded(Result failed, const char *file, Service service) noexcept {
  try {
    return service();
  } catch (const std::exception &) {
    fail(KOVA_SDK_ERR_NO_MEMORY, file, __LINE__);
    return failed;
  }
}

/// Configuration and volumes as they are now. Returns none with an error recorded.
std::optional<VolumeTable> currentVolumes(const SystemProbe &probe);

} // namespace KovaPlatform

#endif
