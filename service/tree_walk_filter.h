#ifndef KOVABACKUP_SERVICE_TREE_WALK_FILTER_H
#define KOVABACKUP_SERVICE_TREE_WALK_FILTER_H

/// @file What a walk asks about paths: is this one kept, can anything below it be kept, and which
/// pattern decided.
///
/// The second question is answered by two filters that are derived from the patterns.
///
/// Can an include pattern match anything below a folder? A path below it is the folder, "/" and
/// more. Only two elements of a pattern match that "/": a "/" of its own, or a "**". In the first
/// case, what precedes the "/" in the pattern matches the folder; in the second, what precedes the
/// "**", with the "**", does. And the other way round: each such prefix that matches the folder can
/// be continued to a match below it. So these prefixes are the patterns of a filter, and the answer
/// is whether one of them matches the folder. Prefixes behind the first "**" add nothing, since
/// the one that ends with it matches whatever they match:
///
///     /v/*/cache/**.tmp     "", "/v", "/v/*", "/v/*/cache", "/v/*/cache/**"
///
/// Does an exclude pattern match everything below a folder? It does when it ends in "**" and
/// matches the folder and "/".

#include "kovabackup/path_filter.h"

#include <list>
#include <memory>
#include <string>
#include <vector>

namespace KOVA::Backup::Service {

/// Finds the first pattern of a list that matches a path, by filters of some patterns each.
class FirstMatch {
public:
  explicit FirstMatch(const std::list<std::string> &patterns);

  /// Returns: the pattern, or nullptr.
  const std::string *of(const std::string &path) const;

private:
  std::vector<std::string> patterns_;
  std::vector<std::unique_ptr<PathFilter>> blocks_;
};

class WalkFilter {
public:
  /// Copies the patterns of filter.
  WalkFilter(PathFilter &filter, bool leftOutCloses);

  bool keeps(const std::string &path) { return !all_.filterOut(path); }

  /// Returns: whether anything below a folder can be kept, by the rules in tree_walk.h.
  /// prefix: the path of the folder without "/" at its end, so "" for "/".
  bool mustEnter(const std::string &prefix, bool kept);

  /// Sets pattern to the first include pattern that matches a kept path, or the first exclude
  /// pattern that matches another one.
  bool decidedBy(const std::string &path, bool kept, std::string &pattern);

private:
  void addIncludes(const std::list<std::string> &patterns);
  void addExcludes(const std::list<std::string> &patterns);

  PathFilter all_;
  PathFilter includedBelow_;
  PathFilter excludedBelow_;
  bool leftOutCloses_;
  std::unique_ptr<FirstMatch> includes_; // made when first asked
  std::unique_ptr<FirstMatch> excludes_;
};

} // namespace KOVA::Backup::Service

#endif
