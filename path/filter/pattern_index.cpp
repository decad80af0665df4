#include "path/filter/pattern_index.h"

#include <algorithm>
#include <array>
#include <atomic>
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

// Whether a pattern is a run of literal bytes followed by a double star, with nothing in front of
// it or another double star.
bool settlesByLiteral(const char *pattern) {
  const std::size_t first = std::strspn(pattern, "*");
  pattern += first;
  for (; *pattern != '*'; ++pattern) {
    const bool any = *pattern == '?' || *pattern == '\0';
    if (any || (*pattern == '\\' && *++pattern == '\0')) {
      return false;
    }
  }
  const std::size_t last = std::strspn(pattern, "*");
  return first != 1 && last > 1 && pattern[last] == '\0';
}

// A number that was never used in this process.
std::uint64_t newId() noexcept {
  static std::atomic<std::uint64_t> last{0};
  return ++last;
}

} // namespace

struct PatternIndex::Place {
  NodeId node = kNone;
  std::size_t group = kNone;
};

struct PatternIndex::Query {
  std::string_view text;
  const Match &match;
  Trail &trail;
};

// Finds the patterns of one trie of infixes.
class PatternIndex::InfixSearch {
public:
  InfixSearch(const PatternIndex &index, NodeId root, const Query &query)
      : index_(index), root_(root), query_(query), steps_(128 + query.text.size() / 16) {}

  bool matchesAny();

private:
  bool visit(const LiteralTries::Node &node, const char *end);
  const char *firstPlace(const char *end) const;
  const char *endOfSearch() const;
  bool isNew(std::size_t entry);

  const PatternIndex &index_;
  const NodeId root_;
  const Query &query_;
  std::size_t steps_;                 // that are left
  std::array<std::size_t, 32> asked_; // as many as askedSize_
  std::size_t askedSize_ = 0;
};

bool PatternIndex::InfixSearch::matchesAny() {
  const char *const end = endOfSearch();
  const auto visitOne = [this](const LiteralTries::Node &node, auto at) { return visit(node, at); };
  for (const char *at = firstPlace(end); at != end; at = index_.infixes_.next(at + 1, end)) {
    if (index_.tries_.walk(root_, at, end, visitOne)) {
      return steps_ > 0 ||
             index_.matchesGroup(index_.groups_[index_.tries_.node(root_).first], query_);
    }
  }
  return false;
}

// Where the infixes of a text end at the latest.
const char *PatternIndex::InfixSearch::endOfSearch() const {
  const bool onlyFolder = index_.infixes_.onlyFolders() && query_.trail.size() > 0;
  return query_.text.data() + (onlyFolder ? query_.trail.size() : query_.text.size());
}

// The first place that the filter does not rule out. The trail keeps as much of it as is true
// whatever name follows the folder.
const char *PatternIndex::InfixSearch::firstPlace(const char *end) const {
  Trail &trail = query_.trail;
  const char *const text = query_.text.data();
  const char *const first = index_.infixes_.next(text + trail.ruledOut(), end);
  const std::size_t ahead = index_.infixes_.onlyFolders() ? 0 : InfixFilter::kLookAhead - 1;
  const std::size_t sure = trail.size() - std::min(trail.size(), ahead);
  trail.ruleOut(std::min(static_cast<std::size_t>(first - text), sure));
  return first;
}

// Returns: whether the search ends here, with a match or because no step is left.
bool PatternIndex::InfixSearch::visit(const LiteralTries::Node &node, const char *end) {
  if (--steps_ == 0) {
    return true;
  }
  const bool isRoot = &node == &index_.tries_.node(root_);
  return !isRoot && node.first != kNone && isNew(node.first) &&
         index_.matchesOne(node.first, query_, static_cast<std::size_t>(end - query_.text.data()));
}

// An infix can occur in the text many times, and its patterns need be compared only once. More
// infixes than are remembered here are rare in a text; their patterns may be compared again, and
// each time counts for many steps.
bool PatternIndex::InfixSearch::isNew(std::size_t entry) {
  const auto end = asked_.begin() + static_cast<std::ptrdiff_t>(askedSize_);
  if (std::find(asked_.begin(), end, entry) != end) {
    return false;
  }
  if (askedSize_ < asked_.size()) {
    asked_[askedSize_++] = entry;
  } else {
    constexpr std::size_t kComparison = 16;
    steps_ -= std::min(steps_ - 1, kComparison);
  }
  return true;
}

void PatternIndex::add(const char *pattern) {
  id_ = newId();
  const Place place = placeOf(pattern);
  entries_.push_back({pattern, place.node, kNone, place.group, kNone, settlesByLiteral(pattern)});
  Entry &entry = entries_.back();
  if (entry.node != kNone) {
    entry.next = tries_.node(entry.node).first;
    tries_.node(entry.node).first = entries_.size() - 1;
  }
  if (entry.group != kNone) {
    Group &group = groups_[entry.group];
    entry.nextInGroup = group.first;
    group.first = entries_.size() - 1;
    ++group.size;
  }
}

void PatternIndex::shrink(std::size_t size) noexcept {
  id_ = newId();
  while (entries_.size() > size) {
    const Entry &last = entries_.back();
    if (last.node != kNone) {
      tries_.node(last.node).first = last.next;
    }
    if (last.group != kNone) {
      groups_[last.group].first = last.nextInGroup;
      --groups_[last.group].size;
    }
    entries_.pop_back();
  }
}

// Returns: no node for a pattern that needs none because it never matches. On bad_alloc the nodes
// made so far stay, which changes no answer since they have no entries.
PatternIndex::Place PatternIndex::placeOf(const char *pattern) {
  const KeyReader reader(pattern);
  const Keys &keys = reader.keys();
  if (keys.neverMatches) {
    return {};
  }
  if (root_ == kNone) {
    root_ = tries_.addRoot();
  }
  const NodeId byPrefix = tries_.insert(root_, keys.prefix);
  const std::string reversed(keys.suffix.rbegin(), keys.suffix.rend());
  const NodeId bySuffix = tries_.insert(rootBelow(byPrefix), reversed);
  if (keys.infix.empty()) {
    return {bySuffix, kNone};
  }
  infixes_.add(keys.infix);
  const NodeId infixRoot = infixRootBelow(bySuffix);
  return {tries_.insert(infixRoot, keys.infix), tries_.node(infixRoot).first};
}

NodeId PatternIndex::rootBelow(NodeId node) {
  if (tries_.node(node).next == kNone) {
    const NodeId root = tries_.addRoot();
    tries_.node(node).next = root;
  }
  return tries_.node(node).next;
}

NodeId PatternIndex::infixRootBelow(NodeId node) {
  if (tries_.node(node).next == kNone) {
    groups_.emplace_back();
    tries_.node(rootBelow(node)).first = groups_.size() - 1;
  }
  return tries_.node(node).next;
}

bool PatternIndex::anyMatches(std::string_view text, const Match &match, Trail &trail) const {
  if (root_ == kNone) {
    return false;
  }
  const Query query{text, match, trail};
  const auto matchesFrom = [&](const Trail::Step &step) {
    return step.suffixes != kNone && matchesBySuffix(step.suffixes, query, step.end);
  };
  if (trail.begin() == trail.end()) {
    trail.add({root_, tries_.node(root_).next, 0});
  }
  return std::any_of(trail.begin(), trail.end(), matchesFrom) ||
         (!trail.ended() && matchesBelow(trail.end()[-1], query));
}

// Goes on from the last node that the trail has.
bool PatternIndex::matchesBelow(Trail::Step last, const Query &query) const {
  const char *const text = query.text.data();
  const auto visit = [&](const LiteralTries::Node &node, const char *at) {
    last = {tries_.idOf(node), node.next, static_cast<std::size_t>(at - text)};
    query.trail.add(last);
    return last.suffixes != kNone && matchesBySuffix(last.suffixes, query, last.end);
  };
  if (tries_.walkBelow(last.node, text + last.end, text + query.text.size() + 1, visit)) {
    return true;
  }
  query.trail.setEnded(endsInFolder(last, query));
  return false;
}

// Whether the trail has all nodes that texts in its folder lead to. last: the last of them that
// this text leads to.
bool PatternIndex::endsInFolder(const Trail::Step &last, const Query &query) const {
  const std::size_t size = query.trail.size();
  const char *const text = query.text.data();
  return last.end < size && query.trail.end()[-1].node == last.node &&
         !tries_.leadsOn(last.node, text + last.end, text + size);
}

bool PatternIndex::matchesBySuffix(NodeId root, const Query &query, std::size_t prefixEnd) const {
  const auto visit = [&](const LiteralTries::Node &node, auto) {
    return matchesOne(node.first, query, prefixEnd) ||
           (node.next != kNone && matchesByInfix(node.next, query));
  };
  return tries_.walk(root, query.text.rbegin(), query.text.rend(), visit);
}

// With few patterns, a long text is read faster by comparing them.
bool PatternIndex::matchesByInfix(NodeId root, const Query &query) const {
  constexpr std::size_t kFew = 4;
  if (infixes_.onlyFolders() && query.trail.size() > 0 &&
      query.trail.ruledOut() == query.trail.size()) {
    return false;
  }
  const Group &group = groups_[tries_.node(root).first];
  if (group.size <= kFew && query.text.size() >= Trail::kTooLong) {
    return matchesGroup(group, query);
  }
  return InfixSearch(*this, root, query).matchesAny();
}

// literalEnd: where the prefix or the infix of these patterns ends in the text.
bool PatternIndex::matchesOne(std::size_t entry, const Query &query, std::size_t literalEnd) const {
  for (; entry != kNone; entry = entries_[entry].next) {
    if (query.match(entries_[entry].pattern, query.text.data()) == 1) {
      if (entries_[entry].settles) {
        query.trail.settle(literalEnd);
      }
      return true;
    }
  }
  return false;
}

bool PatternIndex::matchesGroup(const Group &group, const Query &query) const {
  for (std::size_t entry = group.first; entry != kNone; entry = entries_[entry].nextInGroup) {
    if (query.match(entries_[entry].pattern, query.text.data()) == 1) {
      return true;
    }
  }
  return false;
}

} // namespace KOVA::PatternSearch
