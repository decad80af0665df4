#include "service/session_mounts.h"

#include "service/words.h"

#include <cstddef>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

bool isOctal(std::string_view text) {
  return text.size() == 3 && text.find_first_not_of("01234567") == std::string_view::npos;
}

// The kernel writes white space and backslashes as a backslash and three octal digits.
std::string unescape(std::string_view text) {
  std::string plain;
  for (std::size_t at = 0; at < text.size(); ++at) {
    const std::string_view digits = text.substr(at + 1, 3);
    if (text[at] == '\\' && isOctal(digits)) {
      plain += static_cast<char>((digits[0] - '0') * 64 + (digits[1] - '0') * 8 + digits[2] - '0');
      at += 3;
    } else {
      plain += text[at];
    }
  }
  return plain;
}

} // namespace

bool hasSessionComponent(std::string_view path) {
  return path.find("/sess.") != std::string_view::npos ||
         path.find("/seln.") != std::string_view::npos;
}

// A line reads "36 35 98:0 ROOT POINT rw,noatime ...".
std::vector<SessionMount> findSessionMounts(std::string_view text, const std::string &rootFolder) {
  std::vector<SessionMount> mounts;
  const std::string_view prefix = rootFolder == "/" ? std::string_view() : rootFolder;
  while (!text.empty()) {
    std::string_view line = takeLine(text);
    for (int skipped = 0; skipped < 3; ++skipped) {
      (void)takeWord(line);
    }
    const std::string_view root = takeWord(line);
    const std::string_view point = takeWord(line);
    if (hasSessionComponent(root)) {
      std::string shown(prefix);
      if (point != "/") {
        shown += unescape(point);
      }
      mounts.push_back({std::move(shown), unescape(root)});
    }
  }
  return mounts;
}

bool isWithin(std::string_view path, std::string_view folder) {
  return path.substr(0, folder.size()) == folder &&
         (path.size() == folder.size() || path[folder.size()] == '/');
}

} // namespace KOVA::Backup::Service
