#include "service/tree_walk_filter.h"

#include <algorithm>
#include <cstddef>
#include <set>

namespace KOVA::Backup::Service {
namespace {

// A pattern that ends in a lone "\" matches nothing. Patterns end at their first NUL byte.
bool canMatch(const char *pattern) {
  while (*pattern != '\0') {
    if (*pattern == '\\' && *++pattern == '\0') {
      return false;
    }
    ++pattern;
  }
  return true;
}

// The prefixes of a pattern that match the folders below which the pattern can match; see the
// header. "\/" is a "/" like any other.
void addPrefixes(const char *const pattern, std::set<std::string> &prefixes) {
  for (const char *at = pattern; *at != '\0'; ++at) {
    if (at[0] == '*' && at[1] == '*') {
      prefixes.emplace(pattern, at + 2);
      return;
    }
    const char *const element = at;
    at += *at == '\\' ? 1 : 0;
    if (*at == '/') {
      prefixes.emplace(pattern, element);
    }
  }
}

bool endsInDoubleStar(const char *pattern) {
  std::size_t stars = 0; // at the end of what was read
  for (; *pattern != '\0'; ++pattern) {
    stars = *pattern == '*' ? stars + 1 : 0;
    pattern += *pattern == '\\' ? 1 : 0;
  }
  return stars >= 2;
}

std::list<std::string> includesOf(PathFilter &filter) {
  std::list<std::string> patterns;
  filter.getIncludePattern(patterns, "");
  return patterns;
}

std::list<std::string> excludesOf(PathFilter &filter) {
  std::list<std::string> patterns;
  filter.getExcludePattern(patterns, "");
  return patterns;
}

// Patterns per filter: a call asks each filter, then each pattern of one of them.
constexpr std::ptrdiff_t kBlock = 32;

} // namespace

FirstMatch::FirstMatch(const std::list<std::string> &patterns)
    : patterns_(patterns.begin(), patterns.end()) {
  for (std::size_t i = 0; i < patterns_.size(); ++i) {
    if (i % static_cast<std::size_t>(kBlock) == 0) {
      blocks_.push_back(std::make_unique<PathFilter>());
    }
    blocks_.back()->addExcludePattern(patterns_[i]);
  }
}

const std::string *FirstMatch::of(const std::string &path) const {
  const auto block = std::find_if(blocks_.begin(), blocks_.end(),
                                  [&path](const auto &filter) { return filter->filterOut(path); });
  if (block == blocks_.end()) {
    return nullptr;
  }
  const auto start = patterns_.begin() + (block - blocks_.begin()) * kBlock;
  return &*std::find_if(start, patterns_.end(), [&path](const std::string &pattern) {
    PathFilter one;
    one.addExcludePattern(pattern);
    return one.filterOut(path);
  });
}

WalkFilter::WalkFilter(PathFilter &filter, bool leftOutCloses) : leftOutCloses_(leftOutCloses) {
  addIncludes(includesOf(filter));
  addExcludes(excludesOf(filter));
}

void WalkFilter::addIncludes(const std::list<std::string> &patterns) {
  std::set<std::string> prefixes; // most patterns share theirs with others
  for (const std::string &pattern : patterns) {
    all_.addIncludePattern(pattern);
    if (canMatch(pattern.c_str())) {
      addPrefixes(pattern.c_str(), prefixes);
    }
  }
  for (const std::string &prefix : prefixes) {
    includedBelow_.addExcludePattern(prefix);
  }
}

void WalkFilter::addExcludes(const std::list<std::string> &patterns) {
  for (const std::string &pattern : patterns) {
    all_.addExcludePattern(pattern);
    if (canMatch(pattern.c_str()) && endsInDoubleStar(pattern.c_str())) {
      excludedBelow_.addExcludePattern(pattern);
    }
  }
}

bool WalkFilter::mustEnter(const std::string &prefix, bool kept) {
  if (includedBelow_.filterOut(prefix)) {
    return true;
  }
  if (!kept && leftOutCloses_) {
    return false;
  }
  return !excludedBelow_.filterOut(prefix + "/");
}

bool WalkFilter::decidedBy(const std::string &path, bool kept, std::string &pattern) {
  std::unique_ptr<FirstMatch> &first = kept ? includes_ : excludes_;
  if (first == nullptr) {
    first = std::make_unique<FirstMatch>(kept ? includesOf(all_) : excludesOf(all_));
  }
  const std::string *const found = first->of(path);
  if (found == nullptr) {
    return false;
  }
  pattern = *found;
  return true;
}

} // namespace KOVA::Backup::Service
