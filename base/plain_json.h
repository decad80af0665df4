#ifndef KOVA_BASE_PLAIN_JSON_H
#define KOVA_BASE_PLAIN_JSON_H

/// @file Reads the JSON text that options usually have, several times as fast as the JSON library.
///
///     if (!readPlainJson(text, value)) ...read it with the library...
///
/// Plain is a text of null, booleans, integers that fit into 64 bits with a sign, strings without
/// escapes by number, lists and objects. What the library reads from such a text is clear without
/// it. Everything else is left to the library, malformed texts included, so that only one reader
/// decides about them.
///
/// Failure: returns false; only std::bad_alloc is thrown.
/// Threads: any.

#include <json/value.h>
#include <string_view>

namespace KOVA::Base {

/// Returns: true when the complete text is plain and value has been read from it; on false value is
///          unchanged.
bool readPlainJson(std::string_view text, Json::Value &value);

} // namespace KOVA::Base

#endif
