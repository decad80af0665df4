#include "filtered_tree.h"

#include <filesystem>
#include <list>
#include <sys/stat.h>

namespace fs = std::filesystem;
using KOVA::Backup::PathFilter;

namespace {

bool mayKeepBelow(PathFilter &filter, const std::string &directory) {
  std::list<std::string> patterns;
  filter.getIncludePattern(patterns, directory);
  return !patterns.empty();
}

} // namespace

bool walkFiltered(const std::string &source, PathFilter &filter,
                  const std::function<bool(const std::string &path)> &visit, TreeTotals &totals) {
  struct stat info {};
  if (::lstat(source.c_str(), &info) != 0) {
    ++totals.unreadable;
    return true;
  }
  const bool kept = !filter.filterOut(source);
  if (kept) {
    ++totals.files;
    totals.bytes += S_ISREG(info.st_mode) ? static_cast<std::uint64_t>(info.st_size) : 0;
    if (!visit(source)) {
      return false;
    }
  }
  if (!S_ISDIR(info.st_mode) || (!kept && !mayKeepBelow(filter, source))) {
    return true;
  }
  std::error_code error;
  for (fs::directory_iterator entry(source, error), end; !error && entry != end;
       entry.increment(error)) {
    if (!walkFiltered(entry->path().string(), filter, visit, totals)) {
      return false;
    }
  }
  totals.unreadable += error ? 1 : 0;
  return true;
}
