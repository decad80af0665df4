#ifndef KOVA_BASE_SECTION_GRAMMAR_H
#define KOVA_BASE_SECTION_GRAMMAR_H

/// @file The grammar of section files: what a line means, and what a line can hold.
///
///     [task12]            header: begins the section "task12"
///     # nightly           comment
///     retries = 3         option with the key "retries" and the value "3"
///     [task12x            broken header: ends the section above it, begins none
///
///     while (!text.empty()) {
///       const SectionGrammar::Line line = SectionGrammar::parse(SectionGrammar::takeLine(text));
///       if (line.kind == SectionGrammar::LineKind::Option) use(line.key, line.value);
///     }
///
/// Every reader and writer of section files uses this one grammar. They differ on purpose in three
/// points:
/// - The loader of option maps, and the command with it, takes a broken header for the header of a
///   section (isTakenForHeaderOf). The services that list and change sections require the ']'.
/// - A NUL within a name makes it another name for C callers (holdsNul), so the services do not
///   list such a section. The loader compares the name byte by byte.
/// - The configuration is strict: it refuses a broken header, a line of the kind Other and an
/// option
///   with a NUL, all of which the others pass over.
///
/// Failure: none; every line has a kind.
/// Owns:    nothing; results are views into the text that was passed.
/// Threads: any.

#include <string_view>

namespace KOVA::Base::SectionGrammar {

enum class LineKind {
  Blank,        ///< nothing but white space
  Comment,      ///< begins with '#', with or without a '='
  Header,       ///< "[" name "]"; the name may be empty, and ']' may be part of it
  BrokenHeader, ///< begins with '[' and does not end with ']'
  Option,       ///< key "=" value, split at the first '='; the key may be empty
  Other         ///< any other text
};

struct Line {
  LineKind kind = LineKind::Blank;
  std::string_view text;  ///< the complete line, trimmed
  std::string_view name;  ///< of a header: all between the brackets, not trimmed
  std::string_view key;   ///< of an option: trimmed
  std::string_view value; ///< of an option: trimmed

  /// Whether the section above ends here. A broken header ends it too: its author meant to begin
  /// another section, whose options must not be read as those of the section above.
  bool endsSection() const { return kind == LineKind::Header || kind == LineKind::BrokenHeader; }
};

/// Removes the first line from text. Returns: the line with its line feed, if it has one; an empty
/// view when text is empty.
std::string_view takeLine(std::string_view &text);

/// Finds the first line that ends a section without looking at the bytes between. text must begin
/// where a line begins. name: only a line in which these bytes follow the '[' is wanted.
/// Returns: the offset of the line's '['; npos when there is no such line.
std::size_t findHeader(std::string_view text, std::string_view name = {});

/// Removes from text all lines in front of that one, so that text begins with it or is empty.
/// Returns: what was removed.
std::string_view takeUntilHeader(std::string_view &text, std::string_view name = {});

/// Parses one line, with or without its line end.
Line parse(std::string_view line);

/// Whether the loader takes the line for the header of the section: '[', the name and one more
/// character, which it deliberately does not examine. "[task12x" begins the section "task12" too.
bool isTakenForHeaderOf(const Line &line, std::string_view name);

/// Whether C callers, for whom a string ends at its first NUL, would see another text.
bool holdsNul(std::string_view text);

/// Whether the text has neither leading nor trailing white space.
bool isTrimmed(std::string_view text);

/// Whether a reader would find an option of this key again: it is trimmed and not empty, contains
/// neither '=' nor a line end, and begins with neither '#' nor '['.
bool isStorableKey(std::string_view key);

/// Whether the value stays on its line: it contains no line end. White space around it is allowed,
/// although readers trim it.
bool isStorableValue(std::string_view value);

/// Whether readers and people would find a section of this name again: it is not empty, contains no
/// line end, and is trimmed. Readers compare outer white space, which people do not see.
bool isStorableSectionName(std::string_view name);

} // namespace KOVA::Base::SectionGrammar

#endif
