#include "tools/kovabackup/frame/output.h"

#include "base/retry_on_eintr.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fmt/format.h>
#include <memory>
#include <sodium.h>
#include <sstream>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kBufferBytes = std::size_t{256} * 1024;

std::string padded(const std::string &text, std::size_t width, Align align) {
  const std::string padding(width - std::min(width, columns(text)), ' ');
  return align == Align::Left ? text + padding : padding + text;
}

bool isUtf8(const std::string &text) {
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = utf8Length(text, i);
    if (length == 0) {
      return false;
    }
    i += length;
  }
  return true;
}

// The usual alphabet with padding, which every decoder accepts.
std::string base64(const std::string &bytes) {
  constexpr int kVariant = sodium_base64_VARIANT_ORIGINAL;
  std::string out(::sodium_base64_encoded_len(bytes.size(), kVariant), '\0');
  ::sodium_bin2base64(out.data(), out.size(), reinterpret_cast<const unsigned char *>(bytes.data()),
                      bytes.size(), kVariant);
  out.pop_back(); // the NUL byte that the function appends
  return out;
}

// Bytes that need no escape in a JSON string.
bool isPlain(char c) {
  return c >= 0x20 && c < 0x7f && c != '"' && c != '\\';
}

// The number of the character that begins there. The sequence must be valid.
unsigned codePoint(const std::string &text, std::size_t position, std::size_t length) {
  const auto byte = [&text, position](std::size_t i) {
    return static_cast<unsigned char>(text[position + i]);
  };
  unsigned point = length == 1 ? byte(0) : byte(0) & (0xffU >> (length + 1));
  for (std::size_t i = 1; i < length; ++i) {
    point = point << 6U | (byte(i) & 0x3fU);
  }
  return point;
}

// JSON allows DEL, the C1 controls and those that change the direction of text unescaped, but a
// terminal obeys them. Line feeds are those of the layout.
std::string escapeLateControls(const std::string &json) {
  std::string out;
  out.reserve(json.size());
  for (std::size_t i = 0; i < json.size();) {
    const std::size_t length = std::max<std::size_t>(utf8Length(json, i), 1);
    if (json[i] != '\n' && isControl(json, i, length)) {
      out += fmt::format("\\u{:04x}", codePoint(json, i, length));
    } else {
      out.append(json, i, length);
    }
    i += length;
  }
  return out;
}

} // namespace

int writeAll(int fd, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written =
        KOVA::Base::retryOnEintr([&] { return ::write(fd, text.data(), text.size()); });
    if (written < 0) {
      return errno;
    }
    text.remove_prefix(static_cast<std::size_t>(written));
  }
  return 0;
}

std::string Style::bold(const std::string &text) const {
  return paint(fmt::emphasis::bold, text);
}

std::string Style::good(const std::string &text) const {
  return paint(fmt::fg(fmt::terminal_color::green), text);
}

std::string Style::bad(const std::string &text) const {
  return paint(fmt::fg(fmt::terminal_color::red), text);
}

std::string Style::faint(const std::string &text) const {
  return paint(fmt::emphasis::faint, text);
}

std::string Style::paint(const fmt::text_style &style, const std::string &text) const {
  return on_ ? fmt::format(style, "{}", text) : text;
}

// NO_COLOR is an agreement of many commands: any value but an empty one turns colours off.
bool environmentAllowsColour() {
  const char *noColor = std::getenv("NO_COLOR");
  const char *term = std::getenv("TERM");
  return (noColor == nullptr || *noColor == '\0') && term != nullptr &&
         std::strcmp(term, "dumb") != 0;
}

// Whether the descriptor is a terminal is asked once: names are checked for every path of a list.
Output::Output(int fd)
    : fd_(fd), terminal_(::isatty(fd) == 1), width_(terminal_ ? terminalColumns(fd) : 0) {}

void Output::write(std::string_view text) {
  buffer_ += text;
  if (buffer_.size() >= kBufferBytes) {
    (void)flush(); // a failure is remembered and reported when the command ends
  }
}

void Output::line(std::string_view text) {
  write(text);
  write("\n");
}

std::string Output::name(const std::string &text) const {
  return terminal_ ? escapeControls(text) : text;
}

void Output::name(const std::string &text, char end) {
  write(name(text));
  write({&end, 1});
}

// After a failure nothing more is written: the rest of a list would look like a complete one.
int Output::flush() {
  if (error_ == 0) {
    error_ = writeAll(fd_, buffer_);
  }
  buffer_.clear();
  return error_;
}

Rows &Rows::column(const std::string &heading, Align align) {
  columns_.push_back({heading, align});
  return *this;
}

void Rows::add(std::vector<std::string> cells) {
  rows_.push_back(std::move(cells));
}

void Rows::print(Output &out, bool null) const {
  if (rows_.empty()) {
    return; // no heading without rows
  }
  if (out.terminal() && !null) {
    printAligned(out);
    return;
  }
  for (const std::vector<std::string> &row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) {
      out.write(i == 0 ? "" : "\t");
      out.write(out.name(row[i]));
    }
    out.write(null ? std::string_view("\0", 1) : std::string_view("\n"));
  }
}

// Escaped names are longer than the bytes they show, so widths are those of the escaped text.
std::vector<std::size_t> Rows::widths(const Output &out) const {
  std::vector<std::size_t> widths;
  for (std::size_t i = 0; i < columns_.size(); ++i) {
    std::size_t width = columns(columns_[i].heading);
    for (const std::vector<std::string> &row : rows_) {
      width = std::max(width, columns(out.name(row[i])));
    }
    widths.push_back(i + 1 == columns_.size() ? 0 : width); // no padding after the last column
  }
  return widths;
}

// The columns before the last one have the same widths in all rows, so all rows are broken at the
// same places; only the last cell may fit in one row and not in another. Without the break the
// terminal would break the row within a word.
std::string Rows::aligned(const std::vector<std::string> &cells,
                          const std::vector<std::size_t> &widths, std::size_t limit) const {
  constexpr std::size_t kGap = 2;
  std::string text;
  std::size_t column = 0;
  for (std::size_t i = 0; i < cells.size(); ++i) {
    const std::size_t width = std::max(widths[i], columns(cells[i]));
    if (i > 0 && column + kGap + width > limit) {
      text.erase(text.find_last_not_of(' ') + 1);
      text += "\n";
      column = 0;
    }
    text += std::string(i == 0 ? 0 : kGap, ' ') + padded(cells[i], widths[i], columns_[i].align);
    column += (i == 0 ? 0 : kGap) + width;
  }
  return text;
}

void Rows::printAligned(Output &out) const {
  const std::vector<std::size_t> all = widths(out);
  std::vector<std::string> headings;
  for (const Column &column : columns_) {
    headings.push_back(column.heading);
  }
  out.line(out.style().bold(aligned(headings, all, out.width())));
  for (std::vector<std::string> row : rows_) {
    std::transform(row.begin(), row.end(), row.begin(),
                   [&out](const std::string &cell) { return out.name(cell); });
    out.line(aligned(row, all, out.width()));
  }
}

Json::Value jsonName(const std::string &bytes) {
  if (isUtf8(bytes)) {
    return bytes;
  }
  Json::Value value(Json::objectValue);
  value["base64"] = base64(bytes);
  return value;
}

void appendJsonName(std::string &json, const std::string &bytes) {
  if (std::all_of(bytes.begin(), bytes.end(),
                  isPlain)) { // nearly every name: no JSON value is built for it
    json.append(1, '"').append(bytes).append(1, '"');
    return;
  }
  const std::string text = jsonText(jsonName(bytes), false);
  json.append(text, 0, text.size() - 1); // without its line feed
}

std::string jsonText(const Json::Value &document, bool terminal) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = terminal ? "  " : "";
  builder["emitUTF8"] = true;
  const std::unique_ptr<Json::StreamWriter> writer(builder.newStreamWriter());
  std::ostringstream text;
  text.exceptions(std::ios::badbit); // otherwise it keeps std::bad_alloc, and the text is cut off
  writer->write(document, &text);
  return escapeLateControls(text.str()) + "\n";
}

} // namespace KOVA::Backup::Tool
