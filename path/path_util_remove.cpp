// Recursive removal that goes on after a failure and reports the first one.

#include "kovabackup/path_util.h"

#include "common/log.h"
#include "path/path_util_module.h"
#include "path/tree_removal.h"

#include <cerrno>
#include <climits>
#include <cstring>

namespace KOVA::Backup {
namespace {

// Path of the first entry that the current run of removeAll failed to remove. The callback of the
// walk gets no context, so the path is kept in a variable of the process.
std::string firstFailure;

int removeAndNoteFirstFailure(const char *path, const struct stat * /*info*/, int type,
                              struct FTW * /*position*/) {
  if (TreeRemoval::removeEntry(path, type) == 0 || errno == ENOENT || !firstFailure.empty()) {
    return 0;
  }
  if (TreeRemoval::isDirectory(type)) {
    Log::error(kPathUtilModule, 32, "rmdir %s failed. %m", path);
  } else {
    Log::error(kPathUtilModule, 39, "unlink %s failed. %m", path);
  }
  firstFailure.assign(path, ::strnlen(path, firstFailure.capacity())); // cut, never grown
  return 0;
}

} // namespace

bool removeAll(const std::string &path) {
  firstFailure.clear();
  // The callback must not throw bad_alloc: nftw(3) is C code and would leave its directories open.
  // So the room for a path is reserved before the walk.
  firstFailure.reserve(PATH_MAX);
  (void)TreeRemoval::walk(path, &removeAndNoteFirstFailure);
  return firstFailure.empty();
}

} // namespace KOVA::Backup
