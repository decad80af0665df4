// PathFilter against RE2 and RE2::Set, which answer the same question for the same patterns, each
// translated to a regular expression. Both run by turns on the processor time of this thread, and
// both must leave out the same paths. "ratio" is the median of PathFilter divided by the median of
// the peer.
//
// The paths are those of /usr, or of KOVA_BENCH_ROOT, in the order of a walk and at random.
// The peer is warm: it has seen all paths before it is measured.

#include "kovabackup/path_filter.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <memory>
#include <random>
#include <re2/re2.h>
#include <re2/set.h>
#include <string>
#include <vector>

namespace {

using KOVA::Backup::PathFilter;
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

class Peer {
public:
  virtual ~Peer() = default;
  virtual bool leavesOut(const std::string &path) = 0;
};

class OneRegex : public Peer {
public:
  explicit OneRegex(const std::string &pattern) : regex_(regexOf(pattern), options()) {}
  bool leavesOut(const std::string &path) override { return RE2::FullMatch(path, regex_); }

private:
  RE2 regex_;
};

class RegexSet : public Peer {
public:
  explicit RegexSet(const Strings &patterns) : set_(options(), RE2::ANCHOR_BOTH) {
    for (const std::string &pattern : patterns) {
      set_.Add(regexOf(pattern), nullptr);
    }
    set_.Compile();
  }
  bool leavesOut(const std::string &path) override { return set_.Match(path, nullptr); }

private:
  RE2::Set set_;
};

double secondsOfThread() {
  timespec now = {};
  ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

template <typename Filter>
std::size_t countOf(Filter leavesOut, const Strings &paths, std::size_t times) {
  std::size_t leftOut = 0;
  for (; times > 0; --times) {
    for (const std::string &path : paths) {
      leftOut += leavesOut(path) ? 1U : 0U;
    }
  }
  return leftOut;
}

double median(std::vector<double> values) {
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

void race(benchmark::State &state, const Strings &patterns, Peer &peer, const Strings &paths) {
  PathFilter filter;
  for (const std::string &pattern : patterns) {
    filter.addExcludePattern(pattern);
  }
  const auto ours = [&filter](const std::string &path) { return filter.filterOut(path); };
  const auto theirs = [&peer](const std::string &path) { return peer.leavesOut(path); };
  for (const std::string &path : paths) {
    if (ours(path) != theirs(path)) {
      state.SkipWithError(("they disagree about " + path.substr(0, 200)).c_str());
      return;
    }
  }
  const std::size_t times = 1 + 20000 / paths.size() / (paths.size() < 10 ? 10 : 1);
  std::vector<double> ourTimes;
  std::vector<double> peerTimes;
  std::size_t leftOut = 0;
  const auto timed = [&](auto filterOut, std::vector<double> &all) {
    const double start = secondsOfThread();
    leftOut = countOf(filterOut, paths, times);
    all.push_back((secondsOfThread() - start) / static_cast<double>(paths.size() * times));
  };
  for (auto _ : state) {
    timed(ours, ourTimes);
    timed(theirs, peerTimes);
  }
  state.counters["ns"] = median(ourTimes) * 1e9;
  state.counters["peer_ns"] = median(peerTimes) * 1e9;
  state.counters["ratio"] = median(ourTimes) / median(peerTimes);
  state.counters["leftOut%"] =
      100.0 * static_cast<double>(leftOut) / static_cast<double>(paths.size() * times);
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

void walk(benchmark::State &state) {
  const Strings patterns = realistic(state.range(0));
  RegexSet peer(patterns);
  race(state, patterns, peer, walkOrder());
}
BENCHMARK(walk)->Arg(10)->Arg(100)->Arg(1000)->Arg(10000)->Iterations(9);

void random(benchmark::State &state) {
  const Strings patterns = realistic(state.range(0));
  RegexSet peer(patterns);
  race(state, patterns, peer, randomOrder());
}
BENCHMARK(random)->Arg(10)->Arg(100)->Arg(1000)->Arg(10000)->Iterations(9);

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

// One pattern and one path of 4 KB.
void hostile(benchmark::State &state) {
  const Strings patterns = hostilePattern(state.range(0));
  OneRegex peer(patterns.front());
  race(state, patterns, peer, hostilePaths(state.range(1)));
}
BENCHMARK(hostile)->ArgsProduct({{0, 1, 2, 3, 4, 5}, {0, 1, 2, 3, 4}})->Iterations(15);

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

void hostileSet(benchmark::State &state) {
  const Strings patterns = hostileHundred(state.range(0));
  RegexSet peer(patterns);
  race(state, patterns, peer, hostilePaths(state.range(1)));
}
BENCHMARK(hostileSet)->ArgsProduct({{0, 1, 2, 3}, {0, 1, 3}})->Iterations(15);

} // namespace
