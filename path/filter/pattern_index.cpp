#include "path/filter/pattern_index.h"

#include <cstring>
#include <string>

namespace KOVA::PatternSearch {
namespace {

struct Keys {
  std::string beginning;
  std::string ending;
  std::string innerRun;
  bool neverMatches = false;
};

// Cuts a pattern into runs of literal bytes, as match reads them. A "\" at the very end can match
// no byte, and match never compares it with the text's end.
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
      keys_.ending = run_;
    } else {
      keys_.beginning = run_ + '\0';
    }
  }

  const Keys &keys() const { return keys_; }

private:
  void endRun() {
    if (!wildcards_) {
      keys_.beginning = run_;
    } else if (run_.size() > keys_.innerRun.size()) {
      keys_.innerRun = run_;
    }
    wildcards_ = true;
    run_.clear();
  }

  Keys keys_;
  std::string run_;
  bool wildcards_ = false;
};

// Whether the bytes between two places of a text stand at no earlier place of it.
bool isFirst(std::string_view text, const char *begin, const char *end) {
  const std::string_view run(begin, static_cast<std::size_t>(end - begin));
  return text.find(run) == static_cast<std::size_t>(begin - text.data());
}

} // namespace

struct PatternIndex::Question {
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

// kNone: a pattern that needs no place because it never matches. Nodes made before a failure stay;
// without entries they mean nothing.
NodeId PatternIndex::nodeFor(const char *pattern) {
  const KeyReader reader(pattern);
  const Keys &keys = reader.keys();
  if (keys.neverMatches) {
    return kNone;
  }
  if (root_ == kNone) {
    root_ = tries_.addRoot();
  }
  const NodeId byBeginning = tries_.insert(root_, keys.beginning);
  const std::string reversed(keys.ending.rbegin(), keys.ending.rend());
  const NodeId byEnding = tries_.insert(rootBelow(byBeginning), reversed);
  return keys.innerRun.empty() ? byEnding : tries_.insert(rootBelow(byEnding), keys.innerRun);
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
  const Question question{text, match};
  const char *const behindEnd = text + question.text.size() + 1;
  return tries_.walk(root_, text, behindEnd, [&](const LiteralTries::Node &node, const char *) {
    return node.next != kNone && matchesByEnding(node.next, question);
  });
}

bool PatternIndex::matchesByEnding(NodeId root, const Question &question) const {
  const auto visit = [&](const LiteralTries::Node &node, auto) {
    return matchesOne(node.first, question) ||
           (node.next != kNone && matchesByInnerRun(node.next, question));
  };
  return tries_.walk(root, question.text.rbegin(), question.text.rend(), visit);
}

// A run that stands in the text more than once leads to its patterns from the first place alone:
// asked at each, a single one could cost as many comparisons as the text has bytes.
bool PatternIndex::matchesByInnerRun(NodeId root, const Question &question) const {
  const std::string_view text = question.text;
  const char *at = text.data();
  const char *const end = at + text.size();
  const auto visit = [&](const LiteralTries::Node &node, const char *endOfRun) {
    return node.first != kNone && isFirst(text, at, endOfRun) && matchesOne(node.first, question);
  };
  for (; at != end; ++at) {
    if (tries_.walk(root, at, end, visit)) {
      return true;
    }
  }
  return false;
}

bool PatternIndex::matchesOne(std::size_t entry, const Question &question) const {
  for (; entry != kNone; entry = entries_[entry].next) {
    if (question.match(entries_[entry].pattern, question.text.data()) == 1) {
      return true;
    }
  }
  return false;
}

} // namespace KOVA::PatternSearch
