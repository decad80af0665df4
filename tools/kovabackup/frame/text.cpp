#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <cwchar>
#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// How many bytes a lead byte announces, and the range of the byte after it. The range excludes
// overlong forms, surrogates and values past the last code point.
struct Lead {
  std::size_t length;
  unsigned char low;
  unsigned char high;
};

Lead leadOf(unsigned char byte) {
  if (byte < 0x80) {
    return {1, 0, 0};
  }
  if (byte >= 0xc2 && byte <= 0xdf) {
    return {2, 0x80, 0xbf};
  }
  if (byte >= 0xe0 && byte <= 0xef) {
    return {3, static_cast<unsigned char>(byte == 0xe0 ? 0xa0 : 0x80),
            static_cast<unsigned char>(byte == 0xed ? 0x9f : 0xbf)};
  }
  if (byte >= 0xf0 && byte <= 0xf4) {
    return {4, static_cast<unsigned char>(byte == 0xf0 ? 0x90 : 0x80),
            static_cast<unsigned char>(byte == 0xf4 ? 0x8f : 0xbf)};
  }
  return {0, 0, 0};
}

unsigned char byteAt(const std::string &text, std::size_t position) {
  return static_cast<unsigned char>(text[position]);
}

void appendEscaped(std::string &out, unsigned char byte) {
  if (byte == '\n') {
    out += "\\n";
  } else if (byte == '\t') {
    out += "\\t";
  } else {
    out += fmt::format("\\x{:02x}", byte);
  }
}

// Columns of one character. In the C locale nothing but ASCII is known, although the terminal may
// well show UTF-8; most characters take one column.
std::size_t columnsOf(const std::string &text, std::size_t position, std::size_t length) {
  wchar_t character = 0;
  std::mbstate_t state = {};
  const bool known = std::mbrtowc(&character, &text[position], length, &state) == length;
  const int width = known ? ::wcwidth(character) : -1;
  return width < 0 ? 1 : static_cast<std::size_t>(width);
}

// The number of characters to insert, remove or replace, computed row by row.
std::size_t editDistance(const std::string &a, const std::string &b) {
  std::vector<std::size_t> row{0};
  for (std::size_t j = 1; j <= b.size(); ++j) {
    row.push_back(j);
  }
  for (std::size_t i = 0; i < a.size(); ++i) {
    std::size_t diagonal = row[0];
    row[0] = i + 1;
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({replaced, row[j] + 1, row[j + 1] + 1});
    }
  }
  return row.back();
}

} // namespace

std::size_t utf8Length(const std::string &text, std::size_t position) {
  const Lead lead = leadOf(byteAt(text, position));
  if (lead.length <= 1 || text.size() - position < lead.length) {
    return lead.length == 1 ? 1 : 0;
  }
  const unsigned char second = byteAt(text, position + 1);
  if (second < lead.low || second > lead.high) {
    return 0;
  }
  for (std::size_t i = 2; i < lead.length; ++i) {
    if ((byteAt(text, position + i) & 0xc0) != 0x80) {
      return 0;
    }
  }
  return lead.length;
}

// C0, DEL, and C1 in its two-byte form; U+061C, U+200E, U+200F, U+2028 to U+202E and U+2066 to
// U+2069.
bool isControl(const std::string &text, std::size_t position, std::size_t length) {
  const auto byte = [&text, position](std::size_t i) { return byteAt(text, position + i); };
  if (length == 1) {
    return byte(0) < 0x20 || byte(0) == 0x7f;
  }
  if (length == 2) {
    return (byte(0) == 0xc2 && byte(1) < 0xa0) || (byte(0) == 0xd8 && byte(1) == 0x9c);
  }
  return length == 3 && byte(0) == 0xe2 &&
         ((byte(1) == 0x80 &&
           (byte(2) == 0x8e || byte(2) == 0x8f || (byte(2) >= 0xa8 && byte(2) <= 0xae))) ||
          (byte(1) == 0x81 && byte(2) >= 0xa6 && byte(2) <= 0xa9));
}

std::string escapeControls(const std::string &text, Lines lines) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = utf8Length(text, i);
    const bool kept = lines == Lines::Keep && (text[i] == '\n' || text[i] == '\t');
    if (!kept && (length == 0 || isControl(text, i, length))) {
      const std::size_t end = i + std::max<std::size_t>(length, 1);
      for (; i < end; ++i) {
        appendEscaped(out, byteAt(text, i));
      }
    } else {
      out.append(text, i, length);
      i += length;
    }
  }
  return out;
}

std::string shownFile(const std::string &file) {
  return file.empty() ? "''" : file;
}

bool mayHelpAsRoot(int error) {
  return (error == EACCES || error == EPERM) && ::geteuid() != 0;
}

// strerror(3) follows LC_MESSAGES, which the command leaves at C: scripts compare messages.
std::string reasonAlone(int error) {
  return std::strerror(error);
}

std::string reason(int error) {
  return reasonAlone(error) + (mayHelpAsRoot(error) ? "; try as root" : "");
}

std::string shortened(const std::string &text) {
  constexpr std::size_t kMostBytes = 5000; // the longest path fits, with its reason
  constexpr std::size_t kKept = 300;
  if (text.size() <= kMostBytes) {
    return text;
  }
  const auto continues = [&text](std::size_t i) { return (byteAt(text, i) & 0xc0) == 0x80; };
  std::size_t head = kKept;
  while (continues(head) && head > kKept - 4) { // not within a character
    --head;
  }
  std::size_t tail = text.size() - kKept;
  while (continues(tail) && tail < text.size() - kKept + 4) {
    ++tail;
  }
  return fmt::format("{} [{} bytes left out] {}", text.substr(0, head), tail - head,
                     text.substr(tail));
}

std::size_t columns(const std::string &text) {
  std::size_t sum = 0;
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = std::max<std::size_t>(utf8Length(text, i), 1);
    sum += columnsOf(text, i, length);
    i += length;
  }
  return sum;
}

std::size_t terminalColumns(int fd) {
  struct winsize size = {};
  const bool known = ::ioctl(fd, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
  return known ? size.ws_col : 80;
}

// Two spaces in a row are kept unless the line ends there: they may belong to a name.
std::string wrapped(const std::string &text, std::size_t indent, std::size_t width) {
  if (width == 0) {
    return text;
  }
  std::string out;
  std::size_t column = indent;
  for (std::size_t begin = 0; begin <= text.size();) {
    const std::size_t end = std::min(text.find(' ', begin), text.size());
    const std::string word = text.substr(begin, end - begin);
    const std::size_t wide = columns(word);
    if (begin > 0 && column > indent && column + 1 + wide > width) {
      out += "\n" + std::string(indent, ' ');
      column = indent;
    } else if (begin > 0) {
      out += ' ';
      ++column;
    }
    out += word;
    column += wide;
    begin = end + 1;
  }
  return out;
}

std::string humanBytes(std::uint64_t bytes) {
  if (bytes < 1024) {
    return fmt::format("{} B", bytes);
  }
  static constexpr const char *kUnits[] = {"KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
  double value = static_cast<double>(bytes) / 1024;
  std::size_t unit = 0;
  while (value >= 1023.95 && unit + 1 < std::size(kUnits)) { // 1023.95 would print as 1024.0
    value /= 1024;
    ++unit;
  }
  return fmt::format("{:.1f} {}", value, kUnits[unit]);
}

std::string humanAge(std::chrono::seconds age) {
  const long long seconds = std::max<long long>(age.count(), 0);
  const long long minutes = seconds / 60;
  const long long hours = minutes / 60;
  if (minutes == 0) {
    return fmt::format("{}s", seconds);
  }
  if (hours == 0) {
    return fmt::format("{}m {}s", minutes, seconds % 60);
  }
  if (hours < 24) {
    return fmt::format("{}h {}m", hours, minutes % 60);
  }
  return fmt::format("{}d {}h", hours / 24, hours % 24);
}

// Not strtoll(3), which skips white space and accepts a plus sign and trailing text.
std::optional<long long> parseNumber(const std::string &text, long long min, long long max) {
  long long value = 0;
  const char *end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, value);
  if (error != std::errc() || stop != end || value < min || value > max) {
    return std::nullopt;
  }
  return value;
}

std::optional<std::chrono::seconds> parseAge(const std::string &text) {
  static const std::string kUnits = "smhdw";
  static constexpr long long kSeconds[] = {1, 60, 3600, 86400, 604800};
  constexpr long long kMost = 100000; // weeks, about 1,900 years; the same span in every other unit
  const std::size_t unit = text.empty() ? std::string::npos : kUnits.find(text.back());
  if (unit == std::string::npos) {
    return std::nullopt;
  }
  const auto number =
      parseNumber(text.substr(0, text.size() - 1), 0, kMost * kSeconds[4] / kSeconds[unit]);
  if (!number) {
    return std::nullopt;
  }
  return std::chrono::seconds(*number * kSeconds[unit]);
}

// The limit grows with the word: two slips in a long word are likely, in a short one they are
// another word.
std::string nearest(const std::string &word, const std::vector<std::string> &candidates) {
  std::string best;
  std::size_t fewest = word.size() / 3 + 2; // "lst" may mean "list", but "x" is similar to nothing
  for (const std::string &candidate : candidates) {
    const std::size_t distance = editDistance(word, candidate);
    if (distance < std::min(fewest, candidate.size())) {
      fewest = distance;
      best = candidate;
    }
  }
  return best;
}

} // namespace KOVA::Backup::Tool
