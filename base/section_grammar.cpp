#include "base/section_grammar.h"

#include "base/trim.h"

namespace KOVA::Base::SectionGrammar {
namespace {

// Readers end a line at the line feed only. A carriage return would still end it in an editor.
bool holdsLineEnd(std::string_view text) {
  return text.find_first_of("\n\r") != std::string_view::npos;
}

LineKind kindOf(std::string_view trimmed) {
  if (trimmed.empty()) {
    return LineKind::Blank;
  }
  switch (trimmed.front()) {
  case '#':
    return LineKind::Comment;
  case '[':
    return trimmed.back() == ']' ? LineKind::Header : LineKind::BrokenHeader;
  default:
    return trimmed.find('=') == std::string_view::npos ? LineKind::Other : LineKind::Option;
  }
}

// Whether only white space precedes the character at an offset in its line.
bool beginsLine(std::string_view text, std::size_t at) {
  while (at > 0 && text[at - 1] != '\n' && isWhiteSpace(text[at - 1])) {
    --at;
  }
  return at == 0 || text[at - 1] == '\n';
}

} // namespace

std::size_t findHeader(std::string_view text, std::string_view name) {
  std::size_t at = text.find('[');
  while (at != std::string_view::npos &&
         (!beginsLine(text, at) || text.compare(at + 1, name.size(), name) != 0)) {
    at = text.find('[', at + 1);
  }
  return at;
}

std::string_view takeUntilHeader(std::string_view &text, std::string_view name) {
  const std::size_t header = findHeader(text, name);
  const bool isThere = header != std::string_view::npos;
  const std::string_view taken =
      text.substr(0, isThere ? text.rfind('\n', header) + 1 : text.size());
  text.remove_prefix(taken.size());
  return taken;
}

std::string_view takeLine(std::string_view &text) {
  const std::size_t end = text.find('\n');
  const std::string_view line = text.substr(0, end == std::string_view::npos ? end : end + 1);
  text.remove_prefix(line.size());
  return line;
}

Line parse(std::string_view line) {
  Line parsed;
  parsed.text = trim(line);
  parsed.kind = kindOf(parsed.text);
  if (parsed.kind == LineKind::Header) {
    parsed.name = parsed.text.substr(1, parsed.text.size() - 2);
  }
  if (parsed.kind == LineKind::Option) {
    const std::size_t equals = parsed.text.find('=');
    parsed.key = trim(parsed.text.substr(0, equals));
    parsed.value = trim(parsed.text.substr(equals + 1));
  }
  return parsed;
}

bool isTakenForHeaderOf(const Line &line, std::string_view name) {
  return line.endsSection() && line.text.size() == name.size() + 2 &&
         line.text.substr(1, name.size()) == name;
}

bool holdsNul(std::string_view text) {
  return text.find('\0') != std::string_view::npos;
}

bool isTrimmed(std::string_view text) {
  return trim(text).size() == text.size();
}

bool isStorableKey(std::string_view key) {
  return isStorableSectionName(key) && key.find('=') == std::string_view::npos &&
         key.front() != '#' && key.front() != '[';
}

bool isStorableValue(std::string_view value) {
  return !holdsLineEnd(value);
}

bool isStorableSectionName(std::string_view name) {
  return !name.empty() && isTrimmed(name) && !holdsLineEnd(name);
}

} // namespace KOVA::Base::SectionGrammar
