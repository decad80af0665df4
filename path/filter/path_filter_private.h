#ifndef KOVABACKUP_PATH_FILTER_PATH_FILTER_PRIVATE_H
#define KOVABACKUP_PATH_FILTER_PATH_FILTER_PRIVATE_H

/// @file The state of a PathFilter, and the two engines that interpret its patterns.

#include "path/filter/pattern_index.h"

#include <list>
#include <map>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA::Backup {

class PathFilterPrivate {
public:
  PathFilterPrivate() = default;
  PathFilterPrivate(const PathFilterPrivate &) =
      delete; // the indexes refer to strings of the lists
  PathFilterPrivate &operator=(const PathFilterPrivate &) = delete;

  /// Compares a pattern with an entire text. Takes one step per byte of the text for each 64
  /// elements of the pattern. Allocates nothing for a text of less than 16 KiB.
  /// Returns: 1 match; 0 no match; -1 the text ran out, so no later part of it can match either;
  ///          -2 a single star met a "/", which only a double star before it could pass.
  static int match(const char *pattern, const char *text);

  /// Walks a pattern along a base folder and keeps the part of the pattern that applies below it.
  /// Allocates only the rest; recurses once per star.
  /// Returns: 1 when base can be a leading part of a path that the pattern matches; rest is set.
  ///          Otherwise 0 or -2 (as match); rest is unchanged.
  static int rebase(const char *pattern, const char *base, std::string &rest);

  // The first four members, in this order, are a fixed layout. The two maps only occupy their
  // places.
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
