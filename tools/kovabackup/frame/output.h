#ifndef KOVABACKUP_TOOLS_OUTPUT_H
#define KOVABACKUP_TOOLS_OUTPUT_H

/// @file What the command prints: a buffered stream that notices failed writes, rows of names, and
/// the JSON form of names.
///
/// On a terminal rows are aligned under a heading and control bytes in names are escaped. Anywhere
/// else a row is its cells with tabs between, the bytes of a name as they are, and no heading, so
/// that the first words of a script never depend on what is listed.

#include <fmt/color.h>
#include <json/json.h>
#include <string>
#include <string_view>
#include <vector>

namespace KOVA::Backup::Tool {

/// Colours of one stream; every text is returned unchanged unless they are on.
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

/// True when colour may be used on a terminal: NO_COLOR unset or empty, TERM neither unset nor
/// "dumb".
bool environmentAllowsColour();

/// A buffered output stream on a descriptor that it does not own.
/// Failure: the first failed write is remembered, later text is dropped; flush tells.
class Output {
public:
  explicit Output(int fd);

  bool terminal() const { return terminal_; }
  const Style &style() const { return style_; }
  void setStyle(const Style &style) { style_ = style; }

  void write(std::string_view text);
  void line(std::string_view text);

  /// A name as this stream shows it: escaped on a terminal.
  std::string name(const std::string &text) const;

  /// Writes a name, and what ends it: a line end, or a NUL byte for those who asked for that.
  void name(const std::string &text, char end);

  /// Writes out what is buffered. Returns: 0, or the errno of the first write that failed.
  int flush();
  bool failed() const { return error_ != 0; }

private:
  int fd_;
  bool terminal_;
  Style style_;
  std::string buffer_;
  int error_ = 0;
};

/// How the cells of a column stand under their heading.
enum class Align { Left, Right };

/// Rows that are printed together. The last column should hold the name: nothing after it has to
/// be found again.
class Rows {
public:
  Rows &column(const std::string &heading, Align align = Align::Left);
  void add(std::vector<std::string> cells);
  bool empty() const { return rows_.empty(); }

  /// Prints to out. With null each row ends in a NUL byte and is never aligned.
  void print(Output &out, bool null) const;

private:
  struct Column {
    std::string heading;
    Align align;
  };

  void printAligned(Output &out) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_;
};

/// A name as a JSON value: a string, or {"base64": "..."} when its bytes are no UTF-8 (JSON text
/// has no other way to bring them back).
Json::Value jsonName(const std::string &bytes);

/// Appends what jsonName makes of a name, as text. For lists of millions, whose values would fill
/// the memory.
void appendJsonName(std::string &json, const std::string &bytes);

/// A document as text: indented for a terminal, else on one line; ended by a line end. No control
/// character stands in it as it is.
std::string jsonText(const Json::Value &document, bool terminal);

} // namespace KOVA::Backup::Tool

#endif
