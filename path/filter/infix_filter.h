#ifndef KOVABACKUP_PATH_FILTER_INFIX_FILTER_H
#define KOVABACKUP_PATH_FILTER_INFIX_FILTER_H

/// @file Finds the few places of a text at which one of many infixes can begin.
///
/// A lookup at every place of a text would take most of the time of a query. A bitmap of the first
/// four bytes of the infixes rules out nearly all places at the cost of one bit test each. An infix
/// that is shorter than four bytes is represented by its first byte.
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

class InfixFilter {
public:
  /// infix: not empty.
  void add(std::string_view infix);

  /// Returns: the first place from at on where an infix can begin; end if there is none.
  const char *next(const char *at, const char *end) const noexcept {
    return anyShort_ ? nextOfAll(at, end) : nextOfLong(at, end);
  }

private:
  static constexpr std::size_t kGram = 4; // bytes

  static std::uint32_t gramAt(const char *at) noexcept {
    std::uint32_t gram = 0;
    std::memcpy(&gram, at, kGram);
    return gram;
  }
  std::size_t bitOf(std::uint32_t gram) const noexcept {
    return (gram * 0x9e3779b1U) >> shift_; // 2^32 / golden ratio
  }
  bool has(std::uint32_t gram) const noexcept {
    const std::size_t bit = bitOf(gram);
    return (bits_[bit / 64] >> (bit % 64) & 1) != 0;
  }
  void put(std::uint32_t gram) noexcept {
    const std::size_t bit = bitOf(gram);
    bits_[bit / 64] |= std::uint64_t{1} << (bit % 64);
  }

  void growFor(std::size_t grams);
  const char *nextOfAll(const char *at, const char *end) const noexcept;
  const char *nextOfLong(const char *at, const char *end) const noexcept;

  std::vector<std::uint32_t> grams_; // of the infixes of four bytes or more
  std::vector<std::uint64_t> bits_;  // their number is 0 or a power of two
  unsigned shift_ = 0;
  std::array<bool, 256> shortFirst_{}; // whether an infix below four bytes begins with the byte
  bool anyShort_ = false;
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
