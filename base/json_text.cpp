#include "base/json_text.h"

#include "base/json_memory.h"
#include "base/json_reals.h"
#include "base/plain_json.h"

#include <algorithm>
#include <cstddef>
#include <json/reader.h>
#include <memory>
#include <new>

namespace KOVA::Base::JsonText {
namespace {

std::unique_ptr<Json::CharReader> makeReader() {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["allowComments"] = false;
  builder["allowTrailingCommas"] = false;
  builder["failIfExtra"] = true;
  builder["rejectDupKeys"] = false;
  // Refuses a byte order mark. Skipping it would also shift the value offsets against the text.
  builder["skipBom"] = false;
  builder["stackLimit"] = 1000;
  return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

// Passes this thread's reader to call. Destructors of static objects run after the thread_local
// objects of the main thread are gone, so they get a new one for each call. The flag has no
// destructor and can therefore still be read then.
template <typename Call>
bool withReader(Call call) {
  thread_local bool gone = false;
  struct Owner {
    const std::unique_ptr<Json::CharReader> reader;
    ~Owner() { gone = true; }
  };
  if (gone) {
    return call(*makeReader());
  }
  thread_local const Owner owner{makeReader()};
  return call(*owner.reader);
}

// The JSON reader takes a NUL byte after the value for the end of the text, so failIfExtra does not
// see what follows it.
bool hasNulAfter(const Json::Value &value, const std::string &text) {
  const auto end = static_cast<std::size_t>(value.getOffsetLimit());
  return text.find('\0', end) != std::string::npos;
}

bool parse(const std::string &text, Json::Value &value) {
  try {
    return withReader([&](Json::CharReader &reader) {
      return reader.parse(text.data(), text.data() + text.size(), &value, nullptr);
    });
  } catch (const Json::Exception &error) {
    if (JsonMemory::ranOut(error)) {
      throw std::bad_alloc();
    }
    return false; // nested past the reader's limit, or with a member name or string of a gigabyte
  }
}

bool readByLibrary(const std::string &text, Json::Value &value) {
  const JsonReals reals(text);
  Json::Value parsed;
  if (!parse(reals.masked(), parsed) || hasNulAfter(parsed, text)) {
    return false;
  }
  reals.restore(parsed);
  value.swap(parsed);
  return true;
}

} // namespace

bool fromText(std::string_view text, Json::Value &value) {
  return readPlainJson(text, value) || readByLibrary(std::string(text), value);
}

bool isFlat(const Json::Value &value) {
  switch (value.type()) {
  case Json::realValue:
  case Json::objectValue:
    return false;
  case Json::arrayValue:
    return std::all_of(value.begin(), value.end(), [](const Json::Value &element) {
      return !element.isArray() && isFlat(element);
    });
  default:
    return true;
  }
}

} // namespace KOVA::Base::JsonText
