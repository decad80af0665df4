#include "temp_manager/temp_name.h"

#include "kovabackup/path_util.h"

#include <string_view>

namespace KOVA::Backup::TempName {
namespace {

constexpr std::string_view kPlaceholder = "XXXXXX";
constexpr const char *kSuffix = ".XXXXXX";

// The limits of a name and a path, 255 and 4095 bytes, less the 7 bytes of the suffix.
constexpr std::size_t kMostNameBytes = 248;
constexpr std::size_t kMostPathBytes = 4088;

// Cuts text at a position inside it, or before the UTF-8 character that this position would split.
std::string cutAt(const std::string &text, std::size_t position) {
  while (position > 0 && (static_cast<unsigned char>(text[position]) & 0xc0U) == 0x80U) {
    --position;
  }
  return text.substr(0, position);
}

} // namespace

bool isTemplate(const std::string &name) {
  return name.size() >= kPlaceholder.size() &&
         name.compare(name.size() - kPlaceholder.size(), kPlaceholder.size(), kPlaceholder) == 0;
}

std::string templateFor(const std::string &name, const char *defaultTemplate) {
  if (name.empty()) {
    return defaultTemplate;
  }
  return isTemplate(name) ? name : name + kSuffix;
}

std::string shortened(const std::string &name) {
  if (!name.empty() && name.back() == '/') {
    return name;
  }
  const std::string dir = Path::dirname(name);
  std::string base = Path::basename(name);
  if (base.size() > kMostNameBytes) {
    base = cutAt(base, kMostNameBytes);
  }
  std::string joined = Path::join(dir, base);
  if (joined.size() <= kMostPathBytes) {
    return joined;
  }
  const std::size_t excess = joined.size() - kMostPathBytes;
  if (excess > base.size()) {
    return joined; // the directory alone is too long, and it is never cut
  }
  return Path::join(dir, cutAt(base, base.size() - excess));
}

std::uint32_t hashOf(const std::string &path) {
  std::uint32_t hash = 5381;
  for (const char byte : path) {
    hash = hash * 33 + static_cast<unsigned char>(byte);
  }
  return hash;
}

} // namespace KOVA::Backup::TempName
