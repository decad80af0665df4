#include "path/filter/pattern_index.h"

#include <cstring>
#include <string>

namespace KOVA::PatternSearch {
namespace {

struct Keys {
  std::string prefix;
  std::string suffix;
  std::string infix;
  bool neverMatches = false;
};

// Splits a pattern into runs of literal bytes, as match reads them. A "\" at the very end matches
// no byte, and match never compares it with the end of the text, so such a pattern never matches.
class KeyReader {
public:
  explicit KeyReader(const char *pattern) {
    for (; *pattern != '\0'; ++pattern) {
      if (*pattern == '*' || *pattern == '?') {
        endRun();
        continue;
      }
      if (*pattern == '\\' && *++pattern == '\0') {
        keys_.neverMatches = true;
        return;
      }
      run_ += *pattern;
    }
    if (wildcards_) {
      keys_.suffix = run_;
    } else {
      keys_.prefix = run_ + '\0';
    }
  }

  const Keys &keys() const { return keys_; }

private:
  void endRun() {
    if (!wildcards_) {
      keys_.prefix = run_;
    } else if (run_.size() > keys_.infix.size()) {
      keys_.infix = run_;
    }
    wildcards_ = true;
    run_.clear();
  }

  Keys keys_;
  std::string run_;
  bool wildcards_ = false;
};

// Whether the bytes between two places of a text occur at no earlier place of it.
bool isFirst(std::string_view text, const char *begin, const char *end) {
  const std::string_view run(begin, static_cast<std::size_t>(end - begin));
  return text.find(run) == static_cast<std::size_t>(begin - text.data());
}

} // namespace

struct PatternIndex::Query {
  std::string_view text;
  Match match;
};

void PatternIndex::add(const char *pattern) {
  const NodeId node = nodeFor(pattern);
  entries_.push_back({pattern, node, kNone});
  if (node != kNone) {
    entries_.back().next = tries_.node(node).first;
    tries_.node(node).first = entries_.size() - 1;
  }
}

void PatternIndex::shrink(std::size_t size) noexcept {
  while (entries_.size() > size) {
    const Entry &last = entries_.back();
    if (last.node != kNone) {
      tries_.node(last.node).first = last.next;
    }
    entries_.pop_back();
  }
}

// Returns: kNone for a pattern that needs no node because it never matches. On bad_alloc the nodes
// made so far stay, which changes no answer since they have no entries.
NodeId PatternIndex::nodeFor(const char *pattern) {
  const KeyReader reader(pattern);
  const Keys &keys = reader.keys();
  if (keys.neverMatches) {
    return kNone;
  }
  if (root_ == kNone) {
    root_ = tries_.addRoot();
  }
  const NodeId byPrefix = tries_.insert(root_, keys.prefix);
  const std::string reversed(keys.suffix.rbegin(), keys.suffix.rend());
  const NodeId bySuffix = tries_.insert(rootBelow(byPrefix), reversed);
  return keys.infix.empty() ? bySuffix : tries_.insert(rootBelow(bySuffix), keys.infix);
}

NodeId PatternIndex::rootBelow(NodeId node) {
  if (tries_.node(node).next == kNone) {
    const NodeId root = tries_.addRoot();
    tries_.node(node).next = root;
  }
  return tries_.node(node).next;
}

bool PatternIndex::anyMatches(const char *text, Match match) const {
  if (root_ == kNone) {
    return false;
  }
  const Query query{text, match};
  const char *const afterEnd = text + query.text.size() + 1;
  return tries_.walk(root_, text, afterEnd, [&](const LiteralTries::Node &node, const char *) {
    return node.next != kNone && matchesBySuffix(node.next, query);
  });
}

bool PatternIndex::matchesBySuffix(NodeId root, const Query &query) const {
  const auto visit = [&](const LiteralTries::Node &node, auto) {
    return matchesOne(node.first, query) ||
           (node.next != kNone && matchesByInfix(node.next, query));
  };
  return tries_.walk(root, query.text.rbegin(), query.text.rend(), visit);
}

// An infix that occurs in the text more than once leads to its patterns from its first place only.
// Otherwise a single pattern could cost as many comparisons as the text has bytes.
bool PatternIndex::matchesByInfix(NodeId root, const Query &query) const {
  const std::string_view text = query.text;
  const char *at = text.data();
  const char *const end = at + text.size();
  const auto visit = [&](const LiteralTries::Node &node, const char *infixEnd) {
    return node.first != kNone && isFirst(text, at, infixEnd) && matchesOne(node.first, query);
  };
  for (; at != end; ++at) {
    if (tries_.walk(root, at, end, visit)) {
      return true;
    }
  }
  return false;
}

bool PatternIndex::matchesOne(std::size_t entry, const Query &query) const {
  for (; entry != kNone; entry = entries_[entry].next) {
    if (query.match(entries_[entry].pattern, query.text.data()) == 1) {
      return true;
    }
  }
  return false;
}

} // namespace KOVA::PatternSearch
