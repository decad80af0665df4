#include "filtered_tree.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <list>
#include <sys/stat.h>

namespace fs = std::filesystem;

FilteredTree::FilteredTree(const std::string &source, KOVA::Backup::PathFilter &filter,
                           const std::string &skipped)
    : filter_(filter), skipped_(skipped), pending_{source} {}

bool FilteredTree::next(TreeEntry &entry) {
  if (pending_.empty()) {
    return false;
  }
  entry = TreeEntry();
  entry.path = pending_.back();
  pending_.pop_back();
  const bool included = !filter_.filterOut(entry.path);
  struct stat info {};
  if (::lstat(entry.path.c_str(), &info) != 0) {
    entry.error = included ? errno : 0;
    return true;
  }
  entry.kept = included && !S_ISSOCK(info.st_mode);
  entry.bytes = S_ISREG(info.st_mode) ? static_cast<std::uint64_t>(info.st_size) : 0;
  if (S_ISDIR(info.st_mode) && (included || mayKeepBelow(entry.path))) {
    entry.error = enter(entry.path);
  }
  return true;
}

bool FilteredTree::mayKeepBelow(const std::string &directory) {
  std::list<std::string> patterns;
  filter_.getIncludePattern(patterns, directory == "/" ? "" : directory);
  return !patterns.empty();
}

// Reads the directory completely before the walk goes on, so that a deep tree needs only one open
// descriptor and not one for each level.
int FilteredTree::enter(const std::string &directory) {
  const std::size_t first = pending_.size();
  std::error_code error;
  for (fs::directory_iterator child(directory, error), end; !error && child != end;
       child.increment(error)) {
    if (child->path() != skipped_) {
      pending_.push_back(child->path().string());
    }
  }
  std::sort(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end(),
            std::greater<>());
  return error.value();
}
