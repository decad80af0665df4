#ifndef KOVABACKUP_SERVICE_TREE_WALK_PRIVATE_H
#define KOVABACKUP_SERVICE_TREE_WALK_PRIVATE_H

/// @file The state of a walk between two calls of next.
///
///     not started   next opens the root and returns it
///     at an entry   a folder is entered by the following call of next, not before, so that
///                   skipFolder comes in time
///     failures due  folders that were returned before are returned again, each with its error
///     ended         no name is due in any folder

#include "kovabackup/service/tree_walk.h"

#include "base/unique_fd.h"

#include "service/tree_walk_filter.h"
#include "service/tree_walk_folders.h"
#include "service/tree_walk_names.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <set>
#include <string>
#include <sys/stat.h>

namespace KOVA::Backup::Service {

class TreeWalkPrivate {
public:
  TreeWalkPrivate(const std::string &root, PathFilter &filter, const WalkOptions &options);

  bool next(WalkEntry &entry);
  void skipFolder() { current_.toEnter = false; }
  bool linkTarget(std::string &target, Error &error);
  bool decidedBy(std::string &pattern);

private:
  // The entry that next returned last. Its path is path_.
  struct Current {
    bool any = false; // false before the first entry and after one that is returned again
    bool toEnter = false;
    bool isLink = false;
    bool kept = false;
    FolderId id;
    std::uint64_t size = 0; // of a link: bytes of its target
  };

  bool visitRoot(WalkEntry &entry);
  bool visitNext(WalkEntry &entry);
  bool visit(WalkEntry &entry, const Failed &failed, const struct statx &found);
  bool mayEnter();
  void enterCurrent();
  void readFolder(Base::UniqueFd fd);
  void leaveFolder();
  void descendAgain();
  void end();
  int parentOfCurrent() const;
  std::string nameOfCurrent() const;
  std::size_t prefixOfCurrent() const;
  void addFailure(const Failed &failed, const OpenFolders::Folder &folder);

  std::string path_;
  WalkFilter filter_;
  bool oneFileSystem_;
  bool skipCaches_;
  std::set<std::string> leftOut_; // WalkOptions::leaveOut
  bool started_ = false;
  Base::UniqueFd root_; // O_PATH, of any type of entry
  dev_t device_ = 0;    // of the root
  OpenFolders folders_;
  DueNames names_;
  Current current_;
  std::deque<WalkEntry> failures_;
};

} // namespace KOVA::Backup::Service

#endif
