#ifndef KOVABACKUP_PATH_FILTER_TRAIL_H
#define KOVABACKUP_PATH_FILTER_TRAIL_H

/// @file What the lookup of one path has shown about all paths in the same folder.
///
/// A program that walks a tree queries one path after the other, and most are in the folder of the
/// one before, or in one near it. A trail remembers a folder and, with it,
///   - the nodes of the trie of prefixes that the folder leads to, and whether more can follow;
///   - the places in it at which no infix begins;
///   - whether every path in it matches, as in "/a/" with the pattern "/a/**".
/// When it turns to another folder, it keeps what the common bytes of both have shown.
///
/// A trail refers to the nodes of an index by number. Each state of an index has an id that is
/// never used again, so a trail is never applied to an index that has changed, or to another one
/// at the same address.
///
/// Failure: nothing fails and nothing is allocated. A trail that is full remembers less.
/// Threads: each thread has its own trails, so threads never wait for each other.

#include "path/filter/literal_tries.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace KOVA::PatternSearch {

class Trail {
public:
  /// A node of the trie of prefixes.
  struct Step {
    NodeId node = 0;
    NodeId suffixes = 0; // the root of the trie of suffixes; kNone if there is none
    std::size_t end = 0; // how many bytes of the text lead to the node
  };

  /// Texts of this size or more cannot be remembered.
  static constexpr std::size_t kTooLong = 256;

  /// The folder of a text is all of it up to its last "/".
  /// Returns: this thread's trail for an index, turned to the folder of the text; an empty trail
  ///          where that would cost more than it saves.
  /// id: that of the index; not 0.
  static Trail &turnedTo(std::string_view text, std::uint64_t id) noexcept;

  /// Whether every text in the folder matches.
  bool settled() const noexcept { return settled_; }

  /// Notes that every text matches that has the same bytes up to this place.
  void settle(std::size_t place) noexcept {
    settled_ = place <= size_;
    settledAt_ = place;
  }

  /// The nodes that the folder is known to lead to, from the root on.
  const Step *begin() const noexcept { return steps_.data(); }
  const Step *end() const noexcept { return steps_.data() + stepsSize_; }

  /// Adds a node that the text leads to. Only those that the folder leads to are kept.
  void add(const Step &step) noexcept {
    if (step.end <= size_ && stepsSize_ < steps_.size()) {
      steps_[stepsSize_++] = step;
    }
  }

  /// Whether it is known that no text in the folder leads to more nodes.
  bool ended() const noexcept { return ended_; }
  void setEnded(bool ended) noexcept { ended_ = ended; }

  /// No infix begins in front of this place.
  std::size_t ruledOut() const noexcept { return ruledOut_; }
  void ruleOut(std::size_t place) noexcept { ruledOut_ = place; }

  /// The size of the folder; 0 for a trail that remembers none.
  std::size_t size() const noexcept { return size_; }

private:
  bool isAt(std::string_view folder) const noexcept;
  bool isNear(std::string_view folder) const noexcept;
  bool isExpected(std::string_view folder) noexcept;
  void turn(std::string_view folder) noexcept;
  void clear() noexcept {
    stepsSize_ = 0;
    ruledOut_ = 0;
    settled_ = false;
  }

  std::array<char, kTooLong> folder_{};
  std::size_t size_ = 0;
  std::array<Step, 24> steps_{};
  std::size_t stepsSize_ = 0;
  std::size_t ruledOut_ = 0;
  std::size_t settledAt_ = 0;
  bool settled_ = false;
  bool ended_ = false;
  std::uint64_t lastFolder_ = 0; // a hash of the folder of the last text
};

} // namespace KOVA::PatternSearch

#endif
