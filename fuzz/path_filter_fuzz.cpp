// Changes and queries of a filter, one on each line: "+PATTERN" includes, "-PATTERN" excludes, and
// any other line is a path that is queried at that point. The filter, which uses its indexes, must
// agree with a plain walk over all patterns, and both engines must agree with their oracle.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "fuzz/support.h"
#include "tests/path/filter/path_filter_oracle.h"

#include <list>

namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::PathFilterPrivate;
using KovaFuzz::require;
namespace Oracle = KovaTest::Oracle;

using Strings = std::list<std::string>;

// The string that match and rebase see: up to the first NUL.
std::string cut(const std::string &text) {
  return text.c_str();
}

void checkEngines(const std::string &pattern, const std::string &path) {
  // The oracle tries every combination of places.
  const auto stars = std::count(pattern.begin(), pattern.end(), '*');
  if (stars > 5 || path.size() > 40) {
    return;
  }
  const int result = PathFilterPrivate::match(pattern.c_str(), path.c_str());
  require(result == Oracle::match(pattern, path));
  require((result == 1) == Oracle::covers(pattern, path));
  std::string rest = "-";
  std::string expected = "-";
  require(PathFilterPrivate::rebase(pattern.c_str(), path.c_str(), rest) ==
          Oracle::rebase(pattern, path, expected));
  require(rest == expected);
}

void ask(PathFilter &filter, const Strings &includes, const Strings &excludes,
         const std::string &path) {
  const bool expected = Oracle::filterOut(includes, excludes, path);
  for (int times = 0; times < 3; ++times) { // the filter remembers a folder at its second path
    require(filter.filterOut(path) == expected);
  }
  for (const Strings *patterns : {&includes, &excludes}) {
    for (const std::string &pattern : *patterns) {
      checkEngines(cut(pattern), cut(path));
    }
  }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  PathFilter filter;
  Strings includes;
  Strings excludes;
  KovaFuzz::Input input(data, size);
  while (!input.empty()) {
    const std::string line = input.until('\n');
    if (line.rfind("+", 0) == 0) {
      includes.push_back(line.substr(1));
      filter.addIncludePattern(includes.back());
    } else if (line.rfind("-", 0) == 0) {
      excludes.push_back(line.substr(1));
      filter.addExcludePattern(excludes.back());
    } else {
      ask(filter, includes, excludes, line);
    }
  }
  return 0;
}
