#include "tools/kovabackup/facts/lock_holders.h"

#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/folder_names.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <fmt/format.h>
#include <sys/stat.h>

namespace KOVA::Backup::Tool {

namespace {

bool isFolder(const std::string &path) {
  struct stat info = {};
  return ::lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

// A token with inner slashes has its file in a subdirectory. Links are not followed.
void addTokensIn(const std::string &folder, const std::string &root,
                 std::vector<std::string> &folders, std::vector<std::string> &tokens) {
  std::vector<std::string> names;
  const int error = addNamesIn(folder, names);
  if (error != 0 && error != ENOENT) {
    throw Failure(kFailed, fmt::format("cannot read {}: {}", folder, reason(error)));
  }
  for (const std::string &name : names) {
    const std::string path = Path::join(folder, name);
    if (isFolder(path)) {
      folders.push_back(path);
    } else {
      tokens.push_back(Path::relative(path, root));
    }
  }
}

} // namespace

std::string lockFileOf(const std::string &token) {
  std::string path = Service::RunLock::path(token);
  if (path.empty()) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid lock token", token));
  }
  return path;
}

std::vector<std::string> allLockTokens() {
  const std::string root = Path::join(Path::getIpcTempPath(), "lock");
  std::vector<std::string> tokens;
  std::vector<std::string> folders{root};
  while (!folders.empty()) {
    const std::string folder = folders.back();
    folders.pop_back();
    addTokensIn(folder, root, folders, tokens);
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
