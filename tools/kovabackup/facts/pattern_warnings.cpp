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

// Whether an absolute path, which begins with a slash, may match. An escaped slash is a slash.
bool mayBeginInSlash(const std::string &pattern) {
  const char first = pattern[0] == '\\' ? pattern[1] : pattern[0];
  return first == '/' || first == '*' || first == '?';
}

// A normalised path has neither an empty name in it nor one of these two.
bool needsUnusualPath(const std::string &pattern) {
  const std::string closed = pattern + '/';
  return has(pattern, "//") || has(closed, "/./") || has(closed, "/../");
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
  } else if (!mayBeginInSlash(pattern) && pattern[0] != '!') {
    warnings.emplace_back("never matches an absolute path: begin it with / or **/");
  }
  if (needsUnusualPath(pattern)) {
    warnings.emplace_back("never matches a normalised path: leave out //, /./ and /../");
  }
  return warnings;
}

} // namespace KOVA::Backup::Tool
