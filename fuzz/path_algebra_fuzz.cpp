// Paths, one on each line: every function of the path algebra returns what its plain rules return,
// for the first path, for the first with the second one and for all of them. What a function
// returns may be assigned to its argument. What split takes apart, join puts together.

#include "kovabackup/path_kova.h"
#include "kovabackup/path_util.h"

#include "fuzz/support.h"
#include "tests/path/plain_path.h"

#include <filesystem>

namespace {

namespace ConfigPath = KOVA::Backup::ConfigPath;
namespace Path = KOVA::Backup::Path;
namespace PlainPath = KovaTest::PlainPath;
using KovaFuzz::require;
using PlainPath::Parts;

constexpr std::size_t kMostParts = 7; // of the longest form of join

std::string plainAbsPath(const std::string &path) {
  static const std::string current = std::filesystem::current_path().string();
  return !path.empty() && path[0] == '/' ? path : PlainPath::join(current, path);
}

void checkSplit(const std::string &path) {
  Parts parts = {"left", "over"};
  require(Path::split(path, parts));
  require(parts == PlainPath::split(path));
  require(Path::token(path, 0) == PlainPath::token(path, 0));
  for (unsigned index = 1; index <= parts.size() + 1; ++index) {
    require(Path::token(path, index) == (index < parts.size() ? parts[index] : ""));
  }
  Parts aliased = {path};
  require(Path::split(aliased[0], aliased) && aliased == parts);
}

// Components that are a lone "." are lost.
void checkRestored(const std::string &path) {
  if (path.find('.') != std::string::npos) {
    return;
  }
  Parts parts;
  Parts again;
  require(Path::split(path, parts) && Path::split(Path::join(parts), again));
  require(again == parts);
}

void checkOne(const std::string &path) {
  checkSplit(path);
  checkRestored(path);
  require(Path::dirname(path) == PlainPath::dirname(path));
  require(Path::basename(path) == PlainPath::basename(path));
  require(Path::absPath(path) == plainAbsPath(path));
  require(Path::isInKovaEaDir(path) == PlainPath::isInEaDir(path));
  require(ConfigPath::shareName(path) == PlainPath::shareName(path));
  require(ConfigPath::shareRelativePath(path) == PlainPath::shareRelativePath(path));
}

void checkTwo(const std::string &a, const std::string &b) {
  require(Path::join(a, b) == PlainPath::join(a, b));
  require(Path::common(a, b) == PlainPath::common(a, b));
  require(Path::relative(a, b) == PlainPath::relative(a, b));
  std::string aliased = a;
  aliased = Path::join(aliased, aliased);
  require(aliased == PlainPath::join(a, a));
}

void checkAll(Parts paths) {
  require(Path::join(paths) == PlainPath::joinAll(paths));
  paths.resize(kMostParts);
  require(Path::join(paths[0], paths[1], paths[2], paths[3], paths[4], paths[5], paths[6]) ==
          PlainPath::joinSeven(paths));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  Parts paths;
  while (!input.empty() && paths.size() < kMostParts) {
    paths.push_back(input.until('\n'));
  }
  paths.resize(std::max<std::size_t>(paths.size(), 2));
  checkOne(paths[0]);
  checkTwo(paths[0], paths[1]);
  checkTwo(paths[1], paths[0]);
  checkAll(paths);
  return 0;
}
