#ifndef KOVABACKUP_TOOLS_VOLUME_RULE_H
#define KOVABACKUP_TOOLS_VOLUME_RULE_H

/// @file The rules that choose a volume, and why a rule chooses the one that it does.

#include "kovabackup/volume_path_manager.h"

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// A rule as the command line names it: max, max-ext, max-ext-btrfs or same:PATH.
class VolumeRule {
public:
  /// Errors: throws a Failure (wrong usage) for any other text.
  explicit VolumeRule(const std::string &text);

  /// The rules, as the help lists them.
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

/// Resolves the rule as a service would. Creates the temporary directories of the volumes that it
/// examines, as every service does.
Choice choose(const VolumeRule &rule, bool fallbackTmp);

} // namespace KOVA::Backup::Tool

#endif
