// Any bytes, as JSON text and as a string within a value: the JSON library itself reads the same
// from the text and writes the same text, an accepted value is the same when it is read again from
// its own text, and no byte of a string is lost.

#include "base/json_text.h"
#include "tests/base/library_json.h"

#include <cstdint>
#include <cstdlib>
#include <string>

namespace JsonText = KOVA::Base::JsonText;
namespace LibraryJson = KovaTest::LibraryJson;

namespace {

void check(bool holds) {
  if (!holds) {
    std::abort();
  }
}

void checkText(const std::string &text) {
  check(LibraryJson::readsAlike(text));
  Json::Value value("before");
  if (!JsonText::fromText(text, value)) {
    check(value == Json::Value("before"));
    return;
  }
  const std::string written = JsonText::toText(value);
  check(written == LibraryJson::toText(value));
  check(written.find('\n') == std::string::npos);
  Json::Value again;
  check(JsonText::fromText(written, again));
  check(again == value);
  check(JsonText::toText(again) == written);
}

void checkBytes(const std::string &bytes) {
  Json::Value value(Json::objectValue);
  value[bytes].append(bytes);
  check(LibraryJson::writesAlike(value));
  Json::Value again;
  check(JsonText::fromText(JsonText::toText(value), again));
  check(again == value);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  const std::string text(data, data + size);
  checkText(text);
  checkBytes(text);
  return 0;
}
