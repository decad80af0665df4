#include "tools/kovabackup/facts/lock_holders.h"

#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {

std::string lockFileOf(const std::string &token) {
  std::string path = Service::RunLock::path(token);
  if (path.empty()) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid lock token", token));
  }
  return path;
}

std::vector<LockUser> lockUsersOf(const std::string &token) {
  (void)lockFileOf(token);
  std::vector<LockUser> users;
  Service::Error error;
  if (!Service::RunLock::users(token, users, error)) {
    throw Failure(kFailed, fmt::format("cannot {} {}: {}", error.step == "stat" ? "access" : "read",
                                       error.path, reason(error.code)));
  }
  return users;
}

} // namespace KOVA::Backup::Tool
