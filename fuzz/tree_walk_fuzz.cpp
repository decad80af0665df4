// A walk through a tree of real files, with patterns and options. The entries are those of a plain
// listing by the rules in tree_walk.h, in the order of their names, each with what lstat says about
// it, whether it is kept, the pattern that decided and the target of a link. No descriptor is left.
//
// Input: one byte of options, one for the entry at which skipFolder is called, the tree as
// fuzz/tree.h says, and patterns, one on each line: "+PATTERN" includes, any other line excludes.

#include "kovabackup/service/tree_walk.h"

#include "fuzz/support.h"
#include "fuzz/tree.h"
#include "tests/path/filter/path_filter_oracle.h"
#include "tests/service/tree_walk_rules.h"

#include <list>
#include <optional>

namespace {

namespace fs = std::filesystem;
namespace Oracle = KovaTest::Oracle;
using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;
using KovaFuzz::require;

constexpr const char *kRoot = "/tmp/walk";
constexpr unsigned kLeftOutStaysOpen = 1;
constexpr unsigned kLeaveOut = 2;
constexpr unsigned kSkip = 4;

struct Settings {
  std::list<std::string> includes;
  std::list<std::string> excludes;
  WalkOptions options;
  std::optional<std::size_t> skipped; // the number of an entry
};

std::optional<std::string> firstMatch(const std::list<std::string> &patterns,
                                      const std::string &path) {
  for (const std::string &pattern : patterns) {
    if (Oracle::covers(pattern, path)) {
      return pattern;
    }
  }
  return std::nullopt;
}

// The listing by the rules.
class Plain {
public:
  explicit Plain(const Settings &settings) : settings_(settings) { visit(kRoot); }

  std::vector<std::string> paths;

  bool isKept(const std::string &path) const {
    return firstMatch(settings_.includes, path) || !firstMatch(settings_.excludes, path);
  }

private:
  void visit(const std::string &path) {
    const std::vector<std::string> &leaveOut = settings_.options.leaveOut;
    if (std::find(leaveOut.begin(), leaveOut.end(), path) != leaveOut.end()) {
      return;
    }
    const bool skipped = settings_.skipped == paths.size();
    paths.push_back(path);
    if (skipped || !fs::is_directory(fs::symlink_status(path)) || !mayEnter(path)) {
      return;
    }
    std::vector<std::string> names;
    for (const fs::directory_entry &entry : fs::directory_iterator(path)) {
      names.push_back(entry.path().filename().string());
    }
    std::sort(names.begin(), names.end());
    for (const std::string &name : names) {
      visit(path + "/" + name);
    }
  }

  bool mayEnter(const std::string &folder) const {
    const bool includedBelow =
        std::any_of(settings_.includes.begin(), settings_.includes.end(), [&](const auto &pattern) {
          return KovaTest::reaches(pattern.c_str(), (folder + "/").c_str());
        });
    const bool excludedBelow =
        std::any_of(settings_.excludes.begin(), settings_.excludes.end(), [&](const auto &pattern) {
          return KovaTest::endsInDoubleStar(pattern) && Oracle::covers(pattern, folder + "/");
        });
    const bool closed = settings_.options.leftOutCloses && !isKept(folder);
    return includedBelow || (!closed && !excludedBelow);
  }

  const Settings &settings_;
};

void checkTarget(TreeWalk &walk, const WalkEntry &entry) {
  std::string target = "before";
  Error error;
  if (S_ISLNK(entry.mode)) {
    require(walk.linkTarget(target, error) && target == fs::read_symlink(entry.path).string());
  } else {
    require(!walk.linkTarget(target, error) && error.code == EINVAL && target == "before");
  }
}

void checkEntry(TreeWalk &walk, const WalkEntry &entry, const Settings &settings, bool kept) {
  struct stat found = {};
  require(entry.error.code == 0 && ::lstat(entry.path.c_str(), &found) == 0);
  require(entry.mode == found.st_mode && entry.inode == found.st_ino &&
          entry.device == found.st_dev && entry.links == found.st_nlink &&
          entry.size == static_cast<std::uint64_t>(found.st_size) && entry.uid == found.st_uid);
  require(entry.kept == kept);
  const auto decided = firstMatch(kept ? settings.includes : settings.excludes, entry.path);
  std::string pattern = "before";
  require(walk.decidedBy(pattern) == decided.has_value());
  require(pattern == decided.value_or("before"));
  checkTarget(walk, entry);
}

void checkWalk(const Settings &settings) {
  const Plain plain(settings);
  PathFilter filter;
  for (const std::string &pattern : settings.includes) {
    filter.addIncludePattern(pattern);
  }
  for (const std::string &pattern : settings.excludes) {
    filter.addExcludePattern(pattern);
  }
  TreeWalk walk(kRoot, filter, settings.options);
  WalkEntry entry;
  for (std::size_t i = 0; i < plain.paths.size(); ++i) {
    require(walk.next(entry) && entry.path == plain.paths[i]);
    checkEntry(walk, entry, settings, plain.isKept(entry.path));
    if (settings.skipped == i) {
      walk.skipFolder();
    }
  }
  require(!walk.next(entry) && !walk.next(entry));
}

Settings takeSettings(KovaFuzz::Input &input) {
  constexpr std::size_t kMostBytes = 40; // the rules try every combination of places
  Settings settings;
  while (!input.empty()) {
    const std::string line = input.until('\n').substr(0, kMostBytes);
    const bool isInclude = !line.empty() && line[0] == '+';
    const std::string pattern = line.substr(isInclude ? 1 : 0).c_str();
    if (std::count(pattern.begin(), pattern.end(), '*') <= 4) {
      (isInclude ? settings.includes : settings.excludes).push_back(pattern);
    }
  }
  return settings;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const unsigned flags = input.byte();
  const std::size_t skipped = input.byte() % 16;
  KovaFuzz::Tree tree(kRoot);
  tree.make(input);
  const std::string leftOut = (flags & kLeaveOut) != 0 ? tree.somePath(input) : "";
  Settings settings = takeSettings(input);
  settings.options.leftOutCloses = (flags & kLeftOutStaysOpen) == 0;
  if (!leftOut.empty()) {
    settings.options.leaveOut = {leftOut};
  }
  if ((flags & kSkip) != 0) {
    settings.skipped = skipped;
  }
  const int free = KovaFuzz::nextDescriptor();
  checkWalk(settings);
  require(KovaFuzz::nextDescriptor() == free);
  return 0;
}
