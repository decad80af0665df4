#ifndef KOVA_BASE_JSON_TEXT_H
#define KOVA_BASE_JSON_TEXT_H

/// @file The one road between JSON text and Json::Value.
///
///     std::string text = JsonText::toText(values);     // {"a":"x","b":[1,2]}
///     Json::Value back;
///     JsonText::fromText(text, back);                  // true; back == values
///
/// Option files, JSON forms and templates all show this text, so that it looks the same everywhere
/// and whatever one of them wrote the others read. Strings and member names are bytes, not
/// characters: every byte string comes back exactly, embedded NUL and invalid UTF-8 included, since
/// file names are such strings. The JSON library's default escapes what is not ASCII and replaces
/// what is not UTF-8; that would lose names.
///
/// Failure:   fromText answers false; nothing is thrown but std::bad_alloc.
/// errno:     not meaningful.
/// Log:       nothing.
/// Threads:   any. Reader and writer are made once a thread (making a reader costs some twenty
///            times what parsing a short text does) and end with it; destructors of static objects
///            may call too.
/// Process:   numbers are read and written the same under every locale.

#include <json/value.h>
#include <string>

namespace KOVA::Base::JsonText {

/// The text of a value: compact, one line, no newline at its end, bytes past 0x7f as they are.
/// Null gives "null". Reals have the 17 digits that bring them back exactly.
/// Errors: a number that is not finite has no JSON text: NaN becomes null, an infinity a number
///         that fromText refuses. No JSON text brings such a number in.
std::string toText(const Json::Value &value);

/// Reads a text whole into value. Blanks around the value are allowed and nothing else: more text,
/// a comment, a NUL byte or a byte order mark around it is refused, and so are trailing commas.
/// Raw control characters and bytes that are not UTF-8 stand for themselves in strings. Of members
/// of one name the last counts. Comments inside an object or array are refused as far as the JSON
/// library's setting does, and numbers are what it takes for one ("01" too).
/// Returns: true when value holds what text says; on false value is unchanged.
/// Errors:  text that is not JSON; nesting of more than 1000 values.
bool fromText(const std::string &text, Json::Value &value);

} // namespace KOVA::Base::JsonText

#endif
