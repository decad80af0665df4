#ifndef KOVABACKUP_TOOLS_TEXT_H
#define KOVABACKUP_TOOLS_TEXT_H

/// @file Text for people: names made safe for a terminal, sizes, ages, near misses.

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// Length of the UTF-8 sequence that begins at a byte of text; 0 when none does there.
std::size_t utf8Length(const std::string &text, std::size_t position);

/// Control characters and bytes that are no UTF-8 as \n, \t or \xNN, the rest unchanged: a file
/// name must not be able to move the cursor or paint a line of its own. With Lines::Keep line ends
/// and tabs stay: for text of several lines.
enum class Lines { Escape, Keep };
std::string escapeControls(const std::string &text, Lines lines = Lines::Escape);

/// The name of a file as messages show it: an empty one in quotes, lest nothing be seen.
std::string shownFile(const std::string &file);

/// The text of an errno; where only the user stands in the way, what to do about it.
std::string reason(int error);

/// Text of more than some lines' length with its middle left out: what was typed, or read, may be
/// of any size, and the reason stands at the end.
std::string shortened(const std::string &text);

/// Columns that text takes on a terminal, as the LC_CTYPE of the process has it: a wide character
/// takes two, a combining one none. A character that the locale does not know counts as one.
std::size_t columns(const std::string &text);

/// "512 B", "1.4 MiB".
std::string humanBytes(std::uint64_t bytes);

/// "12s", "3m 4s", "2h 5m", "9d 3h". Ages in the future count as 0.
std::string humanAge(std::chrono::seconds age);

/// Reads "90s", "15m", "36h", "7d" or "2w"; nothing for any other text.
std::optional<std::chrono::seconds> parseAge(const std::string &text);

/// Reads a whole decimal number within limits; nothing for any other text.
std::optional<long long> parseNumber(const std::string &text, long long least, long long most);

/// The candidate that a mistyped word most likely meant; "" when none is near.
std::string nearest(const std::string &word, const std::vector<std::string> &candidates);

} // namespace KOVA::Backup::Tool

#endif
