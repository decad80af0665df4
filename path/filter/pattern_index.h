#ifndef KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H
#define KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H

/// @file Finds the few patterns of thousands that may match a text.
///
/// A pattern is stored under three keys, each a run of literal bytes: its prefix up to the first
/// "*" or "?", its suffix after the last one, and its infix, which is the longest run in between.
/// The prefix is looked up in a trie from the beginning of the text. Its node leads to a trie in
/// which the suffix is looked up from the end of the text, and the suffix's node to a trie in which
/// the infix is looked up from every place of the text:
///
///     pattern                prefix        suffix     infix
///     /v/**/cache/*.tmp      "/v/"         ".tmp"     "/cache/"
///     **/core                ""            "/core"
///     /v/photo               "/v/photo" and the end of the text, which counts as a byte here
///
/// Why the answer is the same as that of comparing all patterns: a match takes the elements of the
/// pattern one after the other, from the first byte of the text to its end, and each byte of a key
/// takes an equal byte of the text. So a text that matches has each key in its place, and a pattern
/// that the tries do not lead to cannot match. Patterns that they do lead to are compared, so none
/// counts without a match. And whether one of them matches does not depend on their order.
///
/// Failure: add throws std::bad_alloc; the index is then unchanged.
/// Threads: anyMatches only reads and allocates nothing.

#include "path/filter/literal_tries.h"

#include <cstddef>
#include <string_view>
#include <vector>

#pragma GCC visibility push(default) // see literal_tries.h

namespace KOVA::PatternSearch {

class PatternIndex {
public:
  /// Compares a pattern with a text. Returns: 1 for a match.
  using Match = int (*)(const char *pattern, const char *text);

  /// Adds a pattern, which must outlive the index and not move.
  void add(const char *pattern);

  /// Patterns added so far.
  std::size_t size() const noexcept { return entries_.size(); }

  /// Removes the patterns added last until size of them are left.
  void shrink(std::size_t size) noexcept;

  /// Returns: whether match returns 1 for one of the patterns.
  bool anyMatches(const char *text, Match match) const;

private:
  struct Entry {
    const char *pattern;
    NodeId node;      // whose list holds this entry; kNone: a pattern that never matches
    std::size_t next; // the entry after this one in that list
  };
  struct Query;

  NodeId nodeFor(const char *pattern);
  NodeId rootBelow(NodeId node);
  bool matchesBySuffix(NodeId root, const Query &query) const;
  bool matchesByInfix(NodeId root, const Query &query) const;
  bool matchesOne(std::size_t entry, const Query &query) const;

  LiteralTries tries_;
  NodeId root_ = kNone; // made with the first pattern
  std::vector<Entry> entries_;
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
