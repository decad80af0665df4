#include "path/filter/infix_filter.h"

#include <algorithm>
#include <cstring>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace KOVA::PatternSearch {
namespace {

constexpr std::size_t kBlock = 16;
constexpr std::size_t kMost = 64;

// Bit i of the result says whether at[i] is the byte.
// size: from kBlock to kMost.
#ifdef __SSE2__
std::uint64_t placesOf(char byte, const char *at, std::size_t size) {
  const auto placesIn = [at, wanted = _mm_set1_epi8(byte)](std::size_t block) {
    const __m128i bytes = _mm_loadu_si128(reinterpret_cast<const __m128i *>(at + block));
    const int equal = _mm_movemask_epi8(_mm_cmpeq_epi8(bytes, wanted));
    return std::uint64_t{static_cast<unsigned>(equal)} << block;
  };
  std::uint64_t places = placesIn(size - kBlock); // may share bytes with the block before it
  for (std::size_t block = 0; block + kBlock < size; block += kBlock) {
    places |= placesIn(block);
  }
  return places;
}
#else
std::uint64_t placesOf(char byte, const char *at, std::size_t size) {
  std::uint64_t places = 0;
  for (std::size_t i = 0; i < size; ++i) {
    places |= std::uint64_t{at[i] == byte} << i;
  }
  return places;
}
#endif

} // namespace

void HashedSet::add(std::uint64_t number) {
  growFor(numbers_.size() + 1);
  numbers_.push_back(number);
  put(number);
}

// Provides at least 64 bits for each number, so that few others share a bit.
void HashedSet::growFor(std::size_t numbers) {
  std::size_t words = bits_.size();
  unsigned shift = shift_;
  for (; words < numbers; words *= 2) {
    --shift;
  }
  if (words == bits_.size()) {
    return;
  }
  std::vector<std::uint64_t>(words).swap(bits_);
  shift_ = shift;
  for (const std::uint64_t number : numbers_) {
    put(number);
  }
}

void InfixFilter::add(std::string_view infix) {
  onlyFolders_ = onlyFolders_ && infix.back() == '/';
  if (infix.size() <= kShort) {
    shortFirst_[static_cast<unsigned char>(infix.front())] = true;
    anyShort_ = true;
    return;
  }
  if (infix.size() >= kLong) {
    long_.add(bytesAt<kLong>(infix.data()));
  } else if (infix.size() >= kMiddle) {
    middle_.add(bytesAt<kMiddle>(infix.data()));
  } else {
    three_.add(bytesAt<3>(infix.data()));
  }
  oneFirst_ = oneFirst_ && (first_ == '\0' || first_ == infix.front());
  first_ = infix.front();
}

const char *InfixFilter::nextOfAll(const char *at, const char *end) const noexcept {
  for (; at != end; ++at) {
    const auto rest = static_cast<std::size_t>(end - at);
    if (shortFirst_[static_cast<unsigned char>(*at)] || (rest > kShort && mayBeginAt(at, rest))) {
      return at;
    }
  }
  return end;
}

const char *InfixFilter::nextOfLong(const char *at, const char *end) const noexcept {
  for (; static_cast<std::size_t>(end - at) > kShort; ++at) {
    if (mayBeginAt(at, static_cast<std::size_t>(end - at))) {
      return at;
    }
  }
  return end;
}

// Finds the first byte of an infix in a block of places at once. The search ends at the first place
// where an infix can begin: what follows may be searched again from there, so a look at the rest of
// the block would be repeated for each place in it.
const char *InfixFilter::nextOfOneFirst(const char *at, const char *end) const noexcept {
  constexpr std::size_t kAhead = kLookAhead - 1;
  while (static_cast<std::size_t>(end - at) >= kBlock + kAhead) {
    const std::size_t size = std::min(static_cast<std::size_t>(end - at) - kAhead, kMost);
    for (std::uint64_t places = placesOf(first_, at, size); places != 0; places &= places - 1) {
      const char *const place = at + __builtin_ctzll(places);
      if (mayBeginAt(place, kLookAhead)) {
        return place;
      }
    }
    at += size;
  }
  return nextOfFewFirst(at, end);
}

const char *InfixFilter::nextOfFewFirst(const char *at, const char *end) const noexcept {
  for (; static_cast<std::size_t>(end - at) > kShort; ++at) {
    const auto rest = static_cast<std::size_t>(end - at);
    at = static_cast<const char *>(std::memchr(at, first_, rest - kShort));
    if (at == nullptr) {
      return end;
    }
    if (mayBeginAt(at, static_cast<std::size_t>(end - at))) {
      return at;
    }
  }
  return end;
}

} // namespace KOVA::PatternSearch
