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
/// A template is scanned once, from left to right; a value is never scanned, so a value that looks
/// like a placeholder stays as it is. There is no nesting, no escaping and no trimming: the last
/// "{{" before a "}}" opens the placeholder, and the name is all between. With 1 for the name "a",
/// 2 for " a ", 3 for "b" and 4 for "":
///     "{{ a }}" gives "2"     "{{}}" gives "4"       "{{a {{b}}" gives "{{a 3"
///     "{{{a}}" gives "{1"     "{{a}}}" gives "1}"    "{{a" gives "{{a"    "a}}" gives "a}}"
/// Deliberate: a name without a value takes its whole placeholder out of the text.
///
/// Failure:   a text that cannot be formatted is ""; nothing is thrown but std::bad_alloc,
///            boost::bad_function_call for an empty mapper, and what a mapper itself throws.
/// errno:     not meaningful.
/// Log:       nothing.
/// Threads:   any; what a mapper refers to must not change during the call.

#include <boost/function.hpp>
#include <cstdarg>
#include <json/value.h>
#include <map>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Formats as printf(3) does.
///     stringf("%d%%", 50) == "50%"
/// Returns: the text whole, of any length; "" when it cannot be formatted (a wide character that
///          the locale lacks, a text of more than INT_MAX bytes).
std::string stringf(const char *format, ...) __attribute__((format(printf, 1, 2)));

/// stringf for functions that take a variable list of arguments themselves. args is consumed; the
/// caller ends it.
std::string vstringf(const char *format, va_list args) __attribute__((format(printf, 1, 0)));

/// The mapper that replaceMustache uses for a map: the value of the name, byte for byte.
/// Refers to the map, which must outlive it.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): the interface's name
class _VarsMapperMapString {
public:
  explicit _VarsMapperMapString(const std::map<std::string, std::string> &vars) : vars_(vars) {}

  /// Returns: true with the text in value, or false with value untouched when the name is absent.
  bool operator()(const std::string &name, std::string &value) const;

private:
  const std::map<std::string, std::string> &vars_;
};

/// The mapper that replaceMustache uses for a JSON object. Refers to it; it must outlive the
/// mapper.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): the interface's name
class _VarsMapperJson {
public:
  _VarsMapperJson(const Json::Value &vars, bool asJson) : vars_(vars), asJson_(asJson) {}

  /// Sets value to the member's text: with asJson its JSON text, of whatever type it is; else ""
  /// for null, the bare text for a string, and the JSON text for all other types.
  /// Returns: true, or false with value untouched when there is no such member. What is not an
  ///          object has no members.
  bool operator()(const std::string &name, std::string &value) const;

private:
  const Json::Value &vars_;
  bool asJson_;
};

/// Expands the placeholders of text. mapper is called once for each, in order, with the name as it
/// stands and an empty value; it answers true when value is to be put in, false when there is none.
/// Text, names and values are bytes, NUL included. The cost grows with text and values, whatever
/// the text holds.
/// Errors: boost::bad_function_call when mapper is empty and text has a placeholder.
std::string
replaceMustache(const std::string &text,
                boost::function<bool(const std::string &name, std::string &value)> mapper);

/// Expands the placeholders from a map.
///     with {"x", "1"}:  "a{{x}}b" gives "a1b"   "a{{y}}b" gives "ab"   "{{ x }}" gives ""
std::string replaceMustache(const std::string &text,
                            const std::map<std::string, std::string> &vars);

/// Expands the placeholders from the members of a JSON object, as _VarsMapperJson puts them.
///     with {"n": 5, "s": "t", "z": null} and asJson false:
///         "{{n}},{{s}},{{z}},{{missing}}" gives "5,t,,"; with asJson true: "5,\"t\",null,"
std::string replaceMustache(const std::string &text, const Json::Value &vars, bool asJson);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
