#include "temp_manager/temp_name.h"

#include "kovabackup/path_util.h"

#include <string_view>

namespace KOVA::Backup::TempName {
namespace {

constexpr std::string_view kPlaces = "XXXXXX";
constexpr const char *kSuffix = ".XXXXXX";

// What a name and a path may have before the suffix of 7 bytes: 255 and 4095 bytes are the limits.
constexpr std::size_t kMostNameBytes = 248;
constexpr std::size_t kMostPathBytes = 4088;

// Cuts text at a position inside it, or before it when a character goes on there.
std::string cutAt(const std::string &text, std::size_t position) {
  while (position > 0 && (static_cast<unsigned char>(text[position]) & 0xc0U) == 0x80U) {
    --position;
  }
  return text.substr(0, position);
}

} // namespace

bool isTemplate(const std::string &name) {
  return name.size() >= kPlaces.size() &&
         name.compare(name.size() - kPlaces.size(), kPlaces.size(), kPlaces) == 0;
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
    return joined; // the directory alone is too long, and that is not ours to change
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
