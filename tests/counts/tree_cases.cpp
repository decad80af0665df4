// Sessions, walks and removals. The size is the number of sessions or entries. What depends on the
// volumes of the machine has no baseline. Debian's valgrind does not support openat2(2), so folders
// are opened as in a sandbox that refuses it: one name at a time.

#include "kovabackup/path_util.h"
#include "kovabackup/service/session_store.h"
#include "kovabackup/service/tree_removal.h"
#include "kovabackup/service/tree_walk.h"
#include "kovabackup/session.h"

#include "tests/counts/counted.h"

#include <sys/stat.h>

namespace KovaCounts {
namespace {

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

void makeFolder(const std::string &path) {
  require(::mkdir(path.c_str(), 0700) == 0, path.c_str());
}

std::string numbered(const std::string &prefix, std::size_t index) {
  return prefix + std::to_string(100000 + index);
}

// Every tenth entry is a folder with one file.
std::string makeTree(std::size_t entries) {
  std::string root = scratchFolder() + "/tree";
  makeFolder(root);
  for (std::size_t i = 0; i < entries; ++i) {
    const std::string path = numbered(root + "/entry", i);
    if (i % 10 == 0) {
      makeFolder(path);
      ++i;
    }
    writeFile(i % 10 == 1 ? path + "/file" : path, "");
  }
  return root;
}

void walk(std::size_t entries) {
  const std::string root = makeTree(entries);
  PathFilter filter;
  filter.addExcludePattern("**/*7");
  count([&] {
    TreeWalk tree(root, filter);
    std::size_t found = 0;
    for (WalkEntry entry; tree.next(entry);) {
      ++found;
    }
    return found == entries + 1;
  });
  require(removeAll(root), "the tree");
}

void removeByLibrary(std::size_t entries) {
  const std::string root = makeTree(entries);
  countOnce([&] { return removeAll(root); });
}

void removeByService(std::size_t entries) {
  const std::string root = makeTree(entries);
  countOnce([&] { return TreeRemoval::remove(root); });
}

std::string makeSessions(std::size_t sessions) {
  (void)scratchFolder();
  std::string root = Path::createIpcTempPath("session", 0777);
  for (std::size_t i = 0; i < sessions; ++i) {
    makeFolder(numbered(root + "/sess.", i));
  }
  return root;
}

void listSessions(std::size_t sessions) {
  const std::string root = makeSessions(sessions);
  count([&] {
    SessionStore store;
    std::vector<SessionInfo> found;
    Error error;
    return store.list(found, error) && found.size() == sessions;
  });
  require(removeAll(root), "the sessions");
}

void findSession(std::size_t sessions) {
  const std::string root = makeSessions(sessions);
  const std::string last = numbered("sess.", sessions - 1);
  count([&] {
    SessionInfo found;
    Error error;
    return SessionStore().find(last, found, error) && found.id == last;
  });
  require(removeAll(root), "the sessions");
}

// Its name is random, so it has no baseline.
void createSession(std::size_t sessions) {
  const std::string root = makeSessions(sessions);
  count([&] {
    Session session;
    return session.create() && session.destroy();
  });
  require(removeAll(root), "the sessions");
}

constexpr Case kCases[] = {
    {"TreeWalk", walk, {10, 1000}, 1000, kLinearLog},
    {"removeAll", removeByLibrary, {10, 1000}, 1000},
    {"TreeRemoval", removeByService, {10, 1000}, 1000},
    {"SessionStore.list", listSessions, {}, 500, kLinearLog},
    {"Session.create", createSession, {}, 500, kConstant},
    {"SessionStore.find", findSession, {}, 500, kConstant},
};

} // namespace

Cases treeCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
