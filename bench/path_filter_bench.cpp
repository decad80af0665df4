// PathFilter raced against a plain walk over its patterns, and adding patterns to it against adding
// them to a list. The paths and patterns are those of tests/path/filter/path_filter_tree.h: a
// made-up storage system, in the order of its folders, and lists that resemble those of users. Most
// patterns match no path. Both must leave out the same paths.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include "bench/race.h"
#include "tests/path/filter/path_filter_tree.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <list>
#include <malloc.h>
#include <string>
#include <vector>

namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::PathFilterPrivate;
using KovaBench::Race;
using KovaBench::rounds;
namespace Tree = KovaTest::Tree;

std::list<std::string> patterns(std::int64_t count) {
  std::list<std::string> all;
  for (int i = 0; i < count; ++i) {
    all.push_back(Tree::pattern(i));
  }
  return all;
}

// One path in so many: the plain walk with many patterns is slow.
std::vector<std::string> pathsFor(std::int64_t patternCount) {
  const std::vector<std::string> all = Tree::paths();
  std::vector<std::string> some;
  for (std::size_t at = 0; at < all.size(); at += 1 + static_cast<std::size_t>(patternCount) / 50) {
    some.push_back(all[at]);
  }
  return some;
}

void addAll(PathFilter &filter, const std::list<std::string> &all) {
  for (const std::string &pattern : all) {
    filter.addExcludePattern(pattern);
  }
}

bool anyMatches(const std::list<std::string> &patterns, const std::string &path) {
  return std::any_of(patterns.begin(), patterns.end(), [&path](const std::string &pattern) {
    return PathFilterPrivate::match(pattern.c_str(), path.c_str()) == 1;
  });
}

void filterOut(benchmark::State &state) {
  const std::list<std::string> list = patterns(state.range(0));
  const std::vector<std::string> paths = pathsFor(state.range(0));
  PathFilter filter;
  addAll(filter, list);
  const auto leftOut = [&] {
    return std::count_if(paths.begin(), paths.end(),
                         [&](const std::string &path) { return filter.filterOut(path); });
  };
  const auto leftOutByWalk = [&] {
    return std::count_if(paths.begin(), paths.end(),
                         [&](const std::string &path) { return anyMatches(list, path); });
  };
  const auto expected = leftOutByWalk();
  Race(
      state, [&] { return leftOut() == expected; }, static_cast<double>(paths.size()))
      .peer("plain_walk", [&] { return leftOutByWalk() == expected; })
      .run();
}
BENCHMARK(filterOut)->Arg(1)->Arg(10)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

double bytesPerPattern(const std::list<std::string> &list) {
  const auto bytesInUse = [] {
    const struct mallinfo2 info = ::mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
  };
  const double before = bytesInUse();
  PathFilter filter;
  addAll(filter, list);
  return (bytesInUse() - before) / static_cast<double>(list.size());
}

void add(benchmark::State &state) {
  const std::list<std::string> list = patterns(state.range(0));
  const auto addToFilter = [&] {
    PathFilter filter;
    addAll(filter, list);
    return filter.filterOut("/volume1/homes/user00/Documents/x");
  };
  const auto addToList = [&] {
    std::list<std::string> copy;
    copy.insert(copy.end(), list.begin(), list.end());
    return copy.size() == list.size();
  };
  Race(state, addToFilter, static_cast<double>(list.size())).peer("list", addToList).run();
  state.counters["bytes_a_pattern"] = bytesPerPattern(list);
}
BENCHMARK(add)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

} // namespace
