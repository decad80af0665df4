#ifndef KOVA_BASE_TRIM_H
#define KOVA_BASE_TRIM_H

/// @file The blanks of section files, which do not count at the ends of lines, keys and values.

#include <string_view>

namespace KOVA::Base {

/// These four and no others: vertical tab and form feed are text.
inline constexpr std::string_view kBlanks = " \t\n\r";

/// The text without blanks at its ends.
inline std::string_view trim(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) {
    return {};
  }
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

} // namespace KOVA::Base

#endif
