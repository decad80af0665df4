#include "service/tree_walk_folders.h"

#include "base/retry_on_eintr.h"

#include <cerrno>
#include <fcntl.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

// Enough that the folders at the bottom of a tree, which are most of it, are left without "..".
constexpr std::size_t kOpenFolders = 4;

} // namespace

Failed openFolder(int parent, const char *name, int access, const FolderId &expected,
                  Base::UniqueFd &folder) {
  const int flags = access | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
  Base::UniqueFd opened(Base::retryOnEintr([&] { return ::openat(parent, name, flags); }));
  if (!opened) {
    return {"openat", errno};
  }
  struct statx now = {};
  const Failed failed = statEntry(opened.get(), "", now);
  if (failed) {
    return failed;
  }
  if (!(idOf(now) == expected)) {
    return {"openat", ESTALE};
  }
  folder = std::move(opened);
  return {};
}

void OpenFolders::enter(Folder folder) {
  folders_.push_back(std::move(folder));
  if (folders_.size() > kOpenFolders) {
    folders_[folders_.size() - 1 - kOpenFolders].fd.reset();
  }
}

Failed OpenFolders::leave(bool stay) {
  const Base::UniqueFd left = std::move(folders_.back().fd);
  folders_.pop_back();
  if (!stay || folders_.empty() || folders_.back().fd) {
    return {};
  }
  return openFolder(left.get(), "..", O_PATH, folders_.back().id, folders_.back().fd);
}

std::size_t OpenFolders::descend(int root, const std::string &path, Failed &failed) {
  Base::UniqueFd fd;
  std::size_t opened = 0;
  for (std::string name = "."; opened < folders_.size(); ++opened) {
    if (opened > 0) {
      const std::size_t start = folders_[opened - 1].prefix + 1;
      name = path.substr(start, folders_[opened].prefix - start);
    }
    const int parent = opened == 0 ? root : fd.get();
    failed = openFolder(parent, name.c_str(), O_PATH, folders_[opened].id, fd);
    if (failed) {
      break;
    }
  }
  if (opened > 0) {
    folders_[opened - 1].fd = std::move(fd);
  }
  return opened;
}

} // namespace KOVA::Backup::Service
