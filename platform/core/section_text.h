#ifndef KOVAPLATFORM_CORE_SECTION_TEXT_H
#define KOVAPLATFORM_CORE_SECTION_TEXT_H

/// @file The text of section files, without the files: what is a header, an option, a name that
/// can be written and read back.

#include <string_view>

namespace KOVA::Platform {

/// The text without blanks (space, tab, line feed, carriage return and no others) at its ends.
std::string_view trim(std::string_view text);

/// Whether a reader would find the key again: not empty, no blank at an end, no '=' and no line
/// end in it, neither '#' nor '[' at its begin.
bool isStorableKey(std::string_view key);

/// Whether the value stays on its line: no line feed and no carriage return in it.
bool isStorableValue(std::string_view value);

/// Whether a reader would find the section again: not empty, no blank at an end, no line end.
bool isStorableSectionName(std::string_view name);

} // namespace KOVA::Platform

#endif
