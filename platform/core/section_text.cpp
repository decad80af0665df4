#include "platform/core/section_text.h"

#include "base/section_grammar.h"

#include <unordered_map>
#include <utility>

namespace KovaPlatform {
namespace {

using namespace KOVA::Base::SectionGrammar;
using KOVA::Base::SectionReader;

bool endsWith(std::string_view text, std::string_view end) {
  return text.size() >= end.size() && text.substr(text.size() - end.size()) == end;
}

// The line end of a text: that of its first line.
std::string_view lineEndOf(std::string_view text) {
  return endsWith(takeLine(text), "\r\n") ? "\r\n" : "\n";
}

void append(std::string &out, const KLIBCSzHash::Pair &pair, std::string_view lineEnd) {
  out.append(pair.key).append("=").append(pair.value).append(lineEnd);
}

// The lines of a section that are not options, by their place in the new text.
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
    const std::string_view text = takeLine(body);
    const Line line = parse(text);
    if (line.kind != LineKind::Option) {
      pending.append(text);
      continue;
    }
    if (std::exchange(first, false)) {
      kept.top = std::exchange(pending, {});
    }
    const auto stays = pairs.index.find(line.key);
    if (stays != pairs.index.end()) {
      kept.above[stays->second].append(std::exchange(pending, {}));
    }
  }
  kept.bottom = std::move(pending);
  return kept;
}

} // namespace

bool readNames(SectionReader &file, std::vector<std::string> &names) {
  std::string_view text;
  SectionReader::Read read = file.nextHeader(text);
  while (read == SectionReader::Read::Line) {
    const Line line = parse(text);
    if (line.kind == LineKind::Header && !holdsNul(line.name)) {
      names.emplace_back(line.name);
    }
    read = file.nextHeader(text);
  }
  return read == SectionReader::Read::End;
}

SectionParts findSection(std::string_view text, std::string_view name) {
  SectionParts parts;
  std::string_view rest = text;
  while (!parts.found) {
    (void)takeUntilHeader(rest, name);
    if (rest.empty()) {
      return {false, parts.hidden, text, {}, {}, {}};
    }
    parts.before = text.substr(0, text.size() - rest.size());
    parts.header = takeLine(rest);
    const Line line = parse(parts.header);
    const bool isTaken = isTakenForHeaderOf(line, name);
    parts.found = isTaken && line.kind == LineKind::Header;
    parts.hidden = parts.hidden || (isTaken && !parts.found);
  }
  parts.body = takeUntilHeader(rest);
  parts.after = rest;
  return parts;
}

// Every line that is not an option stays. Lines above the first option and below the last one keep
// their places. A line between options moves with the next option below it that stays, because a
// comment usually describes what follows it.
std::string rewriteSection(std::string_view text, const SectionParts &parts,
                           const KLIBCSzHash &pairs) {
  const bool open = !endsWith(parts.header, "\n"); // a last line without its line end
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
    out.append(lineEnd); // otherwise the header would be glued to the last line
  }
  out.append("[").append(name).append("]").append(lineEnd);
  for (const KLIBCSzHash::Pair &pair : pairs.pairs) {
    append(out, pair, lineEnd);
  }
  return out;
}

} // namespace KovaPlatform
