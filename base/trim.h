#ifndef KOVA_BASE_TRIM_H
#define KOVA_BASE_TRIM_H

/// @file The white space of section files, which does not count at either end of lines, keys and
/// values.

#include <string_view>

namespace KOVA::Base {

/// These four characters and no others: vertical tab and form feed are text.
inline constexpr std::string_view kWhiteSpace = " \t\n\r";

/// The text without leading and trailing white space.
inline std::string_view trim(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kWhiteSpace);
  if (first == std::string_view::npos) {
    return {};
  }
  return text.substr(first, text.find_last_not_of(kWhiteSpace) - first + 1);
}

} // namespace KOVA::Base

#endif
