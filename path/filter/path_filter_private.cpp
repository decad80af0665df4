#include "path/filter/path_filter_private.h"

#include <algorithm>
#include <array>
#include <cstring>
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

// rest is the pattern after the star. A result other than kNoMatch is final for the stars before
// this one, too, so stars do not multiply each other's work. The one exception is that a double
// star goes on where a single one met a "/".
int matchStar(const char *rest, const char *text) {
  const bool crossesSlash = *rest == '*';
  if (crossesSlash) {
    rest += std::strspn(rest, "*");
    if (*rest == '\0') {
      return kMatch;
    }
  } else if (*rest == '\0') {
    return std::strchr(text, '/') == nullptr ? kMatch : kNoMatch;
  }
  for (; *text != '\0'; ++text) {
    const int result = PathFilterPrivate::match(rest, text);
    if (result == kNoMatch) {
      if (!crossesSlash && *text == '/') {
        return kSlashInTheWay;
      }
    } else if (!crossesSlash || result != kSlashInTheWay) {
      return result;
    }
  }
  return kTextRanOut;
}

// The places of the base from which each single star of a pattern may still succeed.
//
// Unlike matchStar, fromStar goes on after kSlashInTheWay, past a "/" as well. Nested stars would
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
  Rebase(const char *base, std::string &rest) : untried_(base), rest_(rest) {}

  int from(const char *pattern, const char *base, std::size_t star);

private:
  int fromStar(const char *pattern, const char *base, std::size_t star);
  int leave(std::string rest);

  Untried untried_;
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
    return std::strchr(base, '/') == nullptr ? leave("*") : kNoMatch;
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
      return matchStar(pattern + 1, text);
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
