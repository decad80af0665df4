#ifndef KOVABACKUP_TOOLS_OUTPUT_H
#define KOVABACKUP_TOOLS_OUTPUT_H

/// @file What the command prints: a buffered stream that notices failed writes, rows of names, and
/// the JSON form of names.
///
/// On a terminal rows are aligned under a heading and control bytes in names are escaped. Anywhere
/// else a row is its cells separated by tabs, names are written byte for byte, and there is no
/// heading, so that scripts need not skip one.

#include <fmt/color.h>
#include <json/json.h>
#include <string>
#include <string_view>
#include <vector>

namespace KOVA::Backup::Tool {

/// Writes all of text. Returns: 0, or the errno of the write that failed.
int writeAll(int fd, std::string_view text);

/// The colours of one stream. Every text is returned unchanged unless they are on.
class Style {
public:
  explicit Style(bool on = false) : on_(on) {}

  std::string bold(const std::string &text) const;
  std::string good(const std::string &text) const;
  std::string bad(const std::string &text) const;
  std::string faint(const std::string &text) const;

private:
  std::string paint(const fmt::text_style &style, const std::string &text) const;

  bool on_;
};

/// True when colour may be used on a terminal: NO_COLOR is unset or empty and TERM is set to
/// anything but "dumb".
bool environmentAllowsColour();

/// A buffered output stream on a descriptor that it does not own.
/// Failure: the first failed write is remembered and later text is dropped; flush returns its
/// errno.
class Output {
public:
  explicit Output(int fd);

  bool terminal() const { return terminal_; }
  /// The columns into which text for people must fit; 0 when this is not a terminal: no limit.
  std::size_t width() const { return width_; }
  const Style &style() const { return style_; }
  void setStyle(const Style &style) { style_ = style; }

  void write(std::string_view text);
  void line(std::string_view text);

  /// A name as this stream shows it: escaped on a terminal.
  std::string name(const std::string &text) const;

  /// Writes a name and the byte that ends it: a line feed, or a NUL byte with --null.
  void name(const std::string &text, char end);

  /// Writes what is buffered. Returns: 0, or the errno of the first write that failed.
  int flush();
  bool failed() const { return error_ != 0; }

private:
  int fd_;
  bool terminal_;
  std::size_t width_;
  Style style_;
  std::string buffer_;
  int error_ = 0;
};

/// How the cells of a column are aligned with their heading.
enum class Align { Left, Right };

/// Rows that are printed together. The last column should hold the name: its length varies most,
/// and a script may take everything after the last tab. On a terminal that is too narrow for a row,
/// the row goes on below, indented, from a column on.
class Rows {
public:
  Rows &column(const std::string &heading, Align align = Align::Left);
  void add(std::vector<std::string> cells);
  bool empty() const { return rows_.empty(); }

  /// Prints the rows. With null each row ends in a NUL byte and is never aligned.
  void print(Output &out, bool null) const;

private:
  struct Column {
    std::string heading;
    Align align;
  };

  void printAligned(Output &out) const;
  std::vector<std::size_t> widths(const Output &out) const;
  std::string aligned(const std::vector<std::string> &cells, const std::vector<std::size_t> &widths,
                      std::size_t limit) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_;
};

/// A name as a JSON value: a string, or {"base64": "..."} when its bytes are not UTF-8, which JSON
/// text could not represent.
Json::Value jsonName(const std::string &bytes);

/// Appends the text of jsonName(bytes). For lists of millions of names, which as values would take
/// too much memory.
void appendJsonName(std::string &json, const std::string &bytes);

/// A document as text, indented for a terminal, otherwise on one line, with a line feed at the end.
/// Every control character in it is escaped.
std::string jsonText(const Json::Value &document, bool terminal);

} // namespace KOVA::Backup::Tool

#endif
