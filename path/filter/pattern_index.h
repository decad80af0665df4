#ifndef KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H
#define KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H

/// @file Finds the few patterns of thousands that may match a text.
///
/// A pattern is stored under three keys, each of them a run of bytes that stand for themselves:
/// what it begins with before its first "*" or "?", what it ends with behind its last one, and the
/// longest run in between. The first is looked up in a trie from the text's beginning, the second
/// in a trie that hangs on the first one's node from the text's end, the third in a trie that hangs
/// on the second one's node from every place of the text:
///
///     /v/**/cache/*.tmp      "/v/", ".tmp", "/cache/"
///     **/core                "", "/core"
///     /v/photo               "/v/photo" and the text's end, which counts as a byte here
///
/// Why the answer is that of the plain walk over all patterns: a match takes the elements of the
/// pattern one after the other, from the text's first byte to its end, and every byte of a key is
/// taken by the same byte of the text. So a text that matches has each key in its place, and a
/// pattern that is not looked at would not match. Those that are found are compared, so none counts
/// that does not match. And "one of them matches" does not depend on the order of the comparing.
///
/// Failure: add throws std::bad_alloc, and the index is then as it was.
/// Threads: anyMatches only reads and allocates nothing.

#include "path/filter/literal_tries.h"

#include <cstddef>
#include <string_view>
#include <vector>

#pragma GCC visibility push(default) // see literal_tries.h

namespace KOVA::PatternSearch {

class PatternIndex {
public:
  /// Compares a pattern with a text; 1 is a match.
  using Match = int (*)(const char *pattern, const char *text);

  /// Adds a pattern, which must stay where it is as long as the index.
  void add(const char *pattern);

  /// Patterns added so far.
  std::size_t size() const noexcept { return entries_.size(); }

  /// Takes back the patterns added last, until size are left.
  void shrink(std::size_t size) noexcept;

  /// Returns: whether match gives 1 for one of the patterns.
  bool anyMatches(const char *text, Match match) const;

private:
  struct Entry {
    const char *pattern;
    NodeId node;      // in whose list it stands
    std::size_t next; // in that list
  };
  struct Question;

  NodeId nodeFor(const char *pattern);
  NodeId rootBelow(NodeId node);
  bool matchesByEnding(NodeId root, const Question &question) const;
  bool matchesByInnerRun(NodeId root, const Question &question) const;
  bool matchesOne(std::size_t entry, const Question &question) const;

  LiteralTries tries_;
  NodeId root_ = kNone; // made with the first pattern
  std::vector<Entry> entries_;
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
