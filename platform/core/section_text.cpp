#include "platform/core/section_text.h"

#include "base/trim.h"

#include <unordered_map>
#include <utility>

namespace KovaPlatform {
namespace {

using KOVA::Base::kWhiteSpace;
using KOVA::Base::trim;

constexpr std::string_view kLineEnds = "\n\r";

bool holdsAny(std::string_view text, std::string_view characters) {
  return text.find_first_of(characters) != std::string_view::npos;
}

// Takes the first line, with its line end, off the text; empty when the text is.
std::string_view takeLine(std::string_view &text) {
  const std::size_t end = text.find('\n');
  const std::string_view line = text.substr(0, end == std::string_view::npos ? end : end + 1);
  text.remove_prefix(line.size());
  return line;
}

bool beginsWithBracket(std::string_view line) {
  const std::size_t first = line.find_first_not_of(kWhiteSpace);
  return first != std::string_view::npos && line[first] == '[';
}

bool isHeader(std::string_view trimmed) {
  return trimmed.size() >= 2 && trimmed.front() == '[' && trimmed.back() == ']';
}

std::string_view nameIn(std::string_view trimmedHeader) {
  return trimmedHeader.substr(1, trimmedHeader.size() - 2);
}

// The trimmed key of a line that holds an option; null data when it holds none.
std::string_view optionKey(std::string_view line) {
  const std::size_t equals = line.find('=');
  if (equals == std::string_view::npos) {
    return {};
  }
  const std::string_view key = trim(line.substr(0, equals));
  if (key.empty()) {
    return line.substr(0, 0); // an option whose key is empty
  }
  return key.front() == '#' ? std::string_view() : key;
}

bool endsWith(std::string_view text, std::string_view end) {
  return text.size() >= end.size() && text.substr(text.size() - end.size()) == end;
}

// The line end that a text uses, by its first line.
std::string_view lineEndOf(std::string_view text) {
  return endsWith(takeLine(text), "\r\n") ? "\r\n" : "\n";
}

void append(std::string &out, const KLIBCSzHash::Pair &pair, std::string_view lineEnd) {
  out.append(pair.key).append("=").append(pair.value).append(lineEnd);
}

// The lines of a section that are no options, by what becomes of them.
struct KeptLines {
  std::string top;
  std::unordered_map<const KLIBCSzHash::Pair *, std::string> above;
  std::string bottom;
};

KeptLines keptLines(std::string_view body, const KLIBCSzHash &pairs) {
  KeptLines kept;
  std::string pending;
  bool first = true;
  while (!body.empty()) {
    const std::string_view line = takeLine(body);
    const std::string_view key = optionKey(line);
    if (key.data() == nullptr) {
      pending.append(line);
      continue;
    }
    if (std::exchange(first, false)) {
      kept.top = std::exchange(pending, {});
    }
    const auto stays = pairs.index.find(key);
    if (stays != pairs.index.end()) {
      kept.above[stays->second].append(std::exchange(pending, {}));
    }
  }
  kept.bottom = std::move(pending);
  return kept;
}

} // namespace

bool isStorableKey(std::string_view key) {
  return isStorableSectionName(key) && !holdsAny(key, "=") && key.front() != '#' &&
         key.front() != '[';
}

bool isStorableValue(std::string_view value) {
  return !holdsAny(value, kLineEnds);
}

bool isStorableSectionName(std::string_view name) {
  return !name.empty() && trim(name).size() == name.size() && !holdsAny(name, kLineEnds);
}

std::vector<std::string_view> sectionNames(std::string_view text) {
  std::vector<std::string_view> names;
  while (!text.empty()) {
    const std::string_view line = takeLine(text);
    if (!beginsWithBracket(line)) {
      continue;
    }
    const std::string_view trimmed = trim(line);
    if (isHeader(trimmed) && nameIn(trimmed).find('\0') == std::string_view::npos) {
      names.push_back(nameIn(trimmed));
    }
  }
  return names;
}

SectionParts findSection(std::string_view text, std::string_view name) {
  SectionParts parts;
  std::string_view rest = text;
  while (!rest.empty()) {
    const std::string_view line = takeLine(rest);
    if (!beginsWithBracket(line)) {
      continue;
    }
    const std::size_t lineBegin = static_cast<std::size_t>(line.data() - text.data());
    if (parts.found) {
      parts.after = text.substr(lineBegin);
      break;
    }
    const std::string_view trimmed = trim(line);
    if (trimmed.size() == name.size() + 2 && nameIn(trimmed) == name) {
      parts.found = isHeader(trimmed);
      parts.hidden = parts.hidden || !parts.found;
      parts.before = text.substr(0, lineBegin);
      parts.header = line;
    }
  }
  if (!parts.found) {
    parts.before = text;
    parts.header = {};
    return parts;
  }
  const std::size_t bodyBegin = parts.before.size() + parts.header.size();
  parts.body = text.substr(bodyBegin, text.size() - bodyBegin - parts.after.size());
  return parts;
}

// Every line that is no option stays. Those above the first option and those below the last keep
// their places; those between go with the next option below them that stays, since a comment
// mostly tells of what follows it.
std::string rewriteSection(std::string_view text, const SectionParts &parts,
                           const KLIBCSzHash &pairs) {
  const bool open = !endsWith(parts.header, "\n"); // the header ends the file
  const std::string_view lineEnd = lineEndOf(open ? text : parts.header);
  const KeptLines kept = keptLines(parts.body, pairs);
  std::string out(parts.header);
  if (open && !pairs.pairs.empty()) {
    out.append(lineEnd);
  }
  out.append(kept.top);
  for (const KLIBCSzHash::Pair &pair : pairs.pairs) {
    const auto above = kept.above.find(&pair);
    if (above != kept.above.end()) {
      out.append(above->second);
    }
    append(out, pair, lineEnd);
  }
  return out.append(kept.bottom);
}

std::string newSection(std::string_view text, std::string_view name, const KLIBCSzHash &pairs) {
  const std::string_view lineEnd = lineEndOf(text);
  std::string out;
  if (!text.empty() && !endsWith(text, "\n")) {
    out.append(lineEnd); // else the header would be glued to the last line
  }
  out.append("[").append(name).append("]").append(lineEnd);
  for (const KLIBCSzHash::Pair &pair : pairs.pairs) {
    append(out, pair, lineEnd);
  }
  return out;
}

} // namespace KovaPlatform
