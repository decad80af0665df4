#ifndef KOVABACKUP_TOOLS_VOLUMES_H
#define KOVABACKUP_TOOLS_VOLUMES_H

/// @file The volumes that the platform sees, and the rules that choose one.

#include "kovabackup/volume_path_manager.h"

#include <cstdint>
#include <json/json.h>
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

/// All volumes, those that no rule would take included.
/// Errors: throws a Failure when the platform cannot tell.
std::vector<Volume> seenVolumes();

/// "ext4", "btrfs", "type 9".
std::string typeName(int fsType);
std::string locationName(int location);

/// The volume's temporary directory when a service could use it, else why it could not.
struct Usability {
  std::string folder;
  std::string why;
};

/// Makes the temporary directory when it is missing, as every service does.
Usability usability(const Volume &volume);

/// A rule as the command line names it: max, max-ext, max-ext-btrfs or same:PATH.
class VolumeRule {
public:
  /// Errors: throws a Failure (wrong usage) for any other text.
  explicit VolumeRule(const std::string &text);

  /// The rules as the help lists them.
  static const char *names();

  bool isSame() const { return kind_ == Kind::Same; }
  const std::string &path() const { return path_; }
  bool takesType(int fsType) const;
  boost::shared_ptr<FilterVolume> filter(bool fallbackTmp) const;

private:
  enum class Kind { Max, MaxExt, MaxExtBtrfs, Same };

  Kind kind_;
  std::string path_;
};

/// What a rule chooses, and why it does not choose the others.
struct Choice {
  struct Rejected {
    std::string volume;
    std::string why;
  };

  std::string folder; ///< "" when no volume qualifies
  std::string volume; ///< "" when the folder is the fallback
  std::vector<Rejected> rejected;
};

/// Resolves the rule as a service would. Makes the temporary directories of the volumes that it
/// looks at, as every service does.
Choice choose(const VolumeRule &rule, bool fallbackTmp);

} // namespace KOVA::Backup::Tool

#endif
