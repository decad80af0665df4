#include "path/filter/state_word.h"

#include <bitset>
#include <cstring>
#include <vector>

namespace KOVA::PatternSearch {
namespace {

// Runs the words of a pattern that needs several, one after the other. entries passes on where the
// text enters the next word.
template <typename Entries>
Outcome runParts(const char *pattern, const char *text, Entries &entries) {
  Outcome best = Outcome::dead;
  entries[0] = true;
  while (pattern != nullptr) {
    StateWord word;
    pattern = word.append(pattern);
    const Outcome outcome = word.runPart(text, entries);
    if (outcome != Outcome::dead) {
      best = outcome; // only the last word knows a match
    }
  }
  return best;
}

} // namespace

std::size_t StateWord::statesOf(const char *pattern) {
  std::size_t states = 1;
  for (; *pattern != '\0'; ++pattern) {
    states += *pattern == '*' ? 0 : 1;
    if (*pattern == '\\' && pattern[1] != '\0') {
      ++pattern;
    }
  }
  return states;
}

const char *StateWord::append(const char *pattern) {
  first_ |= States{1} << size_;
  for (; size_ < kStates; ++size_) {
    const States state = States{1} << size_;
    if (*pattern == '*') {
      const std::size_t stars = std::strspn(pattern, "*");
      pattern += stars;
      stays_ |= state;
      staysOnAll_ |= stars > 1 ? state : 0;
    }
    if (*pattern == '\0') {
      last_ |= state;
      ++size_;
      return nullptr;
    }
    if (*pattern == '?') {
      byAnyByte_ |= state;
    } else {
      // A "\" at the very end takes no byte: a text contains no NUL.
      pattern += *pattern == '\\' ? 1 : 0;
      byBytes_[static_cast<unsigned char>(*pattern)] |= state;
    }
    pattern += *pattern == '\0' ? 0 : 1;
  }
  return pattern;
}

Outcome StateWord::run(const char *text) const {
  const States settled = last_ & staysOnAll_;
  States states = first_;
  for (; *text != '\0'; ++text) {
    states = next(states, *text);
    if (states == 0) {
      return Outcome::dead;
    }
    if ((states & settled) != 0) {
      return Outcome::matched;
    }
  }
  return outcomeOf(states);
}

Outcome compare(const char *pattern, const char *text) {
  if (StateWord::statesOf(pattern) <= StateWord::kStates) {
    StateWord word;
    word.append(pattern);
    return word.run(text);
  }
  constexpr std::size_t kShort = 16384;
  const std::size_t size = std::strlen(text);
  if (size < kShort) {
    std::bitset<kShort> entries;
    return runParts(pattern, text, entries);
  }
  std::vector<bool> entries(size + 1);
  return runParts(pattern, text, entries);
}

bool PatternBatch::add(const char *pattern) {
  const std::size_t states = StateWord::statesOf(pattern);
  if (states > StateWord::kStates) {
    return compare(pattern, text_) == Outcome::matched;
  }
  const bool full = word_.size() + states > StateWord::kStates;
  if (full && finish()) {
    return true;
  }
  word_.append(pattern);
  return false;
}

bool PatternBatch::finish() {
  const bool matched = word_.size() > 0 && word_.run(text_) == Outcome::matched;
  word_ = StateWord();
  return matched;
}

} // namespace KOVA::PatternSearch
