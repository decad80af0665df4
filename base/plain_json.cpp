#include "base/plain_json.h"

#include "base/json_memory.h"

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>

namespace KOVA::Base {
namespace {

// The library counts the length of a member name in 30 bits.
constexpr std::size_t kLongestText = std::size_t{1} << 30;

// Far below the depth at which the library refuses a text.
constexpr int kDeepest = 64;

// Every function reads at the current position. After a text that is not plain, plain() is false
// for good, and what has been read so far is to be dropped.
class PlainReader {
public:
  explicit PlainReader(std::string_view text) : at_(text.data()), end_(text.data() + text.size()) {}

  bool plain() const { return plain_; }

  Json::Value readText() {
    Json::Value value = readValue(0);
    if (skipSpace() != kEnd) {
      plain_ = false;
    }
    return value;
  }

private:
  static constexpr int kEnd = -1;

  // Returns: the character after the white space, or kEnd.
  int skipSpace() {
    while (at_ != end_ && (*at_ == ' ' || *at_ == '\t' || *at_ == '\r' || *at_ == '\n')) {
      ++at_;
    }
    return at_ != end_ ? static_cast<unsigned char>(*at_) : kEnd;
  }

  Json::Value notPlain() {
    plain_ = false;
    return {};
  }

  Json::Value readValue(int depth) {
    switch (skipSpace()) {
    case '"':
      return readString();
    case '[':
      return depth < kDeepest ? readArray(depth + 1) : notPlain();
    case '{':
      return depth < kDeepest ? readObject(depth + 1) : notPlain();
    case 't':
      return readWord("true", true);
    case 'f':
      return readWord("false", false);
    case 'n':
      return readWord("null", Json::Value());
    default:
      return readInteger();
    }
  }

  Json::Value readWord(std::string_view word, Json::Value value) {
    if (std::string_view(at_, static_cast<std::size_t>(end_ - at_)).substr(0, word.size()) !=
        word) {
      return notPlain();
    }
    at_ += word.size();
    return value;
  }

  // A number with a point or an exponent ends where a separator is expected, and so is not plain.
  Json::Value readInteger() {
    std::int64_t number = 0;
    const auto result = std::from_chars(at_, end_, number);
    if (result.ec != std::errc()) {
      return notPlain();
    }
    at_ = result.ptr;
    return static_cast<Json::Int64>(number);
  }

  // Returns: the characters up to the next quotation mark or backslash.
  std::string_view readRun() {
    const char *const begin =
        std::exchange(at_, std::find_if(at_, end_, [](char c) { return c == '"' || c == '\\'; }));
    return {begin, static_cast<std::size_t>(at_ - begin)};
  }

  // Returns: the characters between the quotation marks. decoded holds them if some are escaped.
  std::string_view readCharacters(std::string &decoded) {
    ++at_;
    const std::string_view run = readRun();
    if (at_ != end_ && *at_ == '"') {
      ++at_;
      return run;
    }
    decoded = run;
    while (at_ == end_ || *at_ != '"') {
      if (!decodeEscape(decoded)) {
        return {};
      }
      decoded += readRun();
    }
    ++at_;
    return decoded;
  }

  // Escapes by number, which may come in pairs, are left to the library.
  bool decodeEscape(std::string &decoded) {
    constexpr std::string_view kLetters = "\"\\/bfnrt";
    constexpr std::string_view kDecoded = "\"\\/\b\f\n\r\t";
    const std::size_t letter = end_ - at_ < 2 ? std::string_view::npos : kLetters.find(at_[1]);
    if (letter == std::string_view::npos) {
      plain_ = false;
      return false;
    }
    decoded += kDecoded[letter];
    at_ += 2;
    return true;
  }

  Json::Value readString() {
    std::string decoded;
    const std::string_view text = readCharacters(decoded);
    return plain_ ? Json::Value(text.data(), text.data() + text.size()) : Json::Value();
  }

  // Returns: whether a list or an object that ends with the given bracket goes on.
  bool readSeparator(char closing) {
    const int next = skipSpace();
    plain_ = plain_ && (next == ',' || next == closing);
    if (plain_) {
      ++at_;
    }
    return plain_ && next == ',';
  }

  // Returns: whether the list or object is empty. It has then been read.
  bool readEmpty(char closing) {
    ++at_;
    const bool empty = skipSpace() == closing;
    at_ += empty ? 1 : 0;
    return empty;
  }

  Json::Value readArray(int depth) {
    Json::Value array(Json::arrayValue);
    if (readEmpty(']')) {
      return array;
    }
    do {
      array.append(readValue(depth));
    } while (readSeparator(']'));
    return array;
  }

  Json::Value readObject(int depth) {
    Json::Value object(Json::objectValue);
    if (readEmpty('}')) {
      return object;
    }
    do {
      readMember(object, depth);
    } while (readSeparator('}'));
    return object;
  }

  void readMember(Json::Value &object, int depth) {
    std::string decoded;
    plain_ = plain_ && skipSpace() == '"';
    const std::string_view name = plain_ ? readCharacters(decoded) : std::string_view();
    plain_ = plain_ && skipSpace() == ':';
    if (!plain_) {
      return;
    }
    ++at_;
    Json::Value value = readValue(depth);
    if (plain_) {
      object.demand(name.data(), name.data() + name.size())->swapPayload(value);
    }
  }

  const char *at_;
  const char *end_;
  bool plain_ = true;
};

} // namespace

bool readPlainJson(std::string_view text, Json::Value &value) {
  if (text.size() >= kLongestText) {
    return false;
  }
  return JsonMemory::withBadAlloc([&] {
    PlainReader reader(text);
    Json::Value read = reader.readText();
    if (reader.plain()) {
      value.swap(read);
    }
    return reader.plain();
  });
}

} // namespace KOVA::Base
