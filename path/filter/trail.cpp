#include "path/filter/trail.h"

#include "path/filter/infix_filter.h"

#include <algorithm>
#include <cstring>

namespace KOVA::PatternSearch {
namespace {

constexpr std::size_t kTrails = 8; // a filter has two indexes

// All zero at the start of a thread. Nothing runs when a thread begins or ends.
struct Trails {
  std::array<std::uint64_t, kTrails> ids{}; // 0 for a trail that no index has used
  std::array<Trail, kTrails> trails{};
  Trail none;
  std::size_t oldest = 0;
};
thread_local Trails ofThread;

constexpr std::size_t kWord = sizeof(std::uint64_t);

std::uint64_t wordAt(const char *at) noexcept {
  std::uint64_t word = 0;
  std::memcpy(&word, at, sizeof word);
  return word;
}

// Returns: how many bytes are equal from the beginning on, at most size.
std::size_t commonSize(const char *one, const char *other, std::size_t size) noexcept {
  std::size_t at = 0;
  while (at + kWord <= size && wordAt(one + at) == wordAt(other + at)) {
    at += kWord;
  }
  while (at < size && one[at] == other[at]) {
    ++at;
  }
  return at;
}

// An empty folder is a part of the text, too, because memcmp(3) must not get a null pointer.
std::string_view folderOf(std::string_view text) noexcept {
  const void *const slash = ::memrchr(text.data(), '/', text.size());
  const char *const end = slash == nullptr ? text.data() : static_cast<const char *>(slash) + 1;
  return text.substr(0, static_cast<std::size_t>(end - text.data()));
}

Trail &trailOf(std::uint64_t id, Trails &all) noexcept {
  for (std::size_t i = 0; i < kTrails; ++i) {
    if (all.ids[i] == id) {
      return all.trails[i];
    }
  }
  const std::size_t oldest = all.oldest;
  all.oldest = (oldest + 1) % kTrails;
  all.ids[oldest] = id;
  all.trails[oldest] = Trail();
  return all.trails[oldest];
}

} // namespace

Trail &Trail::turnedTo(std::string_view text, std::uint64_t id) noexcept {
  Trails &all = ofThread;
  Trail &trail = trailOf(id, all);
  const std::string_view folder = folderOf(text);
  if (trail.isAt(folder)) {
    return trail;
  }
  if (trail.isNear(folder) || trail.isExpected(folder)) {
    trail.turn(folder);
    return trail;
  }
  all.none.clear();
  return all.none;
}

bool Trail::isAt(std::string_view folder) const noexcept {
  return folder.size() == size_ && std::memcmp(folder.data(), folder_.data(), size_) == 0;
}

bool Trail::isNear(std::string_view folder) const noexcept {
  const std::size_t half = std::max(folder.size(), size_) / 2;
  return half <= std::min(folder.size(), size_) &&
         std::memcmp(folder.data(), folder_.data(), half) == 0;
}

// Whether the last text that was not near was in that folder, too.
bool Trail::isExpected(std::string_view folder) noexcept {
  const std::size_t size = folder.size();
  const std::uint64_t hash = size < kWord ? size : wordAt(folder.data() + size - kWord) + size;
  const bool same = hash == lastFolder_;
  lastFolder_ = hash;
  return same;
}

void Trail::turn(std::string_view folder) noexcept {
  const std::size_t common =
      commonSize(folder.data(), folder_.data(), std::min(folder.size(), size_));
  settled_ = settled_ && settledAt_ <= common;
  while (stepsSize_ > 0 && steps_[stepsSize_ - 1].end > common) {
    --stepsSize_;
  }
  ended_ = false;
  // Whether an infix can begin at a place depends on the bytes that the filter looks at.
  ruledOut_ = std::min(ruledOut_, common - std::min(common, InfixFilter::kLookAhead - 1));
  std::memcpy(folder_.data() + common, folder.data() + common, folder.size() - common);
  size_ = folder.size();
}

} // namespace KOVA::PatternSearch
