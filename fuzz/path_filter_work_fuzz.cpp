// How much work the path filter does. All lines but the last are patterns, and the last one is
// repeated to a path of 1 KB. No query may enter more basic blocks than the sizes of the path
// and of the patterns explain.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "fuzz/support.h"
#include "tests/path/filter/path_filter_steps.h"

#include <list>

namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::PathFilterPrivate;
using KovaTest::stepsOf;

using Strings = std::list<std::string>;

constexpr std::size_t kPathSize = 1024;
constexpr std::size_t kStepsPerByte = 16; // for each pattern, and for each 64 bytes of one

void requireAtMost(std::uint64_t most, std::uint64_t steps) {
  KovaFuzz::require(steps <= most);
}

std::size_t wordsOf(const std::string &pattern) {
  return 1 + pattern.size() / 64;
}

void check(const Strings &patterns, const std::string &path) {
  PathFilter filter;
  std::size_t words = 1;
  std::size_t bytes = 1;
  for (const std::string &pattern : patterns) {
    filter.addExcludePattern(pattern);
    words += wordsOf(pattern);
    bytes += pattern.size();
    requireAtMost(kPathSize * kStepsPerByte * wordsOf(pattern),
                  stepsOf([&] { PathFilterPrivate::match(pattern.c_str(), path.c_str()); }));
  }
  requireAtMost(kPathSize * kStepsPerByte * words, stepsOf([&] { filter.filterOut(path); }));
  // Each element may meet each byte of the base once.
  requireAtMost(kPathSize * kStepsPerByte * bytes, stepsOf([&] {
                  Strings out;
                  filter.getExcludePattern(out, "/" + path);
                }));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  Strings lines;
  while (!input.empty()) {
    lines.push_back(input.until('\n'));
  }
  if (lines.empty() || lines.back().empty()) {
    return 0;
  }
  std::string path;
  while (path.size() < kPathSize) {
    path += lines.back();
  }
  lines.pop_back();
  check(lines, path);
  return 0;
}
