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

// The end of what the JSON library takes for one number. A std::string has a NUL at its end.
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

// The library lets comments pass in some places; a quote in one begins no string.
std::size_t afterComment(const std::string &text, std::size_t begin) {
  if (text[begin + 1] == '*') {
    const std::size_t end = text.find("*/", begin + 2);
    return end == std::string::npos ? end : end + 2;
  }
  return text[begin + 1] == '/' ? text.find_first_of("\n\r", begin) : begin + 1;
}

// Whether the JSON library keeps the number as a real, as it does one with a plus sign, which it
// lets pass. Whole ones are kept as such only while they fit 64 bits.
bool isReal(std::string_view number) {
  if (number.find_first_of("+.eE") != std::string_view::npos) {
    return true;
  }
  const bool negative = number.front() == '-';
  number.remove_prefix(negative ? 1 : 0);
  std::uint64_t whole = 0;
  const auto result = std::from_chars(number.data(), number.data() + number.size(), whole);
  return result.ec == std::errc::result_out_of_range || (negative && whole > kLargestNegative);
}

double readReal(const char *text, const char *&end) {
  static const locale_t plain = ::newlocale(LC_ALL_MASK, "C", nullptr); // no memory, never fails
  char *stopped = nullptr;
  const double value = ::strtod_l(text, &stopped, plain);
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
  masked_[begin] = '-'; // a sign stays one, so that what follows a number at once is refused still
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
