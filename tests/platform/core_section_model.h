#ifndef KOVABACKUP_TESTS_PLATFORM_CORE_SECTION_MODEL_H
#define KOVABACKUP_TESTS_PLATFORM_CORE_SECTION_MODEL_H

/// @file A plain model of section files, in which a file is a list of lines. It is the oracle for
/// the real editing, in the random test and in the fuzz target.

#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace KovaTest::Model {

using Pairs = std::vector<std::pair<std::string, std::string>>;
using Lines = std::vector<std::string>;

/// The lines of a text, each with its line end; the last one may have none.
inline Lines linesOf(const std::string &text) {
  Lines lines;
  std::string line;
  for (const char c : text) {
    line += c;
    if (c == '\n') {
      lines.push_back(line);
      line.clear();
    }
  }
  if (!line.empty()) {
    lines.push_back(line);
  }
  return lines;
}

inline std::string textOf(const Lines &lines) {
  std::string text;
  for (const std::string &line : lines) {
    text += line;
  }
  return text;
}

inline bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

inline std::string trimmed(std::string text) {
  while (!text.empty() && isBlank(text.back())) {
    text.pop_back();
  }
  while (!text.empty() && isBlank(text.front())) {
    text.erase(0, 1);
  }
  return text;
}

inline bool endsSection(const std::string &line) {
  return trimmed(line).substr(0, 1) == "[";
}

inline std::optional<std::string> headerName(const std::string &line) {
  const std::string text = trimmed(line);
  if (text.size() < 2 || text.front() != '[' || text.back() != ']') {
    return std::nullopt;
  }
  return text.substr(1, text.size() - 2);
}

/// Whether readers take a line for the header of a section: they ignore its last character.
inline bool looksLikeHeaderOf(const std::string &line, const std::string &name) {
  const std::string text = trimmed(line);
  return text.size() == name.size() + 2 && text.front() == '[' &&
         text.compare(1, name.size(), name) == 0;
}

inline std::optional<std::pair<std::string, std::string>> option(const std::string &line) {
  const std::size_t equals = line.find('=');
  if (equals == std::string::npos) {
    return std::nullopt;
  }
  const std::string key = trimmed(line.substr(0, equals));
  if (key.substr(0, 1) == "#") {
    return std::nullopt;
  }
  return std::make_pair(key, trimmed(line.substr(equals + 1)));
}

/// The options that a reader finds; none when there is no such section for it.
inline std::optional<std::map<std::string, std::string>> load(const std::string &text,
                                                              const std::string &name) {
  const Lines lines = linesOf(text);
  for (std::size_t i = 0; i < lines.size(); ++i) {
    if (!looksLikeHeaderOf(lines[i], name)) {
      continue;
    }
    std::map<std::string, std::string> options;
    for (++i; i < lines.size() && !endsSection(lines[i]); ++i) {
      if (const auto found = option(lines[i])) {
        options[found->first] = found->second;
      }
    }
    return options;
  }
  return std::nullopt;
}

inline std::vector<std::string> names(const std::string &text) {
  std::vector<std::string> found;
  for (const std::string &line : linesOf(text)) {
    const auto name = headerName(line);
    if (name && name->find('\0') == std::string::npos) {
      found.push_back(*name);
    }
  }
  return found;
}

/// The position of the first section of the name: its header, and the line after its last one.
struct Span {
  bool found = false;
  bool hidden = false;
  std::size_t header = 0;
  std::size_t end = 0;
};

inline Span find(const Lines &lines, const std::string &name) {
  Span span;
  for (std::size_t i = 0; i < lines.size(); ++i) {
    if (headerName(lines[i]) == name) {
      span.found = true;
      span.header = i;
      for (span.end = i + 1; span.end < lines.size() && !endsSection(lines[span.end]);) {
        ++span.end;
      }
      return span;
    }
    span.hidden = span.hidden || looksLikeHeaderOf(lines[i], name);
  }
  return span;
}

inline bool hasEnd(const std::string &line) {
  return !line.empty() && line.back() == '\n';
}

inline std::string lineEnd(const std::string &line) {
  return line.size() >= 2 && line.compare(line.size() - 2, 2, "\r\n") == 0 ? "\r\n" : "\n";
}

/// The new text; none when the change must be refused.
inline std::optional<std::string> set(const std::string &text, const std::string &name,
                                      const Pairs &pairs) {
  Lines lines = linesOf(text);
  const Span span = find(lines, name);
  if (!span.found || span.hidden) {
    return std::nullopt;
  }
  std::string &header = lines[span.header];
  const std::string end = lineEnd(hasEnd(header) ? header : lines[0]);
  if (!hasEnd(header) && !pairs.empty()) {
    header += end;
  }
  const auto isOption = [&](std::size_t i) { return option(lines[i]).has_value(); };
  const auto first = span.header + 1;
  std::size_t top = first; // one past the lines that remain above
  while (top < span.end && !isOption(top)) {
    ++top;
  }
  std::size_t bottom = span.end; // the first of those that remain below
  while (bottom > first && !isOption(bottom - 1)) {
    --bottom;
  }
  Lines out(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(first));
  if (top < span.end) {
    out.insert(out.end(), lines.begin() + static_cast<std::ptrdiff_t>(first),
               lines.begin() + static_cast<std::ptrdiff_t>(top));
  } else {
    bottom = first; // there are no options
  }
  // A line in between stays above the next option below it that remains. Lines without one come
  // last.
  std::map<std::string, Lines> above;
  Lines orphans;
  for (std::size_t i = top; i < bottom; ++i) {
    if (isOption(i)) {
      continue;
    }
    std::optional<std::string> owner;
    for (std::size_t below = i + 1; below < bottom && !owner; ++below) {
      for (const auto &[key, value] : pairs) {
        const auto found = option(lines[below]);
        if (found && found->first == key) {
          owner = key;
        }
      }
    }
    (owner ? above[*owner] : orphans).push_back(lines[i]);
  }
  for (const auto &[key, value] : pairs) {
    out.insert(out.end(), above[key].begin(), above[key].end());
    out.push_back(key + "=" + value + end);
  }
  out.insert(out.end(), orphans.begin(), orphans.end());
  out.insert(out.end(), lines.begin() + static_cast<std::ptrdiff_t>(bottom), lines.end());
  return textOf(out);
}

inline std::optional<std::string> add(const std::string &text, const std::string &name,
                                      const Pairs &pairs) {
  Lines lines = linesOf(text);
  const Span span = find(lines, name);
  if (span.found || span.hidden) {
    return std::nullopt;
  }
  const std::string end = lines.empty() ? "\n" : lineEnd(lines[0]);
  if (!lines.empty() && !hasEnd(lines.back())) {
    lines.back() += end;
  }
  lines.push_back("[" + name + "]" + end);
  for (const auto &[key, value] : pairs) {
    lines.push_back(key + "=" + value + end);
  }
  return textOf(lines);
}

inline std::optional<std::string> remove(const std::string &text, const std::string &name) {
  Lines lines = linesOf(text);
  const Span span = find(lines, name);
  if (!span.found) {
    return std::nullopt;
  }
  lines.erase(lines.begin() + static_cast<std::ptrdiff_t>(span.header),
              lines.begin() + static_cast<std::ptrdiff_t>(span.end));
  return textOf(lines);
}

} // namespace KovaTest::Model

#endif
