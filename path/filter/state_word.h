#ifndef KOVABACKUP_PATH_FILTER_STATE_WORD_H
#define KOVABACKUP_PATH_FILTER_STATE_WORD_H

/// @file Compares patterns with a text in one step per byte, however many stars they have.
///
/// A pattern is read as a row of states, one in front of each element that takes a byte and one at
/// the end. A star takes no place of its own: it lets the state in front of it stay.
///
///     pattern    /  v  /  *  b  **  ?           state 3 stays on each byte except "/",
///     state      0  1  2  3     4        5      state 4 stays on every byte
///
/// A StateWord holds the states of one or more patterns as the bits of a number. A set of states is
/// such a number, too, and one step moves all of them at once:
///
///     next = the states whose element takes the byte, moved up by one, and the states that stay
///
/// A pattern matches when its last state is in the set after the last byte of the text.

#include <array>
#include <cstdint>

namespace KOVA::PatternSearch {

/// What is left of a pattern's states after the last byte of a text.
enum class Outcome {
  matched, // the last state
  alive,   // some other state: a longer text could match
  dead     // none
};

class StateWord {
public:
  using States = std::uint64_t;
  static constexpr unsigned kStates = 64;

  /// The number of states that a pattern takes.
  static std::size_t statesOf(const char *pattern);

  /// Appends the states of a pattern, or as many of them as there is room for.
  /// Returns: the elements that found no room; nullptr when the last state is in the word.
  const char *append(const char *pattern);

  unsigned size() const noexcept { return size_; }

  /// Runs over a text from the first state of each pattern that was appended.
  /// Returns: the outcome of the pattern for which it is best. Stops before the end of the text
  ///          when no byte can change it.
  Outcome run(const char *text) const;

  /// Runs over a text when the word holds only a part of a pattern. entries[i] says whether the
  /// first state is entered in front of the byte i. Afterwards it says whether the state that would
  /// follow the last one of the word is.
  template <typename Entries>
  Outcome runPart(const char *text, Entries &entries) const {
    States states = entries[0] ? 1 : 0;
    entries[0] = false;
    for (std::size_t i = 0; text[i] != '\0'; ++i) {
      const bool leaves = (states & takenBy(text[i])) >> (kStates - 1) != 0;
      states = next(states, text[i]) | (entries[i + 1] ? 1 : 0);
      entries[i + 1] = leaves;
    }
    return outcomeOf(states);
  }

private:
  States takenBy(char byte) const noexcept {
    return byBytes_[static_cast<unsigned char>(byte)] | (byte == '/' ? 0 : byAnyByte_);
  }
  States next(States states, char byte) const noexcept {
    return (states & takenBy(byte)) << 1 | (states & (byte == '/' ? staysOnAll_ : stays_));
  }
  Outcome outcomeOf(States states) const noexcept {
    return (states & last_) != 0 ? Outcome::matched : states != 0 ? Outcome::alive : Outcome::dead;
  }

  std::array<States, 256> byBytes_{}; // states whose element is this byte
  States byAnyByte_ = 0;              // states whose element is "?"
  States stays_ = 0;                  // states with a star
  States staysOnAll_ = 0;             // states with a double star
  States first_ = 0;
  States last_ = 0;
  unsigned size_ = 0;
};

/// Compares one pattern of any size with a text. Allocates only when the pattern takes more than 64
/// states and the text is longer than 16 KiB. Time: in proportion to the size of the text for each
/// 64 states.
Outcome compare(const char *pattern, const char *text);

/// Compares many patterns with one text, as many at once as share a word.
class PatternBatch {
public:
  explicit PatternBatch(const char *text) : text_(text) {}

  /// Takes one more pattern.
  /// Returns: true when it is known that some pattern matches.
  bool add(const char *pattern);

  /// Returns: whether some of the patterns matches that add has not yet compared.
  bool finish();

private:
  const char *text_;
  StateWord word_;
};

} // namespace KOVA::PatternSearch

#endif
