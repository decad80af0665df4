#include "platform/core/section_text.h"

namespace KOVA::Platform {
namespace {

constexpr std::string_view kBlanks = " \t\n\r";
constexpr std::string_view kLineEnds = "\n\r";

bool holdsAny(std::string_view text, std::string_view characters) {
  return text.find_first_of(characters) != std::string_view::npos;
}

} // namespace

std::string_view trim(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) {
    return {};
  }
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

bool isStorableKey(std::string_view key) {
  return isStorableSectionName(key) && !holdsAny(key, "=") && key.front() != '#' &&
         key.front() != '[';
}

bool isStorableValue(std::string_view value) {
  return !holdsAny(value, kLineEnds);
}

bool isStorableSectionName(std::string_view name) {
  return !name.empty() && trim(name).size() == name.size() && !holdsAny(name, kLineEnds);
}

} // namespace KOVA::Platform
