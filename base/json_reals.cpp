#include "base/json_reals.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <locale.h> // NOLINT(modernize-deprecated-headers): locale_t
#include <string_view>

namespace KOVA::Base {
namespace {

constexpr std::string_view kDigits = "0123456789";
constexpr std::uint64_t kLargestNegative = std::uint64_t{1} << 63;

std::size_t afterDigits(const std::string &text, std::size_t at) {
  return std::min(text.find_first_not_of(kDigits, at), text.size());
}

// The end of what the JSON library takes for one number. text[text.size()] is a NUL, so that
// looking at the next character is always allowed.
std::size_t afterNumber(const std::string &text, std::size_t begin) {
  std::size_t at = afterDigits(text, begin + 1);
  if (text[at] == '.') {
    at = afterDigits(text, at + 1);
  }
  if (text[at] == 'e' || text[at] == 'E') {
    ++at;
    at = afterDigits(text, text[at] == '+' || text[at] == '-' ? at + 1 : at);
  }
  return at;
}

std::size_t afterString(const std::string &text, std::size_t begin) {
  std::size_t at = text.find_first_of("\"\\", begin + 1);
  while (at != std::string::npos && text[at] == '\\') {
    at = text.find_first_of("\"\\", at + 2);
  }
  return at == std::string::npos ? at : at + 1;
}

// The library allows comments in some places. A quotation mark in a comment does not begin a
// string.
std::size_t afterComment(const std::string &text, std::size_t begin) {
  if (text[begin + 1] == '*') {
    const std::size_t end = text.find("*/", begin + 2);
    return end == std::string::npos ? end : end + 2;
  }
  return text[begin + 1] == '/' ? text.find_first_of("\n\r", begin) : begin + 1;
}

// Whether the JSON library stores the number as a real. It does so with a number that has a plus
// sign, which it allows, and with an integer that does not fit 64 bits.
bool isReal(std::string_view number) {
  if (number.find_first_of("+.eE") != std::string_view::npos) {
    return true;
  }
  const bool negative = number.front() == '-';
  number.remove_prefix(negative ? 1 : 0);
  std::uint64_t magnitude = 0;
  const auto result = std::from_chars(number.data(), number.data() + number.size(), magnitude);
  return result.ec == std::errc::result_out_of_range || (negative && magnitude > kLargestNegative);
}

double readReal(const char *text, const char *&end) {
  // The C locale is built in: this allocates nothing and cannot fail.
  static const locale_t classic = ::newlocale(LC_ALL_MASK, "C", nullptr);
  char *stopped = nullptr;
  const double value = ::strtod_l(text, &stopped, classic);
  end = stopped;
  return value;
}

} // namespace

JsonReals::JsonReals(const std::string &text) : text_(text) {
  constexpr const char *kBegins = "\"/+-0123456789";
  std::size_t at = text.find_first_of(kBegins);
  while (at != std::string::npos) {
    if (text[at] == '"') {
      at = afterString(text, at);
    } else if (text[at] == '/') {
      at = afterComment(text, at);
    } else {
      const std::size_t end = afterNumber(text, at);
      takeNumber(at, end);
      at = end;
    }
    at = text.find_first_of(kBegins, at);
  }
}

void JsonReals::takeNumber(std::size_t begin, std::size_t end) {
  const char *const first = text_.c_str() + begin;
  if (!isReal({first, end - begin})) {
    return;
  }
  const char *stopped = nullptr;
  const double value = readReal(first, stopped);
  if (stopped != text_.c_str() + end || !std::isfinite(value)) {
    return;
  }
  if (reals_.empty()) {
    masked_ = text_;
  }
  const bool sign = *first == '-' || *first == '+';
  masked_.replace(begin, end - begin, end - begin, ' ');
  masked_[begin] = '-'; // a sign stays a sign: without it 1-2.5 would become 10
  masked_[sign ? begin + 1 : begin] = '0';
  reals_.push_back({static_cast<std::ptrdiff_t>(begin), value});
}

void JsonReals::restore(Json::Value &value) const {
  if (!reals_.empty()) {
    restoreIn(value);
  }
}

void JsonReals::restoreIn(Json::Value &value) const {
  if (value.isArray() || value.isObject()) {
    for (Json::Value &element : value) {
      restoreIn(element);
    }
    return;
  }
  const std::ptrdiff_t begin = value.getOffsetStart();
  const auto real =
      std::lower_bound(reals_.begin(), reals_.end(), begin,
                       [](const Real &one, std::ptrdiff_t offset) { return one.begin < offset; });
  if (real != reals_.end() && real->begin == begin) {
    Json::Value restored(real->value);
    value.swapPayload(restored);
  }
}

} // namespace KOVA::Base
