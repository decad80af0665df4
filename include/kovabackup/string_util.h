#ifndef KOVABACKUP_STRING_UTIL_H
#define KOVABACKUP_STRING_UTIL_H

/// @file Text: printf-style formatting into strings, and templates with {{name}} placeholders.
///
///     stringf("%s-%03d", "task", 7);                                     // "task-007"
///
///     std::map<std::string, std::string> vars;
///     vars["task"] = "photos";
///     replaceMustache("Backup of {{task}} ended. {{why}}", vars);
///                                                           // "Backup of photos ended. "
///
/// A template is scanned once, from left to right. Substituted values are not scanned, so a value
/// that looks like a placeholder is inserted unchanged. Placeholders do not nest, there is no
/// escaping, and names are not trimmed. The last "{{" before a "}}" opens the placeholder;
/// everything between the two is the name. When "a" has the value 1, " a " the value 2, "b" the
/// value 3 and "" the value 4:
///     "{{ a }}" gives "2"     "{{}}" gives "4"       "{{a {{b}}" gives "{{a 3"
///     "{{{a}}" gives "{1"     "{{a}}}" gives "1}"    "{{a" gives "{{a"    "a}}" gives "a}}"
/// Deliberate: a placeholder whose name has no value is removed from the text.
///
/// Failure:   text that cannot be formatted becomes "". The functions throw only std::bad_alloc,
///            boost::bad_function_call for an empty mapper, and whatever a mapper itself throws.
/// errno:     not meaningful.
/// Log:       nothing.
/// Threads:   any thread. The data to which a mapper refers must not change during the call.
/// Signals:   no function here is async-signal-safe.

#include <boost/function.hpp>
#include <cstdarg>
#include <json/value.h>
#include <map>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Formats as printf(3) does, into a new string.
///     stringf("%d%%", 50) == "50%"
/// Returns: the complete text, of any length; "" when it cannot be formatted, for example because
///          the locale lacks a wide character or the text exceeds INT_MAX bytes.
std::string stringf(const char *format, ...) __attribute__((format(printf, 1, 2)));

/// Does what stringf does, for functions that take a variable argument list themselves.
/// args is indeterminate afterwards, as after vprintf(3). The caller calls va_end.
/// Returns: as stringf.
std::string vstringf(const char *format, va_list args) __attribute__((format(printf, 1, 0)));

/// The mapper that replaceMustache uses for a map. It inserts the mapped value byte for byte.
/// Owns: nothing; it refers to the map, which must outlive it.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): the interface's name
class _VarsMapperMapString {
public:
  /// Refers to vars, which must outlive the mapper.
  explicit _VarsMapperMapString(const std::map<std::string, std::string> &vars) : vars_(vars) {}

  /// Looks up name, comparing bytes and case exactly.
  /// Returns: true with the mapped text in value; false with value unchanged when name is absent.
  bool operator()(const std::string &name, std::string &value) const;

private:
  const std::map<std::string, std::string> &vars_;
};

/// The mapper that replaceMustache uses for a JSON object.
/// Owns: nothing; it refers to the JSON value, which must outlive it.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): the interface's name
class _VarsMapperJson {
public:
  /// Refers to vars, which must outlive the mapper. asJson selects how members become text.
  _VarsMapperJson(const Json::Value &vars, bool asJson) : vars_(vars), asJson_(asJson) {}

  /// Sets value to the text of the member called name. With asJson, that is its JSON text, whatever
  /// the member's type. Without asJson, it is "" for null, the bare text for a string, and the JSON
  /// text for every other type.
  /// Returns: true; false with value unchanged when there is no such member. A JSON value that is
  ///          not an object has no members.
  bool operator()(const std::string &name, std::string &value) const;

private:
  const Json::Value &vars_;
  bool asJson_;
};

/// Expands the placeholders of text. It calls mapper once for each placeholder, in order, with the
/// untrimmed name and an empty value. mapper returns true to insert value, and false when the name
/// has no value; the placeholder is then removed.
/// Text, names and values are byte strings and may contain NUL. The time taken grows linearly with
/// the lengths of text and values, whatever text contains.
/// Returns: the expanded text.
/// Errors:  boost::bad_function_call when mapper is empty and text contains a placeholder.
std::string
replaceMustache(const std::string &text,
                boost::function<bool(const std::string &name, std::string &value)> mapper);

/// Expands the placeholders of text from a map. Names are compared byte for byte.
///     with {"x", "1"}:  "a{{x}}b" gives "a1b"   "a{{y}}b" gives "ab"   "{{ x }}" gives ""
/// Returns: the expanded text.
std::string replaceMustache(const std::string &text,
                            const std::map<std::string, std::string> &vars);

/// Expands the placeholders of text from the members of a JSON object. With asJson, each becomes
/// its JSON text. Without asJson, null becomes "", a string its bare text, and every other type its
/// JSON text. A JSON value that is not an object has no members.
///     with {"n": 5, "s": "t", "z": null} and asJson false:
///         "{{n}},{{s}},{{z}},{{missing}}" gives "5,t,,"; with asJson true: "5,\"t\",null,"
/// Returns: the expanded text.
std::string replaceMustache(const std::string &text, const Json::Value &vars, bool asJson);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
