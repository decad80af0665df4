#include "check.h"

#include <kovabackup/path_filter.h>
#include <kovabackup/service/tree_removal.h>
#include <kovabackup/service/tree_walk.h>

#include <cerrno>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

namespace {

void makeTree() {
  check(::mkdir("/tmp/tree", 0700) == 0 && ::mkdir("/tmp/tree/folder", 0700) == 0 &&
            ::mkdir("/tmp/tree/folder/below", 0700) == 0 &&
            ::symlink("target", "/tmp/tree/link") == 0,
        "a tree to walk");
}

void callTreeWalk() {
  PathFilter filter;
  filter.addExcludePattern("/tmp/tree/link");
  WalkOptions options;
  options.leaveOut.push_back("/tmp/tree/absent");
  TreeWalk walk("/tmp/tree", filter, options);
  WalkEntry entry;
  check(walk.next(entry) && entry.path == "/tmp/tree" && entry.kept, "next: the root");
  check(walk.next(entry) && entry.path == "/tmp/tree/folder" && S_ISDIR(entry.mode),
        "next: a folder");
  walk.skipFolder();
  check(walk.next(entry) && entry.path == "/tmp/tree/link" && !entry.kept,
        "skipFolder: what follows the folder");
  std::string text;
  Error error;
  check(walk.linkTarget(text, error) && text == "target", "linkTarget");
  check(walk.decidedBy(text) && text == "/tmp/tree/link", "decidedBy");
  check(!walk.next(entry), "next: the end");
}

void callTreeRemoval() {
  std::string step;
  check(!TreeRemoval::remove("/", [&](const Error &error) { step = error.step; }) && !step.empty(),
        "remove: a report");
  check(TreeRemoval::remove("/tmp/tree") && ::access("/tmp/tree", F_OK) != 0, "remove");
}

} // namespace

void callTrees() {
  makeTree();
  callTreeWalk();
  callTreeRemoval();
}
