#include "tools/kovabackup/facts/pattern_warnings.h"

namespace KOVA::Backup::Tool {
namespace {

// The bytes of a pattern that no backslash escapes.
struct Unescaped {
  std::string bytes;
  bool endsInBackslash = false; ///< one that escapes nothing
};

Unescaped unescapedIn(const std::string &pattern) {
  Unescaped found;
  for (std::size_t i = 0; i < pattern.size(); ++i) {
    if (pattern[i] == '\\') {
      found.endsInBackslash = i + 1 == pattern.size();
      ++i;
    } else {
      found.bytes += pattern[i];
    }
  }
  return found;
}

bool has(const std::string &text, const char *part) {
  return text.find(part) != std::string::npos;
}

} // namespace

std::vector<std::string> warningsAbout(const std::string &pattern) {
  const Unescaped plain = unescapedIn(pattern);
  if (plain.endsInBackslash) {
    return {"never matches: the backslash at its end escapes nothing"};
  }
  if (pattern.empty()) {
    return {"matches only an empty path"};
  }
  std::vector<std::string> warnings;
  if (pattern[0] == '!') {
    warnings.emplace_back("'!' does not negate, it matches itself; use an include pattern, or "
                          "write \\! if it is meant");
  }
  if (has(plain.bytes, "[")) {
    warnings.emplace_back("'[' matches itself, there are no bracket classes; write \\[ if it is "
                          "meant");
  }
  if (has(plain.bytes, "{")) {
    warnings.emplace_back("'{' matches itself, there are no alternatives in braces; write \\{ if "
                          "it is meant");
  }
  if (pattern.back() == '/') {
    warnings.emplace_back("matches only paths that end in a slash; end it in /** for what is in "
                          "the folder");
  }
  if (!has(pattern, "/") && !has(plain.bytes, "**")) {
    warnings.emplace_back("matches only paths without a slash; begin it with **/ for any depth");
  }
  return warnings;
}

} // namespace KOVA::Backup::Tool
