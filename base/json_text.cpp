#include "base/json_text.h"

#include "base/json_reals.h"

#include <cstddef>
#include <json/reader.h>
#include <json/writer.h>
#include <memory>
#include <sstream>

namespace KOVA::Base::JsonText {
namespace {

std::unique_ptr<Json::StreamWriter> makeWriter() {
  Json::StreamWriterBuilder builder;
  builder["commentStyle"] = "None";
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  builder["precision"] = 17;
  return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

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

// Passes this thread's reader or writer to call. Destructors of static objects run after the
// thread_local objects of the main thread are gone, so they get a new one for each call. The flag
// has no destructor and can therefore still be read then.
template <typename Tool, typename Call>
auto withTool(std::unique_ptr<Tool> (*make)(), Call call) {
  thread_local bool gone = false;
  struct Owner {
    const std::unique_ptr<Tool> tool;
    ~Owner() { gone = true; }
  };
  if (gone) {
    return call(*make());
  }
  thread_local const Owner owner{make()};
  return call(*owner.tool);
}

// The JSON reader takes a NUL byte after the value for the end of the text, so failIfExtra does not
// see what follows it.
bool hasNulAfter(const Json::Value &value, const std::string &text) {
  const auto end = static_cast<std::size_t>(value.getOffsetLimit());
  return text.find('\0', end) != std::string::npos;
}

} // namespace

std::string toText(const Json::Value &value) {
  std::ostringstream out;
  out.exceptions(std::ios::badbit); // otherwise std::bad_alloc is swallowed and the text truncated
  (void)withTool(makeWriter, [&](Json::StreamWriter &writer) { return writer.write(value, &out); });
  return out.str();
}

bool fromText(const std::string &text, Json::Value &value) {
  const JsonReals reals(text);
  const std::string &masked = reals.masked();
  Json::Value parsed;
  try {
    if (!withTool(makeReader, [&](Json::CharReader &reader) {
          return reader.parse(masked.data(), masked.data() + masked.size(), &parsed, nullptr);
        })) {
      return false;
    }
  } catch (const Json::Exception &) {
    return false; // nested past the reader's limit, or a member name of a gigabyte
  }
  if (hasNulAfter(parsed, text)) {
    return false;
  }
  reals.restore(parsed);
  value.swap(parsed);
  return true;
}

} // namespace KOVA::Base::JsonText
