#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include <stdexcept>

namespace KOVA::Backup {
namespace {

using PatternSearch::PatternIndex;

// Adds the patterns to the index, or none of them on bad_alloc. Callers change the list afterwards
// by calls that cannot fail, so list and index always hold the same patterns.
void indexAll(const std::list<std::string> &patterns, PatternIndex &index) {
  const std::size_t before = index.size();
  try {
    for (const std::string &pattern : patterns) {
      index.add(pattern.c_str());
    }
  } catch (...) {
    index.shrink(before);
    throw;
  }
}

void append(const std::string &pattern, std::list<std::string> &list, PatternIndex &index) {
  std::list<std::string> one(1, pattern);
  indexAll(one, index);
  list.splice(list.end(), one);
}

void merge(std::list<std::string> &patterns, std::list<std::string> &list, PatternIndex &index) {
  indexAll(patterns, index);
  list.merge(patterns); // moves the nodes, so the strings to which the index refers do not move
}

void rebaseAll(const std::list<std::string> &patterns, const std::string &base,
               std::list<std::string> &out) {
  if (base.empty()) {
    std::list<std::string> copy(patterns);
    out.swap(copy);
    return;
  }
  const std::size_t slash = base.rfind('/');
  if (slash == std::string::npos) {
    // The text of substr's own exception has numbers in it that depend on the C++ library.
    throw std::out_of_range("basic_string::substr");
  }
  const std::string component = base.substr(slash);
  std::list<std::string> found;
  std::string rest;
  for (const std::string &pattern : patterns) {
    if (PathFilterPrivate::rebase(pattern.c_str(), base.c_str(), rest) == 1) {
      found.push_back(component + rest);
    }
  }
  out.splice(out.end(), found);
}

} // namespace

PathFilter::PathFilter() : private_(new PathFilterPrivate) {}

PathFilter::~PathFilter() = default;

bool PathFilter::addIncludePattern(const std::string &pattern) {
  append(pattern, private_->includes, private_->includeIndex);
  return true;
}

bool PathFilter::addIncludePattern(std::list<std::string> &patterns) {
  merge(patterns, private_->includes, private_->includeIndex);
  return true;
}

bool PathFilter::addExcludePattern(const std::string &pattern) {
  append(pattern, private_->excludes, private_->excludeIndex);
  return true;
}

bool PathFilter::addExcludePattern(std::list<std::string> &patterns) {
  merge(patterns, private_->excludes, private_->excludeIndex);
  return true;
}

// Whether one of a list's patterns matches does not depend on the order of comparison, so an index
// may answer for each list.
bool PathFilter::filterOut(const std::string &path) {
  if (private_->includeIndex.anyMatches(path.c_str(), &PathFilterPrivate::match)) {
    return false;
  }
  return private_->excludeIndex.anyMatches(path.c_str(), &PathFilterPrivate::match);
}

bool PathFilter::getIncludePattern(std::list<std::string> &out, const std::string &base) {
  rebaseAll(private_->includes, base, out);
  return true;
}

bool PathFilter::getExcludePattern(std::list<std::string> &out, const std::string &base) {
  rebaseAll(private_->excludes, base, out);
  return true;
}

} // namespace KOVA::Backup
