#include "path/filter/infix_filter.h"

namespace KOVA::PatternSearch {

void InfixFilter::add(std::string_view infix) {
  if (infix.size() < kGram) {
    shortFirst_[static_cast<unsigned char>(infix.front())] = true;
    anyShort_ = true;
    return;
  }
  growFor(grams_.size() + 1); // first, since it must have happened when there is a gram
  grams_.push_back(gramAt(infix.data()));
  put(grams_.back());
}

// Provides at least 16 bits for each gram, so that few other grams share a bit.
void InfixFilter::growFor(std::size_t grams) {
  constexpr std::size_t kFewest = 16;
  std::size_t words = bits_.empty() ? kFewest : bits_.size();
  while (words * 64 < grams * 16) {
    words *= 2;
  }
  if (words == bits_.size()) {
    return;
  }
  std::vector<std::uint64_t>(words).swap(bits_);
  shift_ = 32;
  for (std::size_t bits = words * 64; bits > 1; bits /= 2) {
    --shift_;
  }
  for (const std::uint32_t gram : grams_) {
    put(gram);
  }
}

const char *InfixFilter::nextOfAll(const char *at, const char *end) const noexcept {
  const bool anyLong = !grams_.empty();
  for (; at != end; ++at) {
    if (shortFirst_[static_cast<unsigned char>(*at)] ||
        (anyLong && static_cast<std::size_t>(end - at) >= kGram && has(gramAt(at)))) {
      return at;
    }
  }
  return end;
}

const char *InfixFilter::nextOfLong(const char *at, const char *end) const noexcept {
  for (; static_cast<std::size_t>(end - at) >= kGram; ++at) {
    if (has(gramAt(at))) {
      return at;
    }
  }
  return end;
}

} // namespace KOVA::PatternSearch
