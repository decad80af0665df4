// The cost of filtering one path: PathFilter compared with a plain walk over its patterns, on the
// paths of a complete storage system. Both must leave out the same paths before either is measured.
// The patterns resemble those that users write, and most of them match no path on this machine.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

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
namespace Tree = KovaTest::Tree;

std::list<std::string> patterns(std::int64_t count) {
  std::list<std::string> all;
  for (int i = 0; i < count; ++i) {
    all.push_back(Tree::pattern(i));
  }
  return all;
}

const std::vector<std::string> &paths() {
  static const std::vector<std::string> all = Tree::paths();
  return all;
}

class Index {
public:
  explicit Index(std::int64_t count) {
    for (const std::string &pattern : patterns(count)) {
      filter_.addExcludePattern(pattern);
    }
  }
  bool leavesOut(const std::string &path) { return filter_.filterOut(path); }

private:
  PathFilter filter_;
};

class PlainWalk {
public:
  explicit PlainWalk(std::int64_t count) : patterns_(patterns(count)) {}
  bool leavesOut(const std::string &path) const {
    return std::any_of(patterns_.begin(), patterns_.end(), [&path](const std::string &pattern) {
      return PathFilterPrivate::match(pattern.c_str(), path.c_str()) == 1;
    });
  }

private:
  std::list<std::string> patterns_;
};

bool agree(Index &index, const PlainWalk &walk) {
  return std::all_of(paths().begin(), paths().end(), [&](const std::string &path) {
    return index.leavesOut(path) == walk.leavesOut(path);
  });
}

template <typename Filter>
void filterOut(benchmark::State &state) {
  Index index(state.range(0));
  if (!agree(index, PlainWalk(state.range(0)))) {
    state.SkipWithError("index and plain walk disagree");
    return;
  }
  Filter filter(state.range(0));
  std::int64_t leftOut = 0;
  for (auto _ : state) {
    leftOut = 0;
    for (const std::string &path : paths()) {
      leftOut += filter.leavesOut(path) ? 1 : 0;
    }
  }
  using Counter = benchmark::Counter;
  state.counters["perPath"] = Counter(static_cast<double>(paths().size()),
                                      Counter::kIsIterationInvariantRate | Counter::kInvert);
  state.counters["leftOut"] = static_cast<double>(leftOut);
}
BENCHMARK_TEMPLATE(filterOut, Index)->Arg(1)->Arg(10)->Arg(100)->Arg(1000)->Arg(10000);
BENCHMARK_TEMPLATE(filterOut, PlainWalk)->Arg(1)->Arg(10)->Arg(100)->Arg(1000)->Arg(10000);

void addAll(PathFilter &filter, const std::list<std::string> &all) {
  for (const std::string &pattern : all) {
    filter.addExcludePattern(pattern);
  }
}

void add(benchmark::State &state) {
  const std::list<std::string> all = patterns(state.range(0));
  for (auto _ : state) {
    PathFilter filter;
    addAll(filter, all);
    benchmark::DoNotOptimize(filter);
  }
  const auto bytesInUse = [] {
    const struct mallinfo2 info = ::mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
  };
  const double before = bytesInUse();
  PathFilter filter;
  addAll(filter, all);
  state.counters["bytesPerPattern"] = (bytesInUse() - before) / static_cast<double>(all.size());
  using Counter = benchmark::Counter;
  state.counters["perPattern"] = Counter(static_cast<double>(all.size()),
                                         Counter::kIsIterationInvariantRate | Counter::kInvert);
}
BENCHMARK(add)->Arg(100)->Arg(1000)->Arg(10000);

} // namespace
