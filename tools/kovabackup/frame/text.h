#ifndef KOVABACKUP_TOOLS_TEXT_H
#define KOVABACKUP_TOOLS_TEXT_H

/// @file Text for people: names made safe for a terminal, sizes, ages, similar words.

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// Length of the UTF-8 sequence that begins at a position of text; 0 when none does.
std::size_t utf8Length(const std::string &text, std::size_t position);

/// Writes control characters and bytes that are not UTF-8 as \n, \t or \xNN and leaves the rest
/// unchanged: a file name must not be able to move the cursor or to forge a line. Lines::Keep
/// leaves line feeds and tabs unchanged, for text of several lines.
enum class Lines { Escape, Keep };
std::string escapeControls(const std::string &text, Lines lines = Lines::Escape);

/// The name of a file as messages show it: an empty one in quotes, so that it is visible.
std::string shownFile(const std::string &file);

/// The text of an errno, with advice where only the user id is the reason.
std::string reason(int error);

/// Leaves out the middle of a very long text. What was typed or read may have any size, and the
/// reason is at the end of a message.
std::string shortened(const std::string &text);

/// Columns that text takes on a terminal, as the LC_CTYPE of the process has it: a wide character
/// takes two, a combining one none. A character that the locale does not know counts as one.
std::size_t columns(const std::string &text);

/// "512 B", "1.4 MiB".
std::string humanBytes(std::uint64_t bytes);

/// "12s", "3m 4s", "2h 5m", "9d 3h". A negative age counts as 0.
std::string humanAge(std::chrono::seconds age);

/// Reads "90s", "15m", "36h", "7d" or "2w"; nothing for any other text.
std::optional<std::chrono::seconds> parseAge(const std::string &text);

/// Reads a decimal integer within limits; nothing for any other text.
std::optional<long long> parseNumber(const std::string &text, long long least, long long most);

/// The candidate that a mistyped word most likely means; "" when none is similar.
std::string nearest(const std::string &word, const std::vector<std::string> &candidates);

} // namespace KOVA::Backup::Tool

#endif
