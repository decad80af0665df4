#include "path/filter/infix_filter.h"

#include <algorithm>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace KOVA::PatternSearch {
namespace {

// Bit i of the result says whether at[i] is the byte.
// size: at most 64.
std::uint64_t placesOneByOne(char byte, const char *at, std::size_t size) {
  std::uint64_t places = 0;
  for (std::size_t i = 0; i < size; ++i) {
    places |= std::uint64_t{at[i] == byte} << i;
  }
  return places;
}

#ifdef __SSE2__
std::uint64_t placesOf(char byte, const char *at, std::size_t size) {
  constexpr std::size_t kBlock = 16;
  if (size < kBlock) {
    return placesOneByOne(byte, at, size);
  }
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
  return placesOneByOne(byte, at, size);
}
#endif

} // namespace

void HashedSet::add(std::uint64_t number) {
  growFor(numbers_.size() + 1);
  numbers_.push_back(number);
  put(number);
}

// Provides at least 16 bits for each number, so that few others share a bit.
void HashedSet::growFor(std::size_t numbers) {
  std::size_t words = bits_.size();
  unsigned shift = shift_;
  for (; words * 64 < numbers * 16; words *= 2) {
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
  all_.add(bytesAt<3>(infix.data()));
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

const char *InfixFilter::nextOfOneFirst(const char *at, const char *end) const noexcept {
  constexpr std::size_t kMost = 64;
  while (static_cast<std::size_t>(end - at) > kShort) {
    const std::size_t size = std::min(static_cast<std::size_t>(end - at) - kShort, kMost);
    for (std::uint64_t places = placesOf(first_, at, size); places != 0; places &= places - 1) {
      const char *const place = at + __builtin_ctzll(places);
      if (mayBeginAt(place, static_cast<std::size_t>(end - place))) {
        return place;
      }
    }
    at += size;
  }
  return end;
}

} // namespace KOVA::PatternSearch
