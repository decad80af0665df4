#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"
#include "path/filter/state_word.h"

#include <stdexcept>
#include <string_view>

namespace KOVA::Backup {
namespace {

using PatternSearch::PatternIndex;
using PatternSearch::Trail;

// Adds all patterns to the index, or none when std::bad_alloc is thrown. Callers change their list
// only afterwards, with operations that cannot fail, so list and index always hold the same
// patterns.
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
  std::list<std::string> one(1, pattern); // splice keeps its address, to which the index refers
  indexAll(one, index);
  list.splice(list.end(), one);
}

void merge(std::list<std::string> &patterns, std::list<std::string> &list, PatternIndex &index) {
  indexAll(patterns, index);
  list.merge(patterns); // relinks nodes: the strings keep the addresses to which the index refers
}

// As getIncludePattern documents, an empty base replaces out, and any other base appends to it.
// Both work on a list of their own first, so that an exception leaves out unchanged.
void rebaseAll(const std::list<std::string> &patterns, const std::string &base,
               std::list<std::string> &out) {
  if (base.empty()) {
    std::list<std::string> copy(patterns);
    out.swap(copy);
    return;
  }
  const std::size_t slash = base.rfind('/');
  if (slash == std::string::npos) {
    // Not left to substr: the header promises this text, and substr's own differs between C++
    // libraries.
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

// Compares a long text with many patterns at once, which takes some preparation.
bool anyMatchesLong(const PatternIndex &index, std::string_view text) {
  PatternSearch::PatternBatch batch(text.data());
  const auto add = [&batch](const char *pattern, const char *) {
    return batch.add(pattern) ? 1 : 0;
  };
  return index.anyMatches(text, add) || batch.finish();
}

// It only matters whether any pattern of a list matches, not which one, so an index can answer for
// the list.
// text: followed by a NUL, and with none in it.
bool anyMatches(const PatternIndex &index, std::string_view text) {
  if (index.size() == 0) {
    return false;
  }
  if (text.size() >= Trail::kTooLong) {
    return anyMatchesLong(index, text);
  }
  Trail &trail = Trail::turnedTo(text, index.id());
  return trail.settled() || index.anyMatches(text, &PathFilterPrivate::match, trail);
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

bool PathFilter::filterOut(const std::string &path) {
  const std::string_view text = path.c_str(); // up to its first NUL
  return !anyMatches(private_->includeIndex, text) && anyMatches(private_->excludeIndex, text);
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
