#ifndef KOVA_BASE_TRIM_H
#define KOVA_BASE_TRIM_H

/// @file The white space of section files, which does not count at either end of lines, keys and
/// values.

#include <string_view>

namespace KOVA::Base {

/// These four characters and no others: vertical tab and form feed are text.
constexpr bool isWhiteSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

/// The text without leading and trailing white space.
constexpr std::string_view trim(std::string_view text) {
  while (!text.empty() && isWhiteSpace(text.front())) {
    text.remove_prefix(1);
  }
  while (!text.empty() && isWhiteSpace(text.back())) {
    text.remove_suffix(1);
  }
  return text;
}

} // namespace KOVA::Base

#endif
