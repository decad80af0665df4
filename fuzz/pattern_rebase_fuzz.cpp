// A base folder on the first line, then patterns, one on each line: "+PATTERN" includes, any other
// line excludes. What the filter returns as seen from the base is what the plain rules return for
// each pattern in turn. It is appended, except for an empty base, and a base without a slash is
// refused without a change.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "fuzz/support.h"
#include "tests/path/filter/path_filter_oracle.h"

#include <algorithm>
#include <list>
#include <stdexcept>

namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::PathFilterPrivate;
using KovaFuzz::require;
namespace Oracle = KovaTest::Oracle;

using Strings = std::list<std::string>;
using Getter = bool (PathFilter::*)(Strings &, const std::string &);

// The string that the engines see: up to the first NUL.
std::string cut(const std::string &text) {
  return text.c_str();
}

// The oracle tries every combination of places.
bool isCheap(const std::string &pattern, const std::string &base) {
  const auto stars = std::count(pattern.begin(), pattern.end(), '*');
  return stars <= 2 || (stars <= 4 && base.size() <= 16);
}

// Adds what the rules make of one pattern.
void rebasePlainly(const std::string &pattern, const std::string &base, Strings &out) {
  std::string rest = "-";
  std::string restByEngine = "-";
  const int result = Oracle::rebase(cut(pattern), cut(base), rest);
  require(PathFilterPrivate::rebase(pattern.c_str(), base.c_str(), restByEngine) == result);
  require(result == 1 ? restByEngine == rest : restByEngine == "-");
  if (result == 1) {
    out.push_back(base.substr(base.rfind('/')) + rest);
  }
}

void checkRefused(PathFilter &filter, Getter get, const std::string &base) {
  Strings out = {"kept"};
  try {
    (void)(filter.*get)(out, base);
  } catch (const std::out_of_range &error) {
    require(std::string(error.what()) == "basic_string::substr");
    require(out == Strings{"kept"});
    return;
  }
  require(false);
}

void check(PathFilter &filter, Getter get, const Strings &patterns, const std::string &base) {
  Strings out = {"kept"};
  Strings expected = {"kept"};
  if (base.empty()) {
    expected = patterns;
  } else if (base.find('/') == std::string::npos) {
    checkRefused(filter, get, base);
    return;
  } else {
    for (const std::string &pattern : patterns) {
      rebasePlainly(pattern, base, expected);
    }
  }
  require((filter.*get)(out, base));
  require(out == expected);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const std::string base = input.until('\n');
  PathFilter filter;
  Strings includes;
  Strings excludes;
  while (!input.empty()) {
    const std::string line = input.until('\n');
    const bool isInclude = !line.empty() && line[0] == '+';
    const std::string pattern = line.substr(isInclude ? 1 : 0);
    if (isCheap(pattern, base)) {
      (isInclude ? includes : excludes).push_back(pattern);
      require(isInclude ? filter.addIncludePattern(pattern) : filter.addExcludePattern(pattern));
    }
  }
  check(filter, &PathFilter::getIncludePattern, includes, base);
  check(filter, &PathFilter::getExcludePattern, excludes, base);
  return 0;
}
