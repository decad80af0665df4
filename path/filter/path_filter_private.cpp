#include "path/filter/path_filter_private.h"

#include "path/filter/state_word.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup {
namespace {

constexpr int kMatch = 1;
constexpr int kNoMatch = 0;
constexpr int kTextRanOut = -1;
constexpr int kSlashInTheWay = -2;

// Consumes the next element of a pattern, which is neither a star nor the end.
// Returns: whether the element matches c. A "\" at the very end consumes the terminating NUL, which
// never equals a byte of a text.
bool takesByte(const char *&pattern, char c) {
  if (*pattern == '?') {
    ++pattern;
    return c != '/';
  }
  if (*pattern == '\\') {
    ++pattern;
  }
  return *pattern++ == c;
}

// Whether elements without stars match the end of a text.
// Returns: no value when there is a star among them.
std::optional<bool> matchesEnd(const char *elements, const char *text) {
  std::size_t size = 0;
  for (const char *at = elements; *at != '\0'; ++at, ++size) {
    if (*at == '*') {
      return std::nullopt;
    }
    at += at[0] == '\\' && at[1] != '\0' ? 1 : 0;
  }
  const std::size_t textSize = std::strlen(text);
  if (textSize < size) {
    return false;
  }
  for (text += textSize - size; *text != '\0'; ++text) {
    if (!takesByte(elements, *text)) {
      return false;
    }
  }
  return true;
}

// pattern begins with a star. The set of states at the end of the text tells the results apart: a
// double star that was reached stays for good, so nothing but a "/" in front of a single star can
// have emptied it.
int matchStar(const char *pattern, const char *text) {
  const std::size_t stars = std::strspn(pattern, "*");
  const char *const rest = pattern + stars;
  if (*rest == '\0') {
    return stars > 1 || std::strchr(text, '/') == nullptr ? kMatch : kNoMatch;
  }
  if (stars > 1) {
    const std::optional<bool> matches = matchesEnd(rest, text);
    if (matches.has_value()) {
      return *matches ? kMatch : kTextRanOut;
    }
  }
  switch (PatternSearch::compare(pattern, text)) {
  case PatternSearch::Outcome::matched:
    return kMatch;
  case PatternSearch::Outcome::alive:
    return kTextRanOut;
  default:
    return kSlashInTheWay;
  }
}

// The places of the base from which each single star of a pattern may still succeed.
//
// Unlike match, fromStar goes on after kSlashInTheWay, past a "/" as well. Nested stars would
// therefore try every combination of places: six of them on a hundred equal bytes would take hours.
// But a star that failed from one place up to the "/" that stopped it also fails from every place
// in between. With that stretch skipped, the places from which a star is tried only ever grow: the
// first star is tried once, and each further star only from after the place of the star before it.
// So one place per star records all that is known, and no place is tried twice.
class Untried {
public:
  explicit Untried(const char *base) : base_(base) { few_.fill(base); }

  // The first place from which the star is not yet known to fail.
  const char *&of(std::size_t star) {
    if (star < few_.size()) {
      return few_[star];
    }
    more_.resize(std::max(more_.size(), star - few_.size() + 1), base_);
    return more_[star - few_.size()];
  }

private:
  const char *base_;
  std::array<const char *, 16> few_; // ordinary patterns need no allocation
  std::vector<const char *> more_;
};

// One run of rebase. Pattern, base and the number of the next star change with the recursion.
class Rebase {
public:
  Rebase(const char *base, std::string &rest)
      : untried_(base), lastSlash_(std::strrchr(base, '/')), rest_(rest) {}

  int from(const char *pattern, const char *base, std::size_t star);

private:
  int fromStar(const char *pattern, const char *base, std::size_t star);
  int leave(std::string rest);

  Untried untried_;
  const char *lastSlash_; // nullptr if there is none
  std::string &rest_;
};

int Rebase::leave(std::string rest) {
  rest_.swap(rest);
  return kMatch;
}

int Rebase::from(const char *pattern, const char *base, std::size_t star) {
  for (; *pattern != '\0'; ++base) {
    if (*pattern == '*') {
      return fromStar(pattern + 1, base, star);
    }
    if (*base == '\0') {
      return *pattern == '/' ? leave(pattern) : kNoMatch;
    }
    if (!takesByte(pattern, *base)) {
      return kNoMatch;
    }
  }
  return *base == '\0' ? leave("") : kNoMatch;
}

// pattern is the pattern after the star.
int Rebase::fromStar(const char *pattern, const char *base, std::size_t star) {
  if (*pattern == '*') {
    const char *const afterStars = pattern + std::strspn(pattern, "*");
    return leave(std::string("/").append(afterStars - 2)); // the double star stays
  }
  if (*pattern == '\0') {
    return lastSlash_ == nullptr || base > lastSlash_ ? leave("*") : kNoMatch;
  }
  if (base < untried_.of(star)) {
    return kSlashInTheWay;
  }
  for (; *base != '\0'; ++base) {
    const int result = from(pattern, base, star + 1);
    if (result != kNoMatch && result != kSlashInTheWay) {
      return result;
    }
    if (result == kNoMatch && *base == '/') {
      untried_.of(star) = base + 1;
      return kSlashInTheWay;
    }
  }
  return leave(pattern);
}

} // namespace

int PathFilterPrivate::match(const char *pattern, const char *text) {
  while (*pattern != '\0') {
    if (*pattern == '*') {
      return matchStar(pattern, text);
    }
    if (*text == '\0') {
      return kTextRanOut;
    }
    if (!takesByte(pattern, *text)) {
      return kNoMatch;
    }
    ++text;
  }
  return *text == '\0' ? kMatch : kNoMatch;
}

int PathFilterPrivate::rebase(const char *pattern, const char *base, std::string &rest) {
  return Rebase(base, rest).from(pattern, base, 0);
}

} // namespace KOVA::Backup
