#ifndef KOVABACKUP_SERVICE_TREE_WALK_PRIVATE_H
#define KOVABACKUP_SERVICE_TREE_WALK_PRIVATE_H

/// @file The state of a walk between two calls of next.
///
///     not started   next opens the root and gives it
///     entry given   a folder is entered by the following call of next, not before, so that
///                   skipFolder comes in time
///     failures due  folders that were given already are given again, each with its error
///     ended         no name is due in any folder

#include "kovabackup/service/tree_walk.h"

#include "base/unique_fd.h"

#include "service/tree_walk_filter.h"
#include "service/tree_walk_folders.h"
#include "service/tree_walk_names.h"

#include <cstddef>
#include <deque>
#include <set>
#include <string>
#include <sys/stat.h>

namespace KOVA::Backup::Service {

class TreeWalkPrivate {
public:
  TreeWalkPrivate(const std::string &root, PathFilter &filter, const WalkOptions &options);

  bool next(WalkEntry &entry);
  void skipFolder() { given_.toEnter = false; }
  bool linkTarget(std::string &target, Error &error);
  bool decidedBy(std::string &pattern);

private:
  // The entry that next gave last. Its path is path_.
  struct Given {
    bool any = false; // false before the first entry and after one that is given again
    bool toEnter = false;
    bool isLink = false;
    bool kept = false;
    FolderId id;
    std::size_t size = 0; // of a link: bytes of its target
  };

  bool giveRoot(WalkEntry &entry);
  bool giveNext(WalkEntry &entry);
  bool give(WalkEntry &entry, const Failed &failed, const struct statx &found);
  bool mayEnter();
  void enterGiven();
  void readFolder(Base::UniqueFd fd);
  void leaveFolder();
  void descendAgain();
  void end();
  int parentOfGiven() const;
  std::string nameOfGiven() const;
  std::size_t prefixOfGiven() const;
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
  Given given_;
  std::deque<WalkEntry> failures_;
};

} // namespace KOVA::Backup::Service

#endif
