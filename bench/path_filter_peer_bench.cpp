// PathFilter raced against RE2 and RE2::Set, which answer the same question for the same patterns,
// each translated to a regular expression. They must leave out the same paths.
//
// The paths are those of /usr, or of KOVA_BENCH_ROOT: in the order in which a directory iterator
// walks the tree, and shuffled. The peer is warm: it has seen all paths before it is measured.
// With 10,000 patterns it would need gigabytes for all of them, so only the first kShare are taken.
// There a second race is against the same filter with 100 of its patterns.
//
// getExcludePattern has no peer. It is raced against itself with a base of half the size, which
// shows whether its time grows as the base does.

#include "kovabackup/path_filter.h"

#include "bench/race.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <cstdlib>
#include <filesystem>
#include <list>
#include <malloc.h>
#include <random>
#include <re2/re2.h>
#include <re2/set.h>
#include <string>
#include <vector>

namespace {

using KOVA::Backup::PathFilter;
using KovaBench::Race;
using KovaBench::rounds;
using Strings = std::vector<std::string>;

std::string regexOf(const std::string &pattern) {
  std::string regex;
  for (std::size_t at = 0; at < pattern.size(); ++at) {
    if (pattern[at] == '*') {
      const std::size_t end = std::min(pattern.find_first_not_of('*', at), pattern.size());
      regex += end - at > 1 ? "(?s:.*)" : "[^/]*";
      at = end - 1;
    } else if (pattern[at] == '?') {
      regex += "[^/]";
    } else {
      at += pattern[at] == '\\' ? 1U : 0U;
      regex += RE2::QuoteMeta(pattern.substr(at, 1));
    }
  }
  return regex;
}

RE2::Options options() {
  RE2::Options all;
  all.set_encoding(RE2::Options::EncodingLatin1);
  all.set_never_capture(true);
  all.set_max_mem(std::int64_t{1} << 30);
  return all;
}

class OneRegex {
public:
  explicit OneRegex(const Strings &patterns) : regex_(regexOf(patterns.front()), options()) {}
  bool leavesOut(const std::string &path) const { return RE2::FullMatch(path, regex_); }

private:
  RE2 regex_;
};

class RegexSet {
public:
  explicit RegexSet(const Strings &patterns) : set_(options(), RE2::ANCHOR_BOTH) {
    for (const std::string &pattern : patterns) {
      set_.Add(regexOf(pattern), nullptr);
    }
    set_.Compile();
  }
  bool leavesOut(const std::string &path) const { return set_.Match(path, nullptr); }

private:
  RE2::Set set_;
};

class Filter {
public:
  explicit Filter(const Strings &patterns) {
    for (const std::string &pattern : patterns) {
      filter_.addExcludePattern(pattern);
    }
  }
  bool leavesOut(const std::string &path) { return filter_.filterOut(path); }

private:
  PathFilter filter_;
};

template <typename Any>
std::ptrdiff_t countOf(Any &filter, const Strings &paths) {
  return std::count_if(paths.begin(), paths.end(),
                       [&filter](const std::string &path) { return filter.leavesOut(path); });
}

struct Goals {
  double peer;
  double of100Patterns = 0; // 0: not raced
};

// Peer: what RE2 offers for the patterns.
template <typename Peer>
void race(benchmark::State &state, const Strings &patterns, const Strings &paths, Goals goals) {
  Filter filter(patterns);
  Peer peer(patterns);
  for (const std::string &path : paths) {
    if (filter.leavesOut(path) != peer.leavesOut(path)) {
      state.SkipWithError(("they disagree about " + path.substr(0, 200)).c_str());
      return;
    }
  }
  const std::ptrdiff_t leftOut = countOf(peer, paths);
  Race race(
      state, [&] { return countOf(filter, paths) == leftOut; }, static_cast<double>(paths.size()));
  race.peer(
      "re2", [&] { return countOf(peer, paths) == leftOut; }, goals.peer);
  Filter of100(Strings(patterns.begin(),
                       patterns.begin() + std::min<std::ptrdiff_t>(
                                              100, static_cast<std::ptrdiff_t>(patterns.size()))));
  if (goals.of100Patterns > 0) {
    race.peer(
        "100_patterns", [&] { return countOf(of100, paths) <= leftOut; }, goals.of100Patterns);
  }
  race.run();
  state.counters["left_out"] = static_cast<double>(leftOut) / static_cast<double>(paths.size());
}

Strings pathsOfWalk() {
  namespace fs = std::filesystem;
  const char *const chosen = std::getenv("KOVA_BENCH_ROOT");
  Strings paths;
  const auto skip = fs::directory_options::skip_permission_denied;
  for (const fs::directory_entry &entry :
       fs::recursive_directory_iterator(chosen == nullptr ? "/usr" : chosen, skip)) {
    paths.push_back(entry.path().string());
  }
  return paths;
}

const Strings &walkOrder() {
  static const Strings paths = pathsOfWalk();
  return paths;
}

const Strings &randomOrder() {
  static const Strings paths = [] {
    Strings all = walkOrder();
    std::mt19937 random(3);
    std::shuffle(all.begin(), all.end(), random);
    return all;
  }();
  return paths;
}

// Makes patterns of paths of the tree. In three of four, a name is changed so that it does not
// exist: most patterns of a list apply to other machines, or to files that are gone.
class Patterns {
public:
  std::string next() {
    const std::string path = walkOrder()[random_() % walkOrder().size()];
    const std::size_t slash = path.rfind('/');
    const std::string folder = path.substr(0, slash);
    const std::string name = path.substr(slash + 1);
    const std::string changed = random_() % 4 == 0 ? name : name + std::to_string(random_() % 1000);
    const std::size_t dot = changed.rfind('.');
    switch (number_++ % 10) {
    case 0:
    case 1:
    case 2:
      return escaped(folder + "/" + changed);
    case 3:
    case 4:
      return escaped(folder + "/" + changed) + "/**";
    case 5:
    case 6:
      return "**/" + escaped(changed);
    case 7:
      return "**." + escaped(dot == std::string::npos ? changed : changed.substr(dot + 1) + "x");
    case 8:
      return "**/" + escaped(changed) + "/**";
    default:
      return escaped(folder) + (changed.size() < 2 ? "/?" : "/?" + escaped(changed.substr(1)));
    }
  }

private:
  static std::string escaped(const std::string &text) {
    std::string all;
    for (const char byte : text) {
      all += byte == '*' || byte == '?' || byte == '\\' || byte == '[' ? "\\" : "";
      all += byte;
    }
    return all;
  }

  std::mt19937 random_{5};
  int number_ = 0;
};

Strings realistic(std::int64_t count) {
  Patterns patterns;
  Strings all;
  while (all.size() < static_cast<std::size_t>(count)) {
    all.push_back(patterns.next());
  }
  return all;
}

constexpr std::ptrdiff_t kMany = 10000;

// With many patterns, the paths that the peer's automaton can hold in a gigabyte: beyond them it
// starts from the beginning at almost every path, and is no longer warm.
Strings shareOf(const Strings &paths, std::int64_t patternCount, std::ptrdiff_t share) {
  const bool all = patternCount < kMany || static_cast<std::ptrdiff_t>(paths.size()) < share;
  return Strings(paths.begin(), all ? paths.end() : paths.begin() + share);
}

Goals goalsFor(std::int64_t patternCount, double goal) {
  return {patternCount == 10 ? 0.22 : goal, patternCount == kMany ? 2.0 : 0.0};
}

void walk(benchmark::State &state) {
  race<RegexSet>(state, realistic(state.range(0)), shareOf(walkOrder(), state.range(0), 20000),
                 goalsFor(state.range(0), 0.5));
}
BENCHMARK(walk)->Arg(10)->Arg(100)->Arg(1000)->Arg(kMany)->Apply(rounds);

void random(benchmark::State &state) {
  race<RegexSet>(state, realistic(state.range(0)), shareOf(randomOrder(), state.range(0), 2000),
                 goalsFor(state.range(0), 0.4));
}
BENCHMARK(random)->Arg(10)->Arg(100)->Arg(1000)->Arg(kMany)->Apply(rounds);

double bytesPerPattern(const Strings &patterns) {
  const auto bytesInUse = [] {
    const struct mallinfo2 info = ::mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
  };
  const double before = bytesInUse();
  const Filter filter(patterns);
  return (bytesInUse() - before) / static_cast<double>(patterns.size());
}

// From the patterns to the first answer.
void build(benchmark::State &state) {
  const Strings patterns = realistic(state.range(0));
  const std::string path = "/usr/share/none";
  Race(state, [&] { return !Filter(patterns).leavesOut(path); })
      .peer(
          "re2", [&] { return !RegexSet(patterns).leavesOut(path); }, 0.06)
      .run();
  state.counters["bytes_a_pattern"] = bytesPerPattern(patterns);
}
BENCHMARK(build)->Arg(10)->Arg(100)->Arg(1000)->Arg(kMany)->Apply(rounds);

std::string repeated(const std::string &text, std::size_t size) {
  std::string all;
  while (all.size() < size) {
    all += text;
  }
  return all.substr(0, size);
}

Strings hostilePaths(std::int64_t kind) {
  std::string mixed;
  std::mt19937 random(7);
  while (mixed.size() < 4096) {
    mixed += std::string("ab/")[random() % std::size_t{3}];
  }
  const Strings all{repeated("a", 4094) + "/b", repeated("a", 4096), repeated("a/", 4096), mixed,
                    repeated("aaaaaaab/", 4096)};
  return {all[static_cast<std::size_t>(kind)]};
}

Strings hostilePattern(std::int64_t kind) {
  const Strings all{"**a*a*",
                    "**a*a*b",
                    "*a**b*a?",
                    "**" + repeated("a*", 120) + "b",
                    "**" + repeated("a", 61) + "b*",
                    "**ab?a*b**c*"};
  return {all[static_cast<std::size_t>(kind)]};
}

// One pattern and one path of 4 KB. More than 64 elements take more than one machine word.
void hostile(benchmark::State &state) {
  const Strings patterns = hostilePattern(state.range(0));
  const auto stars = std::count(patterns.front().begin(), patterns.front().end(), '*');
  const double words = std::max(
      1.0, static_cast<double>(static_cast<std::ptrdiff_t>(patterns.front().size()) - stars) / 64);
  race<OneRegex>(state, patterns, hostilePaths(state.range(1)), {1.5 * words});
}
BENCHMARK(hostile)->ArgsProduct({{0, 1, 2, 3, 4, 5}, {0, 1, 2, 3, 4}})->Apply(rounds);

// The time must grow with the path and not faster.
void hostileLength(benchmark::State &state) {
  const auto size = static_cast<std::size_t>(state.range(0));
  race<OneRegex>(state, {"**a*a*"}, {repeated("a", size - 2) + "/b"}, {1.5});
}
BENCHMARK(hostileLength)->RangeMultiplier(4)->Range(256, 65536)->Apply(rounds);

// A hundred patterns: pairs of letters, nested infixes, the same pattern, different ends.
Strings hostileHundred(std::int64_t kind) {
  Strings all;
  for (unsigned i = 0; i < 100; ++i) {
    const std::string one(1, static_cast<char>('a' + i / 10));
    const std::string other(1, static_cast<char>('a' + i % 10));
    const Strings kinds{"**" + one + "*" + other + "*",
                        "**" + repeated("a", 1 + i % 10) + "*a*" + other, "**a*a*",
                        "**a*a*" + other + one};
    all.push_back(kinds[static_cast<std::size_t>(kind)]);
  }
  return all;
}

// The goal is a time: no path may take longer than 100 us.
void hostileSet(benchmark::State &state) {
  race<RegexSet>(state, hostileHundred(state.range(0)), hostilePaths(state.range(1)), {0});
  state.counters["goal_ns"] = 100000;
}
BENCHMARK(hostileSet)->ArgsProduct({{0, 1, 2, 3}, {0, 1, 3}})->Apply(rounds);

// Patterns whose single stars could be combined in very many ways.
std::string hostileRebase(std::int64_t kind) {
  const Strings all{"/" + repeated("*a", 120) + "*b", "/*a*a*/b*c", repeated("/*a*", 200) + "b",
                    "/" + repeated("a?*", 300) + "b"};
  return all[static_cast<std::size_t>(kind)];
}

void getExcludePattern(benchmark::State &state) {
  PathFilter filter;
  filter.addExcludePattern(hostileRebase(state.range(0)));
  const std::string base = "/" + hostilePaths(state.range(1)).front();
  // Ends as base does, and begins with a single slash, as the patterns do.
  const std::string half = "/" + base.substr(base.find_first_not_of('/', base.size() / 2));
  const auto get = [&filter](const std::string &folder) {
    std::list<std::string> out;
    return filter.getExcludePattern(out, folder);
  };
  Race(state, [&] { return get(base); })
      .peer(
          "half_base", [&] { return get(half); }, 2.5)
      .run();
}
BENCHMARK(getExcludePattern)->ArgsProduct({{0, 1, 2, 3}, {0, 1, 2, 3, 4}})->Apply(rounds);

} // namespace
