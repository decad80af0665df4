#ifndef KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H
#define KOVABACKUP_PATH_FILTER_PATTERN_INDEX_H

/// @file Decides whether any of thousands of patterns matches a text, and compares only the few
/// that can.
///
/// A pattern is stored under three keys, each a run of literal bytes: its prefix up to the first
/// unescaped "*" or "?", its suffix after the last one, and its infix, which is the longest run in
/// between. The prefix is looked up in a trie from the beginning of the text. Its node leads to a
/// trie in which the suffix is looked up from the end of the text, and the suffix's node to a trie
/// in which the infix is looked up from every position in the text:
///
///     pattern                prefix        suffix     infix
///     /v/**/cache/*.tmp      "/v/"         ".tmp"     "/cache/"
///     **/core                ""            "/core"    ""
///     /v/photo               "/v/photo\0"  ""         ""
///
/// Without a wildcard the prefix includes the NUL at the end of the text. Most positions are ruled
/// out for the infix before the trie is asked; see infix_filter.h.
///
/// The answer is the same as if every pattern were compared. A match consumes the text from its
/// first byte to its end, and each literal byte of the pattern consumes an equal byte. A text that
/// matches therefore contains the keys of the pattern where the tries look for them, so no match is
/// missed. Each pattern that the tries lead to is compared, so none is invented. Their order makes
/// no difference.
///
/// A text that repeats itself, such as "aaaa", can contain the beginnings of infixes at every
/// position. The lookup of infixes is given up when it takes long in proportion to the text, and
/// all patterns with the same prefix and suffix are compared. So the time for a text is at most
/// proportional to its length and to the number of patterns.
///
/// Failure: add throws std::bad_alloc; the index then answers as before.
/// Threads: anyMatches only reads, so several threads may call it at once.
/// Cost:    anyMatches allocates nothing.

#include "path/filter/infix_filter.h"
#include "path/filter/literal_tries.h"
#include "path/filter/trail.h"

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#pragma GCC visibility push(default) // see literal_tries.h

namespace KOVA::PatternSearch {

class PatternIndex {
public:
  /// Compares a pattern with a text. The only wildcards of a pattern are "*" and "?", and its
  /// escape is "\". Refers to a function, which must exist for as long as the Match does.
  class Match {
  public:
    /// compare: returns 1 for a match, and any other number for none.
    template <typename Compare>
    Match(const Compare &compare) // NOLINT(google-explicit-constructor): stands for the function
        : compare_(&compare),
          call_([](const void *function, const char *pattern, const char *text) {
            return (*static_cast<const Compare *>(function))(pattern, text);
          }) {}

    int operator()(const char *pattern, const char *text) const {
      return call_(compare_, pattern, text);
    }

  private:
    const void *compare_;
    int (*call_)(const void *, const char *, const char *);
  };

  /// Adds a pattern. The index keeps the pointer until shrink removes the pattern.
  void add(const char *pattern);

  /// The number of patterns in the index.
  std::size_t size() const noexcept { return entries_.size(); }

  /// Removes the most recently added patterns until only size patterns are left.
  void shrink(std::size_t size) noexcept;

  /// Names the patterns that are in the index now. No other state of any index has this id, except
  /// that of a copy.
  std::uint64_t id() const noexcept { return id_; }

  /// Returns: whether match returns 1 for any of the patterns.
  bool anyMatches(std::string_view text, const Match &match) const {
    Trail none;
    return anyMatches(text, match, none);
  }

  /// Does the same, and remembers what it learns about the folder of the text.
  /// trail: that of this index and of this thread, which has turned to the text. match must be the
  ///        same function for all texts.
  bool anyMatches(std::string_view text, const Match &match, Trail &trail) const;

private:
  struct Entry {
    const char *pattern;
    NodeId node; // the node whose list holds this entry; kNone for a pattern that never matches
    std::size_t next;        // the next entry in that list; kNone at its end
    std::size_t group;       // of the trie that the infix is in; kNone without an infix
    std::size_t nextInGroup; // the next entry in the list of the group; kNone at its end
    bool settles;            // a text with its prefix or infix matches, however it goes on
  };
  // The patterns whose infixes are in one trie. The root of the trie has the number of the group.
  struct Group {
    std::size_t first = kNone;
    std::size_t size = 0;
  };
  struct Place;
  struct Query;
  class InfixSearch;

  Place placeOf(const char *pattern);
  NodeId rootBelow(NodeId node);
  NodeId infixRootBelow(NodeId node);
  bool matchesBelow(Trail::Step last, const Query &query) const;
  bool endsInFolder(const Trail::Step &last, const Query &query) const;
  bool matchesBySuffix(NodeId root, const Query &query, std::size_t prefixEnd) const;
  bool matchesByInfix(NodeId root, const Query &query) const;
  bool matchesOne(std::size_t entry, const Query &query, std::size_t literalEnd) const;
  bool matchesGroup(const Group &group, const Query &query) const;

  LiteralTries tries_;
  NodeId root_ = kNone; // made with the first pattern
  std::vector<Entry> entries_;
  std::vector<Group> groups_;
  InfixFilter infixes_;
  std::uint64_t id_ = 0; // 0 for an index to which nothing was ever added
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
