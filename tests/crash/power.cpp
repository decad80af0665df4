// Cuts the power of two disks at random moments while processes write to them, mounts them again,
// and compares what the processes have promised with the disks. The key of secrets has a disk of
// its own: on the same one, the sync of what is encrypted with it would do for it, too.
//
//   kova_power [NUMBER] [--seed SEED]      so many cuts
//   kova_power [NUMBER] --broken file      without the fsync of files: fails unless that is found
//   kova_power [NUMBER] --broken folder    without the fsync of folders
//
// What the disk's own cache would lose is not tried: a loop device has none.

#include "tests/crash/campaign.h"
#include "tests/crash/disk.h"
#include "tests/crash/files.h"
#include "tests/crash/processes.h"
#include "tests/crash/shared.h"
#include "tests/faults/world.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <thread>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

// Smaller than the other disk, so that rules for volumes pick that one.
constexpr int kKeyDiskMebibytes = 16;

// From the start of the processes to the cut. Mostly short, because the first moments of a file are
// the most delicate ones; a run of the service takes longer.
std::chrono::microseconds untilCut(Random &random, const Workloads &workloads) {
  constexpr int kShortUs = 60000;
  int longest = kShortUs;
  for (const auto &workload : workloads) {
    longest = std::max(longest, static_cast<int>(workload->span(0).count()));
  }
  return std::chrono::microseconds(below(random, below(random, 4) == 0 ? longest : kShortUs));
}

class Machine {
public:
  explicit Machine(std::uint64_t seed)
      : disks_{Disk(makeFolder("/tmp/disk"), "/tmp/key.img", kKeyDiskMebibytes),
               Disk(Faults::volume(), "/tmp/disk.img")},
        random_(seed) {}

  // Returns: "" or why there is no disk whose power can be cut.
  std::string start() const {
    std::string why = forEach(&Disk::make);
    why = why.empty() ? forEach(&Disk::mount) : why;
    return why.empty() ? forEach(&Disk::cut) : why;
  }

  // Empty disks and new workloads.
  void renew() {
    collectPromises();
    workloads_.clear();
    must(&Disk::unmount);
    must(&Disk::make);
    must(&Disk::mount);
    const std::string &base = Faults::volume();
    workloads_.push_back(makeCounters(base));
    workloads_.push_back(makeSections(base));
    workloads_.push_back(makeSecrets(base, disks_.front().mountPoint()));
    workloads_.push_back(makeArchives(base));
    if (!std::string(KOVA_EXAMPLE_PATH).empty()) {
      workloads_.push_back(makeService(base));
    }
  }

  // Returns: what was found, by workload.
  std::map<std::string, Findings> cut() {
    refusal().reset();
    for (const auto &workload : workloads_) {
      workload->prepare(random_);
    }
    Processes processes(workloads_);
    processes.start(random_);
    std::this_thread::sleep_for(untilCut(random_, workloads_));
    refusal().expectFromNowOn();
    must(&Disk::cut);
    processes.kill();
    std::map<std::string, Findings> found;
    found["processes"].expect(processes.wait([](const Workload &, int, int) {}),
                              "processes outlive the one that started them");
    found["processes"].expect(refusal().text().empty(), "refused: " + refusal().text());
    must(&Disk::unmount);
    must(&Disk::mount);
    for (const auto &workload : workloads_) {
      workload->check(found[workload->name()]);
    }
    return found;
  }

  void print() {
    collectPromises();
    for (const auto &[name, count] : promises_) {
      std::printf("%-10s %8ld promises compared\n", name.c_str(), count);
    }
    workloads_.clear();
  }

private:
  using Step = std::string (Disk::*)() const;

  // Returns: "" or why the step failed.
  std::string forEach(Step step) const {
    std::string why;
    for (const Disk &disk : disks_) {
      why = why.empty() ? (disk.*step)() : why;
    }
    return why;
  }

  void must(Step step) const {
    const std::string why = forEach(step);
    mustHold(why.empty(), why);
  }

  void collectPromises() {
    for (const auto &workload : workloads_) {
      promises_[workload->name()] += workload->promises();
    }
  }

  // The disk of the key is cut first: a secret that is saved in between needs a key that is there.
  const std::array<Disk, 2> disks_;
  Random random_;
  Workloads workloads_;
  std::map<std::string, long> promises_;
};

std::size_t showAll(const std::map<std::string, Findings> &found, int cut) {
  std::size_t count = 0;
  for (const auto &[name, findings] : found) {
    show("in " + name + " after cut " + std::to_string(cut), findings);
    count += findings.list().size();
  }
  return count;
}

void cutMany(Machine &machine, const Options &options) {
  std::size_t wrong = 0;
  machine.renew();
  for (int cut = 1; cut <= options.count; ++cut) {
    const std::size_t found = showAll(machine.cut(), cut);
    if (found > 0) {
      machine.renew();
    }
    wrong += found;
    showProgress(cut - 1, cut, options.count, "cuts");
  }
  machine.print();
  std::printf("power cuts: %d, %zu wrong, seed %llu\n", options.count, wrong,
              static_cast<unsigned long long>(options.seed));
  if (wrong > 0) {
    setFailed();
  }
}

// Whether a cut shows it depends on the moment, so there are many tries. The service publishes too
// rarely to be waited for.
void findMissingSync(Machine &machine, const Options &options) {
  std::map<std::string, int> firstCut;
  const auto isFound = [&](const char *name) { return firstCut.count(name) == 1; };
  int cut = 0;
  while (cut < options.count && !(isFound("counters") && isFound("sections") &&
                                  isFound("secrets") && isFound("archives"))) {
    machine.renew();
    ++cut;
    for (const auto &[name, findings] : machine.cut()) {
      if (!findings.list().empty() && firstCut.emplace(name, cut).second) {
        show("in " + name + " after cut " + std::to_string(cut), findings);
      }
    }
  }
  for (const auto &[name, found] : firstCut) {
    std::printf("without the fsync of a %s: found in %s after cut %d\n", options.broken.c_str(),
                name.c_str(), found);
  }
  if (cut == options.count) {
    std::printf("NOT FOUND everywhere in %d cuts\n", cut);
    setFailed();
  }
}

std::string run(const Options &options) {
  std::string why = enterWorld();
  if (!why.empty()) {
    return why;
  }
  Machine machine(options.seed);
  why = machine.start();
  if (!why.empty()) {
    return why;
  }
  if (options.broken.empty()) {
    cutMany(machine, options);
  } else {
    findMissingSync(machine, options);
  }
  return "";
}

// A library that is loaded before all others skips calls of fsync in this program and in those that
// it starts.
void startWithoutSync(const Options &options, char **argv) {
  constexpr const char *kVariable = "KOVA_MISSING_SYNC";
  if (!options.broken.empty() && ::getenv(kVariable) == nullptr) {
    ::setenv(kVariable, options.broken.c_str(), 1);
    ::setenv("LD_PRELOAD", KOVA_MISSING_SYNC_LIBRARY, 1);
    (void)::execv("/proc/self/exe", argv);
  }
}

} // namespace
} // namespace KovaTest::Crash

int main(int argc, char **argv) {
  using namespace KovaTest::Crash;
  Options options;
  if (!parse(argc, argv, options)) {
    return EXIT_FAILURE;
  }
  startWithoutSync(options, argv);
  return runInNamespaces([&] { return run(options); });
}
