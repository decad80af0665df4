#ifndef KOVABACKUP_TESTS_PATH_FILTER_ORACLE_H
#define KOVABACKUP_TESTS_PATH_FILTER_ORACLE_H

/// @file The slow oracles of the path filter. They share no code with it.
///
/// match and rebase follow the rules step by step; covers decides from a table of all positions,
/// without any search, whether a pattern matches a text; filterOut walks both lists.

#include <list>
#include <string>
#include <string_view>
#include <vector>

namespace KovaTest::Oracle {

inline char byteAt(std::string_view text, std::size_t at) {
  return at < text.size() ? text[at] : '\0';
}

inline std::size_t behindStars(std::string_view pattern, std::size_t at) {
  while (byteAt(pattern, at) == '*') {
    ++at;
  }
  return at;
}

inline int match(std::string_view pattern, std::string_view text);

inline int matchFromStar(std::string_view pattern, std::size_t p, std::string_view text) {
  std::size_t q = p + 1;
  bool mayCross = false;
  if (byteAt(pattern, q) == '*') {
    q = behindStars(pattern, q);
    if (q == pattern.size()) {
      return 1;
    }
    mayCross = true;
  } else if (q == pattern.size()) {
    return text.find('/') == std::string_view::npos ? 1 : 0;
  }
  for (std::size_t t = 0; t < text.size(); ++t) {
    const int r = match(pattern.substr(q), text.substr(t));
    if (r == 0 && !mayCross && text[t] == '/') {
      return -2;
    }
    if (r != 0 && !(mayCross && r == -2)) {
      return r;
    }
  }
  return -1;
}

inline int match(std::string_view pattern, std::string_view text) {
  if (pattern.empty()) {
    return text.empty() ? 1 : 0;
  }
  std::size_t p = 0;
  std::size_t t = 0;
  while (t < text.size()) {
    const char c = text[t];
    switch (pattern[p]) {
    case '?':
      if (c == '/') {
        return 0;
      }
      break;
    case '\\':
      ++p;
      if (byteAt(pattern, p) != c) {
        return 0;
      }
      break;
    case '*':
      return matchFromStar(pattern, p, text.substr(t));
    default:
      if (pattern[p] != c) {
        return 0;
      }
    }
    ++p;
    ++t;
    if (p == pattern.size()) {
      return t == text.size() ? 1 : 0;
    }
  }
  return pattern[p] == '*' ? matchFromStar(pattern, p, "") : -1;
}

inline int rebase(std::string_view pattern, std::string_view base, std::string &rest);

inline int rebaseFromStar(std::string_view pattern, std::size_t p, std::string_view base,
                          std::string &rest) {
  std::size_t q = p + 1;
  if (byteAt(pattern, q) == '*') {
    q = behindStars(pattern, q);
    rest = "/**" + std::string(pattern.substr(q));
    return 1;
  }
  if (q == pattern.size()) {
    if (base.find('/') != std::string_view::npos) {
      return 0;
    }
    rest = "*";
    return 1;
  }
  for (std::size_t b = 0; b < base.size(); ++b) {
    const int r = rebase(pattern.substr(q), base.substr(b), rest);
    if (r != 0 && r != -2) {
      return r;
    }
    if (r == 0 && base[b] == '/') {
      return -2;
    }
  }
  rest = std::string(pattern.substr(q));
  return 1;
}

inline int rebaseAtEnd(std::string_view base, std::string &rest) {
  if (!base.empty()) {
    return 0;
  }
  rest.clear();
  return 1;
}

inline int rebase(std::string_view pattern, std::string_view base, std::string &rest) {
  if (pattern.empty()) {
    return rebaseAtEnd(base, rest);
  }
  for (std::size_t p = 0, b = 0;;) {
    if (pattern[p] == '*') {
      return rebaseFromStar(pattern, p, base.substr(b), rest);
    }
    if (b == base.size()) {
      if (pattern[p] != '/') {
        return 0;
      }
      rest = std::string(pattern.substr(p));
      return 1;
    }
    if (pattern[p] == '?') {
      if (base[b] == '/') {
        return 0;
      }
    } else {
      if (pattern[p] == '\\') {
        ++p;
      }
      if (byteAt(pattern, p) != base[b]) {
        return 0;
      }
    }
    ++p;
    ++b;
    if (p == pattern.size()) {
      return rebaseAtEnd(base.substr(b), rest);
    }
  }
}

// One position further from every position where the element matches the next byte.
inline std::vector<bool> afterElement(const std::vector<bool> &places, std::string_view text,
                                      bool anyByte, char byte) {
  std::vector<bool> next(places.size());
  for (std::size_t t = 0; t < text.size(); ++t) {
    next[t + 1] = places[t] && (anyByte ? text[t] != '/' : text[t] == byte);
  }
  return next;
}

/// Whether a pattern matches a complete text. It computes, element by element, all positions of the
/// text that the elements so far can have reached.
inline bool covers(std::string_view pattern, std::string_view text) {
  std::vector<bool> places(text.size() + 1);
  places[0] = true;
  for (std::size_t p = 0; p < pattern.size(); ++p) {
    if (pattern[p] == '*') {
      const std::size_t behind = behindStars(pattern, p);
      for (std::size_t t = 0; t < text.size(); ++t) {
        if (places[t] && (behind - p > 1 || text[t] != '/')) {
          places[t + 1] = true;
        }
      }
      p = behind - 1;
    } else if (pattern[p] == '?') {
      places = afterElement(places, text, true, '\0');
    } else {
      if (pattern[p] == '\\' && ++p == pattern.size()) {
        return false;
      }
      places = afterElement(places, text, false, pattern[p]);
    }
  }
  return places[text.size()];
}

/// The plain walk over both lists.
inline bool filterOut(const std::list<std::string> &includes,
                      const std::list<std::string> &excludes, const std::string &path) {
  for (const std::string &pattern : includes) {
    if (match(pattern.c_str(), path.c_str()) == 1) {
      return false;
    }
  }
  for (const std::string &pattern : excludes) {
    if (match(pattern.c_str(), path.c_str()) == 1) {
      return true;
    }
  }
  return false;
}

} // namespace KovaTest::Oracle

#endif
