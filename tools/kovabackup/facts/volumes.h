#ifndef KOVABACKUP_TOOLS_VOLUMES_H
#define KOVABACKUP_TOOLS_VOLUMES_H

/// @file The volumes that the platform sees, and whether a service could use them.

#include <cstdint>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

struct Volume {
  std::string path; ///< where it is mounted
  int fsType;
  std::uint64_t size;
  bool mounted;
  bool writable;
  int location; ///< the bit of the platform's location mask
};

/// All volumes, including those that no rule accepts.
/// Errors: throws a Failure when the platform cannot list them.
std::vector<Volume> listVolumes();

/// Why the volumes cannot be listed, from the platform's record of its last error.
std::string whyNotListed();

/// Where a user corrects what keeps the platform from listing them: a noun.
std::string volumeConfiguration();

/// What a volume that is not mounted lacks: "not mounted", or that its path leads to no directory.
std::string whyNotMounted(const Volume &volume);

/// Why the platform could not create the temporary directory of a volume. Call it after the
/// failure.
std::string whyNoFolder(const std::string &volume);

/// What a user does who needs a volume: a clause without a full stop.
const char *volumeAdvice();

/// "ext4", "btrfs", "type 9".
std::string typeName(int fsType);

/// Whether a service could use a volume.
struct Usability {
  std::string folder;   ///< its temporary directory; "" when the volume is not usable
  std::string why;      ///< why it is not usable
  bool forRoot = false; ///< it may be usable for root, as whom the services run
  bool missing = false; ///< its path does not lead to a directory
};

/// Creates the temporary directory when it is missing, as every service does.
Usability usability(const Volume &volume);

} // namespace KOVA::Backup::Tool

#endif
