#include "kovabackup/service/tree_walk.h"

#include "service/cache_folder.h"
#include "service/tree_walk_private.h"

#include "base/retry_on_eintr.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <sys/sysmacros.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

void trimSlashes(std::string &path) {
  while (path.size() > 1 && path.back() == '/') {
    path.pop_back();
  }
}

timespec timeOf(const struct statx_timestamp &stamp) {
  return {static_cast<time_t>(stamp.tv_sec), static_cast<long>(stamp.tv_nsec)};
}

void fill(WalkEntry &entry, const struct statx &found) {
  entry.mode = found.stx_mode;
  entry.uid = found.stx_uid;
  entry.gid = found.stx_gid;
  entry.device = idOf(found).device;
  entry.inode = found.stx_ino;
  entry.links = found.stx_nlink;
  entry.size = found.stx_size;
  entry.modified = timeOf(found.stx_mtime);
  entry.changed = timeOf(found.stx_ctime);
}

} // namespace

TreeWalkPrivate::TreeWalkPrivate(const std::string &root, PathFilter &filter,
                                 const WalkOptions &options)
    : path_(root),
      filter_(filter, options.leftOutCloses),
      oneFileSystem_(options.oneFileSystem),
      skipCaches_(options.skipCaches) {
  trimSlashes(path_);
  for (std::string path : options.leaveOut) {
    trimSlashes(path);
    leftOut_.insert(std::move(path));
  }
}

bool TreeWalkPrivate::next(WalkEntry &entry) {
  if (!started_) {
    started_ = true;
    return visitRoot(entry);
  }
  if (current_.toEnter) {
    enterCurrent();
  }
  current_ = {};
  for (;;) {
    if (!failures_.empty()) {
      entry = std::move(failures_.front());
      failures_.pop_front();
      return true;
    }
    if (names_.empty()) {
      end();
      return false;
    }
    if (names_.size() == folders_.deepest().dueAbove) {
      leaveFolder();
    } else if (visitNext(entry)) {
      return true;
    }
  }
}

bool TreeWalkPrivate::visitRoot(WalkEntry &entry) {
  struct statx found = {};
  if (path_.empty() || path_.front() != '/' || path_.find('\0') != std::string::npos) {
    return visit(entry, {"openat", EINVAL}, found);
  }
  if (leftOut_.count(path_) != 0) {
    return false;
  }
  constexpr int kFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
  root_.reset(Base::retryOnEintr([&] { return ::openat(AT_FDCWD, path_.c_str(), kFlags); }));
  if (!root_) {
    return visit(entry, {"openat", errno}, found);
  }
  const Failed failed = statEntry(root_.get(), "", found);
  device_ = idOf(found).device;
  return visit(entry, failed, found);
}

// Returns: false when the entry has vanished or is left out by an option.
bool TreeWalkPrivate::visitNext(WalkEntry &entry) {
  path_.resize(folders_.deepest().prefix);
  path_ += '/';
  const std::size_t name = path_.size();
  names_.take(path_);
  if (leftOut_.count(path_) != 0) {
    return false;
  }
  struct statx found = {};
  const Failed failed = statEntry(folders_.deepest().fd.get(), path_.c_str() + name, found);
  return failed.code != ENOENT && visit(entry, failed, found);
}

bool TreeWalkPrivate::visit(WalkEntry &entry, const Failed &failed, const struct statx &found) {
  entry.path = path_;
  entry.kept = filter_.keeps(path_);
  fill(entry, found);
  entry.error = {};
  if (failed) {
    entry.error = {failed.code, failed.step, path_};
  }
  current_.any = true;
  current_.toEnter = !failed && S_ISDIR(entry.mode);
  current_.isLink = !failed && S_ISLNK(entry.mode);
  current_.kept = entry.kept;
  current_.id = idOf(found);
  current_.size = entry.size;
  return true;
}

bool TreeWalkPrivate::mayEnter() {
  const bool onFileSystem = !oneFileSystem_ || current_.id.device == device_;
  return onFileSystem && filter_.mustEnter(path_.substr(0, prefixOfCurrent()), current_.kept);
}

void TreeWalkPrivate::enterCurrent() {
  if (!mayEnter()) {
    return;
  }
  Base::UniqueFd fd;
  const Failed failed =
      openFolder(parentOfCurrent(), nameOfCurrent().c_str(), O_RDONLY, current_.id, fd);
  if (failed) {
    addFailure(failed, {{}, current_.id, prefixOfCurrent(), 0, current_.kept});
  } else if (!skipCaches_ || !isCacheFolder(fd.get())) {
    readFolder(std::move(fd));
  }
}

void TreeWalkPrivate::readFolder(Base::UniqueFd fd) {
  const std::size_t due = names_.size();
  OpenFolders::Folder folder = {std::move(fd), current_.id, prefixOfCurrent(), due, current_.kept};
  const int error = names_.add(folder.fd.get());
  if (error != 0) {
    addFailure({"getdents64", error}, folder);
  }
  if (names_.size() > due) {
    folders_.enter(std::move(folder));
  }
}

void TreeWalkPrivate::leaveFolder() {
  const OpenFolders::Folder &deepest = folders_.deepest();
  const OpenFolders::Folder left = {{}, deepest.id, deepest.prefix, 0, deepest.kept};
  const Failed failed = folders_.leave(!names_.empty());
  if (failed) {
    addFailure(failed, left);
    descendAgain();
  }
}

// The names that are due in the folders that cannot be reached again are dropped.
void TreeWalkPrivate::descendAgain() {
  Failed failed;
  const std::size_t opened = folders_.descend(root_.get(), path_, failed);
  if (failed) {
    addFailure(failed, folders_.at(opened));
    names_.shrinkTo(folders_.at(opened).dueAbove);
    folders_.cutTo(opened);
  }
}

void TreeWalkPrivate::end() {
  folders_.cutTo(0);
  root_.reset();
}

int TreeWalkPrivate::parentOfCurrent() const {
  return folders_.empty() ? root_.get() : folders_.deepest().fd.get();
}

std::string TreeWalkPrivate::nameOfCurrent() const {
  if (folders_.empty()) {
    return ".";
  }
  return path_.substr(folders_.deepest().prefix + 1);
}

// "/" alone leads to no name: the root's entries are "/" and their names.
std::size_t TreeWalkPrivate::prefixOfCurrent() const {
  return path_.size() == 1 ? 0 : path_.size();
}

// ENOENT: the folder was removed after it had been returned, and so were its contents.
void TreeWalkPrivate::addFailure(const Failed &failed, const OpenFolders::Folder &folder) {
  if (failed.code == ENOENT) {
    return;
  }
  WalkEntry entry;
  entry.path = path_.substr(0, std::max(folder.prefix, std::size_t(1))); // "/" with the prefix 0
  entry.kept = folder.kept;
  entry.mode = S_IFDIR;
  entry.device = folder.id.device;
  entry.inode = folder.id.inode;
  entry.error = {failed.code, failed.step, entry.path};
  failures_.push_back(std::move(entry));
}

bool TreeWalkPrivate::linkTarget(std::string &target, Error &error) {
  if (!current_.isLink) {
    error = {EINVAL, "readlinkat", path_};
    return false;
  }
  std::string name; // "" for the root
  if (!folders_.empty()) {
    name = nameOfCurrent();
  }
  constexpr std::uint64_t kUsual = PATH_MAX; // links of /proc have the size 0, others at most this
  for (auto room = static_cast<std::size_t>(std::min(current_.size, kUsual) + 1);; room *= 2) {
    std::string text(room, '\0');
    const ssize_t size = Base::retryOnEintr(
        [&] { return ::readlinkat(parentOfCurrent(), name.c_str(), &text[0], room); });
    if (size < 0) {
      error = {errno, "readlinkat", path_};
      return false;
    }
    if (static_cast<std::size_t>(size) < room) { // else it may have been cut
      text.resize(static_cast<std::size_t>(size));
      target.swap(text);
      return true;
    }
  }
}

bool TreeWalkPrivate::decidedBy(std::string &pattern) {
  return current_.any && filter_.decidedBy(path_, current_.kept, pattern);
}

TreeWalk::TreeWalk(const std::string &absoluteRoot, PathFilter &filter, const WalkOptions &options)
    : private_(new TreeWalkPrivate(absoluteRoot, filter, options)) {}

TreeWalk::~TreeWalk() = default;

bool TreeWalk::next(WalkEntry &entry) {
  return private_->next(entry);
}

void TreeWalk::skipFolder() {
  private_->skipFolder();
}

bool TreeWalk::linkTarget(std::string &target, Error &error) {
  return private_->linkTarget(target, error);
}

bool TreeWalk::decidedBy(std::string &pattern) {
  return private_->decidedBy(pattern);
}

} // namespace KOVA::Backup::Service
