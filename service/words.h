#ifndef KOVABACKUP_SERVICE_WORDS_H
#define KOVABACKUP_SERVICE_WORDS_H

/// @file Splits the lines that the kernel writes in /proc. Without streams, which would take a lack
/// of memory for the end of the text.

#include <algorithm>
#include <charconv>
#include <string_view>

namespace KOVA::Backup::Service {

/// Removes the first line from text. Returns: the line without its line feed.
inline std::string_view takeLine(std::string_view &text) {
  const std::string_view line = text.substr(0, text.find('\n'));
  text.remove_prefix(std::min(line.size() + 1, text.size()));
  return line;
}

/// Removes the first word from line, with the spaces before it. Returns: the word, "" at the end.
inline std::string_view takeWord(std::string_view &line) {
  line.remove_prefix(std::min(line.find_first_not_of(' '), line.size()));
  const std::string_view word = line.substr(0, line.find(' '));
  line.remove_prefix(word.size());
  return word;
}

/// Reads a decimal integer. Returns: false, with out untouched, unless the complete word is one
/// that fits.
template <typename Integer>
bool parseInteger(std::string_view word, Integer &out) {
  Integer value = 0;
  const auto [end, error] = std::from_chars(word.data(), word.data() + word.size(), value);
  if (error != std::errc() || end != word.data() + word.size()) {
    return false;
  }
  out = value;
  return true;
}

} // namespace KOVA::Backup::Service

#endif
