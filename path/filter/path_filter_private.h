#ifndef KOVABACKUP_PATH_FILTER_PATH_FILTER_PRIVATE_H
#define KOVABACKUP_PATH_FILTER_PATH_FILTER_PRIVATE_H

/// @file What a PathFilter holds, and the two engines that read its patterns.

#include "path/filter/pattern_index.h"

#include <list>
#include <map>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA::Backup {

class PathFilterPrivate {
public:
  PathFilterPrivate() = default;
  PathFilterPrivate(const PathFilterPrivate &) = delete; // the indexes point into the lists
  PathFilterPrivate &operator=(const PathFilterPrivate &) = delete;

  /// Compares a whole text with a pattern. Allocates nothing; recurses once a star.
  /// Returns: 1 match; 0 no match; -1 the text ran out, so nor will any later part of it match;
  ///          -2 a single star came to a "/" that it cannot pass: only a double star can help.
  static int match(const char *pattern, const char *text);

  /// Walks a pattern along a base folder and keeps what is left of the pattern for what lies below.
  /// Allocates nothing but the rest; recurses once a star.
  /// Returns: 1 when base can be a leading part of a path that the pattern matches, with rest set;
  ///          0 or -2 (as match) otherwise, rest untouched.
  static int rebase(const char *pattern, const char *base, std::string &rest);

  // The order of the first four is the record's fixed layout. The two maps only hold their places.
  std::list<std::string> includes;
  std::list<std::string> excludes;
  std::map<std::string, std::list<std::string>> reservedIncludes;
  std::map<std::string, std::list<std::string>> reservedExcludes;
  PatternSearch::PatternIndex includeIndex; // of the patterns in includes
  PatternSearch::PatternIndex excludeIndex; // of the patterns in excludes
};

} // namespace KOVA::Backup

#pragma GCC visibility pop

#endif
