// One removal, folder by folder:
//
//     entered   its files are removed while it is read; the names of its folders become due
//     due       while names are due in the deepest folder, the one on top is entered
//     left      when none is due: its parent is opened, if it is not open, and the folder is
//               removed, or entered again when it is not empty

#include "kovabackup/service/tree_removal.h"

#include "service/absence.h"
#include "service/folder_id.h"
#include "service/folder_opener.h"
#include "service/folder_records.h"
#include "service/name_stack.h"
#include "service/tree_removal_path.h"

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"

#include <cerrno>
#include <cstddef>
#include <dirent.h>
#include <fcntl.h>
#include <string_view>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

using Base::UniqueFd;

constexpr int kMostReads = 32;

class Removal {
public:
  explicit Removal(const TreeRemoval::Report &report) : report_(report) {}

  bool run(const std::string &path);

private:
  bool openParent();
  void removeEntry(int reads);
  void removeUnopened(const Failed &failed);
  void removeNotFolder(const Failed &failed);
  Failed open(UniqueFd &folder) { return open(FolderOpener::Mount::Same, folder); }
  Failed open(FolderOpener::Mount mount, UniqueFd &folder);
  Failed openRoot(bool first, UniqueFd &folder);
  void read(UniqueFd folder, int reads);
  void removeListed(int folder, const char *name, unsigned char type);
  void leaveFolder();
  bool mayReadAgain(const RemovalPath::Level &left) const;
  void loseWay();
  int unlink(int flags) const;
  const char *name() const { return path_.c_str() + nameStart_; }
  int parent() const { return folders_.empty() ? parent_.get() : folders_.fd(); }
  void setName(std::size_t prefix);
  void noteRest();
  void fail(const Failed &failed, std::string path);

  const TreeRemoval::Report &report_;
  std::string path_;          // of the current entry
  std::size_t nameStart_ = 0; // of its last name
  bool mustBeFolder_ = false; // the root was written with a slash at the end
  bool rootIsMount_ = false;
  bool rootStays_ = false;
  UniqueFd parent_; // of the root
  FolderOpener opener_;
  RemovalPath folders_;
  NameStack names_; // of folders
  FolderRecords records_;
};

int unlinkEntry(int folder, const char *name, int flags) {
  const int result = Base::retryOnEintr([&] { return ::unlinkat(folder, name, flags); });
  return result == 0 || errno == ENOENT ? 0 : errno;
}

bool isNotFolder(int code) {
  return code == ENOTDIR || code == ELOOP;
}

// Another mount of "/" has its device and inode.
Failed refuseSystemRoot(int folder) {
  struct statx root = {};
  struct statx found = {};
  Failed failed = statEntry(AT_FDCWD, "/", root);
  if (!failed) {
    failed = statEntry(folder, "", found);
  }
  if (!failed && idOf(root) == idOf(found)) {
    failed = {"openat", EINVAL};
  }
  return failed;
}

bool Removal::run(const std::string &path) {
  path_ = path.substr(0, path.find_last_not_of('/') + 1);
  mustBeFolder_ = path_.size() < path.size();
  nameStart_ = path_.rfind('/') + 1; // npos + 1 is 0
  const std::string_view last = name();
  if (last.empty() || last == "." || last == ".." || path.find('\0') != std::string::npos) {
    fail({"openat", EINVAL}, path);
    return false;
  }
  if (!openParent()) {
    return !rootStays_;
  }
  removeEntry(1);
  while (!folders_.empty()) {
    if (names_.size() == folders_.deepest().dueAbove) {
      leaveFolder();
    } else {
      path_.resize(folders_.deepest().prefix);
      path_ += '/';
      nameStart_ = path_.size();
      names_.take(path_);
      removeEntry(1);
    }
  }
  return !rootStays_;
}

// Returns: false when there is nothing to remove, or after a failure.
bool Removal::openParent() {
  constexpr int kFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;
  const std::string parent = nameStart_ == 0 ? "." : path_.substr(0, nameStart_);
  parent_.reset(Base::retryOnEintr([&] { return ::openat(AT_FDCWD, parent.c_str(), kFlags); }));
  if (!parent_ && !isAbsence(errno)) {
    fail({"openat", errno}, parent);
  }
  return static_cast<bool>(parent_);
}

void Removal::removeEntry(int reads) {
  UniqueFd folder;
  const Failed failed = folders_.empty() ? openRoot(reads == 1, folder) : open(folder);
  if (!failed) {
    read(std::move(folder), reads);
  } else if (failed.code != ENOENT) {
    removeUnopened(failed);
  }
}

Failed Removal::open(FolderOpener::Mount mount, UniqueFd &folder) {
  return opener_.open(parent(), name(), O_RDONLY, mount, folder);
}

// The root may be a mount point, but must not have become one since it was read first.
Failed Removal::openRoot(bool first, UniqueFd &folder) {
  Failed failed = open(folder);
  if (first && failed.code == EXDEV) {
    rootIsMount_ = true;
    failed = open(FolderOpener::Mount::Any, folder);
  }
  return failed ? failed : refuseSystemRoot(folder.get());
}

// An empty folder that cannot be opened, and a folder that is not one, can still be removed.
void Removal::removeUnopened(const Failed &failed) {
  const int code = isNotFolder(failed.code) ? ENOTDIR : unlink(AT_REMOVEDIR);
  if (code == ENOTDIR) {
    removeNotFolder(failed);
  } else if (code != 0) {
    fail(failed, path_);
  }
}

void Removal::removeNotFolder(const Failed &failed) {
  if (mustBeFolder_ && folders_.empty()) {
    fail({failed.step, ENOTDIR}, path_);
    return;
  }
  const int code = unlink(0);
  if (code != 0) {
    fail({"unlinkat", code}, path_);
  }
}

void Removal::read(UniqueFd folder, int reads) {
  const int fd = folder.get();
  folders_.enter(std::move(folder), {path_.size(), names_.size(), reads});
  const int code = records_.read(
      fd, [&](const char *name, unsigned char type) { removeListed(fd, name, type); });
  if (code != 0 && code != ENOENT) { // ENOENT: it was removed meanwhile
    fail({"getdents64", code}, path_);
  }
}

// Linux never unlinks a folder (EISDIR). Where the file system gives no types, what cannot be
// unlinked becomes due as if it were a folder, so that the attempt to open it settles what it is.
void Removal::removeListed(int folder, const char *name, unsigned char type) {
  const int code = type == DT_DIR ? EISDIR : unlinkEntry(folder, name, 0);
  if (code == EISDIR || (code != 0 && type == DT_UNKNOWN)) {
    names_.push(name);
  } else if (code != 0) {
    fail({"unlinkat", code}, path_ + '/' + name);
  }
}

void Removal::leaveFolder() {
  const RemovalPath::Level left = folders_.deepest();
  if (!folders_.leave(opener_, path_)) {
    loseWay();
    return;
  }
  setName(left.prefix);
  const int code = unlink(AT_REMOVEDIR);
  if (code == ENOTDIR) {
    removeNotFolder({"unlinkat", code});
  } else if (code != ENOTEMPTY && code != EEXIST) {
    if (code != 0) {
      fail({"unlinkat", code}, path_);
    }
  } else if (mayReadAgain(left)) {
    removeEntry(left.reads + 1);
  } else if (left.failed) {
    noteRest();
  } else {
    fail({"unlinkat", code}, path_);
  }
}

// A root that was a mount point is not empty when it has been unmounted since: what it covered is
// not on its mount.
bool Removal::mayReadAgain(const RemovalPath::Level &left) const {
  const bool unmounted = rootIsMount_ && folders_.empty();
  return (!left.failed || left.lost) && left.reads < kMostReads && !unmounted;
}

// A folder on the way vanished, was replaced, or could not be opened. If it is still in the tree,
// the deepest folder that is open turns out not to be empty and is read again, which removes what
// there is now or reports why not.
void Removal::loseWay() {
  names_.shrinkTo(folders_.cut());
  folders_.deepest().lost = true;
}

int Removal::unlink(int flags) const {
  return unlinkEntry(parent(), name(), flags);
}

void Removal::setName(std::size_t prefix) {
  path_.resize(prefix);
  nameStart_ = path_.rfind('/') + 1;
}

// The folder above the current entry, or the path of the removal, does not get empty.
void Removal::noteRest() {
  (folders_.empty() ? rootStays_ : folders_.deepest().failed) = true;
}

void Removal::fail(const Failed &failed, std::string path) {
  noteRest();
  if (report_) {
    report_({failed.code, failed.step, std::move(path)});
  }
}

} // namespace

bool TreeRemoval::remove(const std::string &path, const Report &failed) {
  return Removal(failed).run(path);
}

} // namespace KOVA::Backup::Service
