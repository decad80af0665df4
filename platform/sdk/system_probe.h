#ifndef KOVAPLATFORM_SDK_SYSTEM_PROBE_H
#define KOVAPLATFORM_SDK_SYSTEM_PROBE_H

/// @file Everything that the volumes need to know of the system. Tests replace the probe by one of
/// an invented system.
///
/// Threads: any; a probe holds no state.

#include "platform/sdk/mounts.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KovaPlatform {

struct PathFacts {
  bool isDirectory = false;
  dev_t device = 0; ///< of the file system; a subvolume may have its own
  /// Id of the mount on which the path lies; none where the kernel does not report it.
  std::optional<std::uint64_t> mountId;
};

struct Space {
  std::uint64_t totalBytes = 0;
  bool isReadOnly = false;
};

class SystemProbe {
public:
  SystemProbe() = default;
  virtual ~SystemProbe() = default;
  SystemProbe(const SystemProbe &) = delete;
  SystemProbe &operator=(const SystemProbe &) = delete;

  /// The mount table, in its order. Returns false when it cannot be read.
  virtual bool mounts(std::vector<Mount> &out) const;
  /// The path without links, "." and ".."; none when it cannot be resolved.
  virtual std::optional<std::string> resolve(const std::string &path) const;
  /// What a path is, links followed; none when it cannot be reached.
  virtual std::optional<PathFacts> facts(const std::string &path) const;
  /// Size and state of the file system on which a path lies.
  virtual std::optional<Space> space(const std::string &path) const;
  /// KOVA_VOL_LOC_* of the disk under a mount.
  virtual std::int32_t location(const Mount &mount) const;
};

/// The facts of what a descriptor refers to; one opened with O_PATH is enough.
std::optional<PathFacts> factsOf(int fd);

} // namespace KovaPlatform

#endif
