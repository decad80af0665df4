#include "base/json_text.h"

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <iterator>
#include <json/writer.h>
#include <string_view>

namespace KOVA::Base::JsonText {
namespace {

// As many digits as restore every real exactly.
constexpr unsigned kRealDigits = 17;

// Room for a name and a short value, so that the text of a map seldom has to grow. The limit is for
// lists whose elements are shorter.
constexpr std::size_t kLikelyLength = 32;
constexpr std::size_t kMostReserved = 65536;

// Appends values to a text. The library's writer gives the same text, but builds it in a stream
// from one string object for each name and value.
class Writer {
public:
  explicit Writer(std::string &out) : out_(out) {}

  void writeValue(const Json::Value &value) {
    switch (value.type()) {
    case Json::nullValue:
      out_ += "null";
      break;
    case Json::intValue:
      writeInteger(value.asLargestInt());
      break;
    case Json::uintValue:
      writeInteger(value.asLargestUInt());
      break;
    case Json::realValue:
      out_ += Json::valueToString(value.asDouble(), kRealDigits);
      break;
    case Json::stringValue:
      writeText(value);
      break;
    case Json::booleanValue:
      out_ += value.asBool() ? "true" : "false";
      break;
    case Json::arrayValue:
      writeArray(value);
      break;
    case Json::objectValue:
      writeObject(value);
      break;
    }
  }

private:
  template <typename Integer>
  void writeInteger(Integer number) {
    char digits[20]; // the longest are -9223372036854775808 and 18446744073709551615
    const auto result = std::to_chars(std::begin(digits), std::end(digits), number);
    out_.append(digits, result.ptr);
  }

  void writeText(const Json::Value &value) {
    const char *begin = nullptr;
    const char *end = nullptr;
    if (value.getString(&begin, &end)) {
      writeQuoted(begin, end);
    }
  }

  void writeArray(const Json::Value &array) {
    out_ += '[';
    const auto end = array.end();
    Json::ArrayIndex next = 0;
    for (auto element = array.begin(); element != end; ++element, ++next) {
      for (; next < element.index(); ++next) {
        out_ += "null,"; // an element that has never been set
      }
      writeValue(*element);
      out_ += ',';
    }
    close(']');
  }

  void writeObject(const Json::Value &object) {
    out_ += '{';
    const auto end = object.end();
    for (auto member = object.begin(); member != end; ++member) {
      const char *nameEnd = nullptr;
      const char *const name = member.memberName(&nameEnd);
      writeQuoted(name, nameEnd);
      out_ += ':';
      writeValue(*member);
      out_ += ',';
    }
    close('}');
  }

  // The bracket replaces the comma after the last element.
  void close(char bracket) {
    if (out_.back() == ',') {
      out_.back() = bracket;
    } else {
      out_ += bracket;
    }
  }

  static bool mustEscape(char c) {
    return static_cast<unsigned char>(c) < 0x20 || c == '"' || c == '\\';
  }

  void writeQuoted(const char *begin, const char *end) {
    out_ += '"';
    while (true) {
      const char *const stop = std::find_if(begin, end, mustEscape);
      out_.append(begin, stop);
      if (stop == end) {
        break;
      }
      writeEscape(*stop);
      begin = stop + 1;
    }
    out_ += '"';
  }

  void writeEscape(char c) {
    constexpr std::string_view kEscaped = "\"\\\b\f\n\r\t";
    constexpr std::string_view kLetters = "\"\\bfnrt";
    constexpr char kHexDigits[] = "0123456789abcdef";
    out_ += '\\';
    const std::size_t at = kEscaped.find(c);
    if (at != std::string_view::npos) {
      out_ += kLetters[at];
      return;
    }
    out_ += "u00";
    out_ += kHexDigits[static_cast<unsigned char>(c) / 16];
    out_ += kHexDigits[static_cast<unsigned char>(c) % 16];
  }

  std::string &out_;
};

} // namespace

std::string toText(const Json::Value &value) {
  std::string text;
  text.reserve(std::min(value.size() * kLikelyLength, kMostReserved));
  Writer(text).writeValue(value);
  return text;
}

} // namespace KOVA::Base::JsonText
