#ifndef KOVABACKUP_TOOLS_HEALTH_H
#define KOVABACKUP_TOOLS_HEALTH_H

/// @file Whether the machine is in the state that the services need.

#include <chrono>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

enum class Verdict {
  Good,
  Remark, ///< worth knowing; nothing has to be done
  Wrong,
};

struct Finding {
  Verdict verdict;
  std::string check;
  std::string detail;
  std::string hint = {}; ///< what to do about it; "" when there is nothing to do
};

using Findings = std::vector<Finding>;

/// Runs all checks, in the order in which they are shown.
/// age: olderThan as the user wrote it; the hints repeat it.
/// Creates the temporary directories of volumes where they are missing, as every service does, and
/// nothing else: neither the platform's key nor the directories under /tmp/kovabackup.
Findings checkHealth(std::chrono::seconds olderThan, const std::string &age);

} // namespace KOVA::Backup::Tool

#endif
