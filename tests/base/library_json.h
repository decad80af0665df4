#ifndef KOVABACKUP_TESTS_LIBRARY_JSON_H
#define KOVABACKUP_TESTS_LIBRARY_JSON_H

/// @file The JSON library's own writer and reader with the settings that JsonText stands for: the
/// oracle that its faster ways are compared with. The library reads reals under the global C++
/// locale, so use it under the classic one, and from one thread.

#include "base/json_text.h"

#include <json/reader.h>
#include <json/writer.h>
#include <memory>
#include <sstream>
#include <string>

namespace KovaTest::LibraryJson {

inline std::unique_ptr<Json::StreamWriter> makeWriter() {
  Json::StreamWriterBuilder builder;
  builder["commentStyle"] = "None";
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  builder["precision"] = 17;
  return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

inline std::unique_ptr<Json::CharReader> makeReader() {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["allowComments"] = false;
  builder["allowTrailingCommas"] = false;
  builder["failIfExtra"] = true;
  builder["rejectDupKeys"] = false;
  builder["skipBom"] = false;
  builder["stackLimit"] = 1000;
  return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

inline std::string toText(const Json::Value &value) {
  static const std::unique_ptr<Json::StreamWriter> writer = makeWriter();
  std::ostringstream out;
  (void)writer->write(value, &out);
  return out.str();
}

/// Returns: false when the library refuses the text, or when a NUL byte, which the library takes
///          for the end of the text, follows the value.
inline bool fromText(const std::string &text, Json::Value &value) {
  static const std::unique_ptr<Json::CharReader> reader = makeReader();
  Json::Value read;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &read, nullptr)) {
      return false;
    }
  } catch (const Json::Exception &) {
    return false;
  }
  const auto end = static_cast<std::size_t>(read.getOffsetLimit());
  if (text.find('\0', end) != std::string::npos) {
    return false;
  }
  value.swap(read);
  return true;
}

/// Whether JsonText reads the text as the library does: the same result, and the same value with
/// the same types. Values that differ in the sign of a zero only are equal, but their texts differ.
inline bool readsAlike(const std::string &text) {
  Json::Value expected("before");
  Json::Value got("before");
  const bool accepted = fromText(text, expected);
  return KOVA::Base::JsonText::fromText(text, got) == accepted && got == expected &&
         toText(got) == toText(expected);
}

/// Whether JsonText writes the value as the library does.
inline bool writesAlike(const Json::Value &value) {
  return KOVA::Base::JsonText::toText(value) == toText(value);
}

} // namespace KovaTest::LibraryJson

#endif
