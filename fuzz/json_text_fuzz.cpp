// Any bytes, as JSON text and as a string within a value: the JSON library itself reads the same
// from the text and writes the same text, an accepted value is the same when it is read again from
// its own text, and no byte of a string is lost.

#include "base/json_text.h"
#include "fuzz/support.h"
#include "tests/base/library_json.h"

namespace JsonText = KOVA::Base::JsonText;
namespace LibraryJson = KovaTest::LibraryJson;
using KovaFuzz::require;

namespace {

void checkText(const std::string &text) {
  require(LibraryJson::readsAlike(text));
  Json::Value value("before");
  if (!JsonText::fromText(text, value)) {
    require(value == Json::Value("before"));
    return;
  }
  const std::string written = JsonText::toText(value);
  require(written == LibraryJson::toText(value));
  require(written.find('\n') == std::string::npos);
  Json::Value again;
  require(JsonText::fromText(written, again));
  require(again == value);
  require(JsonText::toText(again) == written);
}

void checkBytes(const std::string &bytes) {
  Json::Value value(Json::objectValue);
  value[bytes].append(bytes);
  require(LibraryJson::writesAlike(value));
  Json::Value again;
  require(JsonText::fromText(JsonText::toText(value), again));
  require(again == value);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  const std::string text = KovaFuzz::Input(data, size).rest();
  checkText(text);
  checkBytes(text);
  return 0;
}
