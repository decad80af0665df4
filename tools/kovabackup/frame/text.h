#ifndef KOVABACKUP_TOOLS_TEXT_H
#define KOVABACKUP_TOOLS_TEXT_H

/// @file Text for people: names made safe for a terminal, sizes, ages, similar words.

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// The length in bytes of the UTF-8 sequence that begins at position, which must lie within text; 0
/// when no valid sequence begins there.
std::size_t utf8Length(const std::string &text, std::size_t position);

/// Whether escapeControls also escapes line feeds and tabs. Keep is for text of several lines.
enum class Lines { Escape, Keep };

/// Whether the UTF-8 sequence of that length at position is one that a terminal obeys instead of
/// showing it: a control character, a line separator, or one that changes the direction of text.
bool isControl(const std::string &text, std::size_t position, std::size_t length);

/// Writes control characters (isControl) and bytes that are not valid UTF-8 as \n, \t or \xNN, so
/// that a file name cannot move the cursor, forge a line or reverse what follows it. The rest,
/// backslashes included, is unchanged, so the result cannot be converted back.
std::string escapeControls(const std::string &text, Lines lines = Lines::Escape);

/// A file name for a message: '' for an empty one, which would otherwise be invisible.
std::string shownFile(const std::string &file);

/// The text of an errno value. For EACCES and EPERM advice to try as root follows, unless the user
/// is root.
std::string reason(int error);

/// The text without the advice, for messages that give it in another place.
std::string reasonAlone(int error);
/// Whether root may succeed where this user got that errno value.
bool mayHelpAsRoot(int error);

/// Leaves out the middle of a very long message. A message may quote input of any size; its end is
/// kept because it says why the command failed.
std::string shortened(const std::string &text);

/// The number of columns that text takes on a terminal, according to LC_CTYPE: two for a wide
/// character, none for a combining one, one for a character that the locale does not know.
std::size_t columns(const std::string &text);

/// The columns of the terminal on a descriptor, as they are now; 80 when they are unknown.
std::size_t terminalColumns(int fd);

/// Breaks text into lines that end at most in that column, at its spaces. The first line begins in
/// the column indent; those after it are indented. A word that is longer than a line is not broken.
/// With 0 as the width no line is broken.
std::string wrapped(const std::string &text, std::size_t indent, std::size_t width);

/// "512 B", "1.4 MiB".
std::string humanBytes(std::uint64_t bytes);

/// "12s", "3m 4s", "2h 5m", "9d 3h". A negative age counts as 0.
std::string humanAge(std::chrono::seconds age);

/// Reads a number and a unit, such as "90s", "15m", "36h", "7d" or "2w".
/// Returns: nullopt for any other text, and for a number that is too large.
std::optional<std::chrono::seconds> parseAge(const std::string &text);

/// Reads a decimal integer from min to max, both included. Returns: nullopt for any other text.
std::optional<long long> parseNumber(const std::string &text, long long min, long long max);

/// The candidate that a mistyped word most likely means; "" when none is similar.
std::string nearest(const std::string &word, const std::vector<std::string> &candidates);

} // namespace KOVA::Backup::Tool

#endif
