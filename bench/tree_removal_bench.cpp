// A removal raced against rm(1) and removeAll, of the same trees.
//
// Each removes in a child process of its own, by turns, and what counts is the processor time of
// the child, as in bench/race.h, whose names the counters have. It is not a Race because making the
// tree is not to be timed. "ns" is the time of one tree; "ns:rm_start" is the starting of rm, which
// the other two are spared. Each must leave nothing.
//
// The first argument is the tree, the second one where it is: in memory (/dev/shm) or on a disk
// (/var/tmp, or what KOVA_BENCH_FOLDER names).

#include "kovabackup/path_util.h"
#include "kovabackup/service/tree_removal.h"

#include "bench/child_times.h"

#include <benchmark/benchmark.h>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using KOVA::Backup::removeAll;
using namespace KovaBench;
using KOVA::Backup::Service::TreeRemoval;

enum Shape { Flat, Deep, Wide };
enum Place { Memory, Disk };

std::string rootIn(std::int64_t place) {
  const char *const chosen = std::getenv("KOVA_BENCH_FOLDER");
  const std::string disk = chosen == nullptr ? "/var/tmp" : chosen;
  return (place == Memory ? "/dev/shm" : disk) + "/kova-removal-bench";
}

bool makeFiles(int folder, int count) {
  bool made = true;
  for (int i = 0; i < count; ++i) {
    const std::string name = "IMG_" + std::to_string(i) + ".jpg";
    const int file = ::openat(folder, name.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    made = made && file >= 0;
    ::close(file);
  }
  return made;
}

int makeFolder(int parent, const std::string &name) {
  (void)::mkdirat(parent, name.c_str(), 0700);
  return ::openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

// 200 folders, one in the other, with five files each.
bool makeChain(int parent, const std::string &name) {
  int folder = makeFolder(parent, name);
  bool made = true;
  for (int level = 1; level <= 200 && made; ++level) {
    const int below = level == 200 ? -1 : makeFolder(folder, "level" + std::to_string(level));
    made = makeFiles(folder, 5);
    ::close(folder);
    folder = below;
  }
  return made;
}

// On a disk, which takes much longer, a fifth of the tree.
bool makeTree(const std::string &root, std::int64_t shape, std::int64_t place) {
  const int part = place == Disk ? 5 : 1;
  const int folder = makeFolder(AT_FDCWD, root);
  bool made = folder >= 0;
  if (shape == Flat) {
    made = made && makeFiles(folder, 50000 / part);
  }
  for (int i = 0; shape == Deep && i < 50 / part && made; ++i) {
    made = makeChain(folder, "chain" + std::to_string(i));
  }
  for (int i = 0; shape == Wide && i < 2500 / part && made; ++i) {
    const int below = makeFolder(folder, "album" + std::to_string(i));
    made = makeFiles(below, 20);
    ::close(below);
  }
  (void)::syncfs(folder); // the file system's work on the new tree is not the removal's
  ::close(folder);
  return made;
}

ChildTimes timesOfRm(const std::string &path) {
  return timesOfChild([&] { ::execl("/bin/rm", "rm", "-rf", path.c_str(), nullptr); });
}

// The processor times of one contestant, one a round.
class Series {
public:
  void add(const ChildTimes &times, bool gone) {
    cpu_.push_back(times.cpu);
    fine_ = fine_ && gone && times.cpu >= 0;
  }
  bool fine() const { return fine_; }
  double ns() const { return median(cpu_) * 1e9; }
  double last() const { return cpu_.back(); }

  double ratioTo(const Series &peer) const {
    std::vector<double> ratios;
    for (std::size_t round = 0; round < cpu_.size(); ++round) {
      ratios.push_back(cpu_[round] / peer.cpu_[round]);
    }
    return median(ratios);
  }

private:
  std::vector<double> cpu_;
  bool fine_ = true;
};

void treeRemoval(benchmark::State &state) {
  const std::string root = rootIn(state.range(1));
  const auto round = [&](Series &series, const auto &remove) {
    const bool made = makeTree(root, state.range(0), state.range(1));
    const ChildTimes times = remove();
    struct stat found = {};
    series.add(times, made && ::stat(root.c_str(), &found) != 0);
  };
  Series ours;
  Series rm;
  Series all;
  Series start;
  for (auto _ : state) {
    round(ours, [&] { return timesOfChild([&] { ::_exit(TreeRemoval::remove(root) ? 0 : 1); }); });
    round(rm, [&] { return timesOfRm(root); });
    round(all, [&] { return timesOfChild([&] { ::_exit(removeAll(root) ? 0 : 1); }); });
    start.add(timesOfRm(root), true);
    state.SetIterationTime(ours.last());
  }
  if (!ours.fine() || !rm.fine() || !all.fine() || !start.fine()) {
    state.SkipWithError("a tree could not be made or was not removed");
    return;
  }
  state.counters["ns:kova"] = ours.ns();
  state.counters["ns:rm"] = rm.ns();
  state.counters["ns:rm_start"] = start.ns();
  state.counters["ns:remove_all"] = all.ns();
  state.counters["ratio:rm"] = ours.ratioTo(rm);
  state.counters["goal:rm"] = 1.1;
  state.counters["ratio:remove_all"] = ours.ratioTo(all);
  state.counters["load"] = load();
}
BENCHMARK(treeRemoval)
    ->ArgNames({"flat0_deep1_wide2", "memory0_disk1"})
    ->ArgsProduct({{Flat, Deep, Wide}, {Memory, Disk}})
    ->Iterations(9)
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

} // namespace
