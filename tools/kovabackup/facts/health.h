#ifndef KOVABACKUP_TOOLS_HEALTH_H
#define KOVABACKUP_TOOLS_HEALTH_H

/// @file Whether the machine is in the state that the services need.

#include <chrono>
#include <functional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

enum class Verdict {
  Good,
  Remark, ///< worth knowing; nothing has to be done
  Wrong,
  Fixed, ///< was wrong, and has been repaired
};

/// Repairs what a finding reports, where that can do no harm.
/// Returns: "" when it is repaired, else the reason why not.
using Fix = std::function<std::string()>;

struct Finding {
  Verdict verdict;
  std::string check;
  std::string detail;
  std::string hint = {}; ///< what to do about it; "" for a good one
  Fix fix = nullptr;     ///< null when only a person can decide
};

using Findings = std::vector<Finding>;

/// From when on something is reported.
struct HealthLimits {
  std::chrono::seconds olderThan; ///< the age of a stale session
  std::string age;                ///< the same as the user wrote it; the hints repeat it
  int minFreePercent;             ///< of /tmp and of each volume
};

/// Runs all checks, in the order in which they are shown.
/// Creates the temporary directories of volumes where they are missing, as every service does, and
/// nothing else: neither the platform's key nor the directories under /tmp/kovabackup.
Findings checkHealth(const HealthLimits &limits);

} // namespace KOVA::Backup::Tool

#endif
