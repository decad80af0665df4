#ifndef KOVABACKUP_TESTS_SERVICE_TREE_WALK_RULES_H
#define KOVABACKUP_TESTS_SERVICE_TREE_WALK_RULES_H

/// @file What the walk must know about single patterns, decided without any index.

#include <string>

namespace KovaTest {

/// Whether a pattern matches a text that begins with text.
inline bool reaches(const char *pattern, const char *text) {
  const bool isEscape = *pattern == '\\';
  if (isEscape && pattern[1] == '\0') {
    return false;
  }
  if (*pattern == '\0' || (*text == '\0' && !isEscape && *pattern == '*')) {
    return *text == '\0' && (*pattern == '\0' || reaches(pattern + 1, text));
  }
  if (*text == '\0') {
    return reaches(pattern + (isEscape ? 2 : 1), text);
  }
  if (*pattern == '*') {
    const bool crosses = pattern[1] == '*';
    return reaches(pattern + (crosses ? 2 : 1), text) ||
           ((crosses || *text != '/') && reaches(pattern, text + 1));
  }
  if (*pattern == '?') {
    return *text != '/' && reaches(pattern + 1, text + 1);
  }
  pattern += isEscape ? 1 : 0;
  return *pattern == *text && reaches(pattern + 1, text + 1);
}

/// Whether a pattern ends in "**" that is not escaped.
inline bool endsInDoubleStar(const std::string &pattern) {
  std::string elements = "xx";
  for (auto at = pattern.begin(); at != pattern.end(); ++at) {
    const bool isEscape = *at == '\\' && at + 1 != pattern.end();
    elements += isEscape ? 'x' : *at;
    at += isEscape ? 1 : 0;
  }
  return elements.compare(elements.size() - 2, 2, "**") == 0;
}

} // namespace KovaTest

#endif
