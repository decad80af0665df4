#include "tools/kovabackup/facts/lock_holders.h"

#include "kovabackup/path_util.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <filesystem>
#include <fmt/format.h>
#include <system_error>

namespace KOVA::Backup::Tool {

std::string lockFileOf(const std::string &token) {
  std::string path = Service::RunLock::path(token);
  if (path.empty()) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid lock token", token));
  }
  return path;
}

// A token with inner slashes has its file in a subdirectory. Links are not followed.
std::vector<std::string> allLockTokens() {
  const std::string folder = Path::join(Path::getIpcTempPath(), "lock");
  std::vector<std::string> tokens;
  std::error_code error;
  for (std::filesystem::recursive_directory_iterator it(folder, error), end; !error && it != end;
       it.increment(error)) {
    if (!it->is_directory(error)) {
      tokens.push_back(Path::relative(it->path().string(), folder));
    }
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    throw Failure(kFailed, fmt::format("cannot read {}: {}", folder, reason(error.value())));
  }
  std::sort(tokens.begin(), tokens.end());
  return tokens;
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

bool LockState::held() const {
  return !keepers.empty() ||
         std::any_of(users.begin(), users.end(), [](const LockUser &user) { return !user.waits; });
}

LockState lockStateOf(const std::string &token) {
  LockState state;
  state.users = lockUsersOf(token);
  const bool ended = std::any_of(state.users.begin(), state.users.end(), [](const LockUser &user) {
    return !user.waits && user.command.empty();
  });
  if (ended || (!state.held() && !seesAllProcesses())) {
    state.keepers = lockKeepersOf(lockFileOf(token));
  }
  return state;
}

std::string describe(const LockUser &user) {
  return user.command.empty() ? fmt::format("{} (ended; a child keeps the lock)", user.pid)
                              : fmt::format("{} ({})", user.pid, user.command);
}

} // namespace KOVA::Backup::Tool
