#ifndef KOVABACKUP_PATH_FILTER_INFIX_FILTER_H
#define KOVABACKUP_PATH_FILTER_INFIX_FILTER_H

/// @file Finds the few places of a text at which one of many infixes can begin.
///
/// A lookup at every place of a text would take most of the time of a query. Sets of the first
/// bytes of the infixes rule out nearly all places: one about the infixes of eight bytes or more,
/// one about those of four to seven, and one about those of three. An infix of one or two bytes is
/// represented by its first byte.
///
/// In most lists all infixes begin with "/". Only the places of that byte are tried then.
///
/// Failure: add throws std::bad_alloc; the filter then finds at least the places it found before.
/// Threads: next only reads.

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <vector>

#pragma GCC visibility push(default) // see literal_tries.h

namespace KOVA::PatternSearch {

/// A set of numbers in which some numbers are found that were not added.
class HashedSet {
public:
  void add(std::uint64_t number);

  bool empty() const noexcept { return numbers_.empty(); }
  bool mayHave(std::uint64_t number) const noexcept {
    const std::size_t bit = bitOf(number);
    return (bits_[bit / 64] >> (bit % 64) & 1) != 0;
  }

private:
  std::size_t bitOf(std::uint64_t number) const noexcept {
    // 2^64 / golden ratio
    return static_cast<std::size_t>((number * 0x9e3779b97f4a7c15U) >> shift_);
  }
  void put(std::uint64_t number) noexcept {
    const std::size_t bit = bitOf(number);
    bits_[bit / 64] |= std::uint64_t{1} << (bit % 64);
  }
  void growFor(std::size_t numbers);

  std::vector<std::uint64_t> numbers_;
  std::vector<std::uint64_t> bits_ = std::vector<std::uint64_t>(1); // a power of two
  unsigned shift_ = 64 - 6;
};

class InfixFilter {
public:
  /// Whether an infix can begin at a place depends on so many bytes from there on.
  static constexpr std::size_t kLookAhead = 8;

  /// infix: not empty.
  void add(std::string_view infix);

  /// Returns: the first place from at on where an infix can begin; end if there is none.
  const char *next(const char *at, const char *end) const noexcept {
    return anyShort_   ? nextOfAll(at, end)
           : oneFirst_ ? nextOfOneFirst(at, end)
                       : nextOfLong(at, end);
  }

  /// Whether all infixes end in "/", so that each lies in the folder of a text that contains it.
  bool onlyFolders() const noexcept { return onlyFolders_; }

private:
  static constexpr std::size_t kShort = 2;
  static constexpr std::size_t kMiddle = 4;
  static constexpr std::size_t kLong = kLookAhead;

  template <std::size_t size>
  static std::uint64_t bytesAt(const char *at) noexcept {
    std::uint64_t bytes = 0;
    std::memcpy(&bytes, at, size);
    return bytes;
  }
  // rest: how many bytes there are at that place, at least three.
  bool mayBeginAt(const char *at, std::size_t rest) const noexcept {
    return (rest >= kLong && mayHave<kLong>(long_, at)) ||
           (rest >= kMiddle && mayHave<kMiddle>(middle_, at)) || mayHave<3>(three_, at);
  }
  template <std::size_t size>
  static bool mayHave(const HashedSet &set, const char *at) noexcept {
    return !set.empty() && set.mayHave(bytesAt<size>(at));
  }
  const char *nextOfAll(const char *at, const char *end) const noexcept;
  const char *nextOfLong(const char *at, const char *end) const noexcept;
  const char *nextOfOneFirst(const char *at, const char *end) const noexcept;
  const char *nextOfFewFirst(const char *at, const char *end) const noexcept;

  HashedSet long_;                     // the first eight bytes of those of eight or more
  HashedSet middle_;                   // the first four bytes of those of four to seven
  HashedSet three_;                    // those of three bytes
  std::array<bool, 256> shortFirst_{}; // the first bytes of the others
  bool anyShort_ = false;
  char first_ = '\0'; // with which all of three bytes or more begin, if oneFirst_
  bool oneFirst_ = true;
  bool onlyFolders_ = true; // all end in "/"
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
