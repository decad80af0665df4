// A walk through /usr raced against find(1), which prints the same fields of each entry. Both run
// as child processes, and must see the same number of entries.
//
// The argument is how many patterns the walk has. None of them leaves out an entry of /usr:
// otherwise the walk would have less to do. KOVA_BENCH_ROOT names another tree.

#include "kovabackup/service/tree_walk.h"

#include "bench/child_times.h"
#include "bench/race.h"
#include "tests/path/filter/path_filter_tree.h"

#include <array>
#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <unistd.h>

namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::Service::TreeWalk;
using KOVA::Backup::Service::WalkEntry;
using namespace KovaBench;

constexpr char kFormat[] = "%p %y %s %T@ %C@ %U %G %i %D\n";

std::string root() {
  const char *const chosen = std::getenv("KOVA_BENCH_ROOT");
  return chosen == nullptr ? "/usr" : chosen;
}

// As users write them, but for the tree that is walked: "/volume1" becomes "/usr". One in four is
// an include pattern.
void addPatterns(PathFilter &filter, std::int64_t count) {
  for (int i = 0; i < count; ++i) {
    // The general ones match files of /usr.
    std::string pattern = i < 10 ? "**/leftover" : KovaTest::Tree::pattern(i);
    if (pattern.rfind("/volume", 0) == 0) {
      pattern.replace(0, pattern.find('/', 1), root());
    }
    if (i % 4 == 3) {
      filter.addIncludePattern(pattern);
    } else {
      filter.addExcludePattern(pattern);
    }
  }
}

std::int64_t walk(std::int64_t patterns) {
  PathFilter filter;
  addPatterns(filter, patterns);
  TreeWalk walk(root(), filter);
  std::int64_t kept = 0;
  for (WalkEntry entry; walk.next(entry);) {
    kept += entry.kept && entry.error.code == 0 ? 1 : 0;
  }
  return kept;
}

bool walkInChild(std::int64_t patterns, std::int64_t entries) {
  return timesOfChild([&] { ::_exit(walk(patterns) == entries ? 0 : 1); }).cpu >= 0;
}

bool findInChild() {
  return timesOfChild([] {
           const int null = ::open("/dev/null", O_WRONLY);
           ::dup2(null, STDOUT_FILENO);
           ::execlp("find", "find", root().c_str(), "-printf", kFormat, nullptr);
         }).cpu >= 0;
}

std::int64_t countByFind() {
  std::FILE *const lines = ::popen(("find " + root() + " -printf x").c_str(), "re");
  std::int64_t count = 0;
  std::array<char, 65536> text = {};
  for (std::size_t size = 1; size > 0; count += static_cast<std::int64_t>(size)) {
    size = std::fread(text.data(), 1, text.size(), lines);
  }
  ::pclose(lines);
  return count;
}

void treeWalk(benchmark::State &state) {
  const std::int64_t entries = countByFind();
  Race(
      state, [&] { return walkInChild(state.range(0), entries); }, static_cast<double>(entries))
      .peer("find", findInChild, state.range(0) > 100 ? 1.5 : 1.2)
      .run();
}
BENCHMARK(treeWalk)->Arg(0)->Arg(100)->Arg(10000)->Apply(rounds);

// The pattern that decided, when it is the last of so many.
void decidedBy(benchmark::State &state) {
  PathFilter filter;
  for (int i = 1; i < state.range(0); ++i) {
    filter.addExcludePattern(i < 10 ? "**/leftover" : KovaTest::Tree::pattern(i));
  }
  filter.addExcludePattern(root());
  TreeWalk walk(root(), filter);
  WalkEntry entry;
  std::string pattern;
  if (!walk.next(entry)) {
    state.SkipWithError("the tree has no entries");
    return;
  }
  Race(state, [&] { return walk.decidedBy(pattern) && pattern == root(); }).run();
}
BENCHMARK(decidedBy)->Arg(100)->Arg(10000)->Apply(rounds);

} // namespace
