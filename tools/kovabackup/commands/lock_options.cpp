#include "tools/kovabackup/commands/lock_options.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/frame/text.h"

#include <chrono>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {

void declareLock(Command &command, LockOptions &options) {
  command
      .option(options.token, "--lock", "TOKEN",
              "hold this lock token while the file is read and written")
      .completes(lockTokens)
      .option(options.timeout, "--lock-timeout", "SECONDS",
              "end with 4 when the lock is not free within this time, 0 to 3600; by default the "
              "wait has no limit");
}

LockRequest lockRequest(const LockOptions &options) {
  constexpr int kMostSeconds = 3600;
  if (!options.timeout) {
    return {options.token};
  }
  if (!options.token) {
    throw Failure(kUsage, "--lock-timeout requires --lock");
  }
  const auto seconds = parseNumber(*options.timeout, 0, kMostSeconds);
  if (!seconds) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid time limit: expected an integer from 0 "
                                      "to {}",
                                      *options.timeout, kMostSeconds));
  }
  return {options.token, std::chrono::seconds(*seconds)};
}

} // namespace KOVA::Backup::Tool
