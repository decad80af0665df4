#ifndef KOVA_BASE_JSON_TEXT_H
#define KOVA_BASE_JSON_TEXT_H

/// @file The only conversion between JSON text and Json::Value.
///
///     std::string text = JsonText::toText(values);     // {"a":"x","b":[1,2]}
///     Json::Value back;
///     JsonText::fromText(text, back);                  // true; back == values
///
/// Section files, JSON forms, templates and the configuration use this conversion, so that JSON
/// text looks the same everywhere and each of them can read what another wrote. Strings and member
/// names are bytes, not characters: every byte string is restored exactly, including embedded NUL
/// and invalid UTF-8, because file names are such strings. By default the JSON library escapes what
/// is not ASCII and replaces what is not UTF-8, which would lose file names.
///
/// Failure:   fromText returns false; only std::bad_alloc is thrown.
/// errno:     not meaningful.
/// Log:       nothing.
/// Threads:   any. A thread makes one reader of the JSON library, which lives as long as the
///            thread, for its first text that is not plain (plain_json.h): making a reader costs
///            about twenty times as much as parsing a short text. Destructors of static objects may
///            call, too.
/// Process:   numbers are read and written the same under every locale.

#include <json/value.h>
#include <string>
#include <string_view>

namespace KOVA::Base::JsonText {

/// The text of a value: compact, on one line, without a newline at its end. Bytes above 0x7f are
/// written unchanged. A null value is written as "null", a real with the 17 digits that restore it
/// exactly.
/// Errors: a number that is not finite has no JSON text. NaN is written as null, and an infinity as
///         a number that fromText refuses. fromText never produces such a number.
std::string toText(const Json::Value &value);

/// Reads a complete text into value. Only white space may surround the JSON value: further text, a
/// comment, a NUL byte or a byte order mark is refused, and so are trailing commas. In strings, raw
/// control characters and bytes that are not UTF-8 represent themselves. Of members with the same
/// name the last one counts. The JSON library decides which comments inside an object or array it
/// refuses when comments are disallowed, and what a number is ("01" is one).
/// Returns: true when value has been read; on false value is unchanged.
/// Errors:  text that is not JSON; values nested more than 1000 deep.
bool fromText(std::string_view text, Json::Value &value);

/// Whether a value that fromText produced is null, a boolean, an integer, a text, or a list of
/// these. As an element or member of another value, its text is read as exactly this value again.
/// Of other values that is not certain: a member may be nested more deeply than fromText accepts.
bool isFlat(const Json::Value &value);

} // namespace KOVA::Base::JsonText

#endif
