// Kills processes at random moments while others go on, and compares what they have promised with
// the disk. A round is: all workloads act at once, each process is killed at a moment of its own,
// and when none is left everything is checked.
//
//   kova_kills [NUMBER] [--seed SEED]   until so many were killed
//   kova_kills --broken all             workloads with a defect each, which must be found
//
// The seed decides what the processes do and when they are killed; how far they are then depends on
// the machine.

#include "tests/crash/campaign.h"
#include "tests/crash/disk.h"
#include "tests/crash/processes.h"
#include "tests/crash/shared.h"
#include "tests/faults/world.h"

#include <cstdio>
#include <cstdlib>
#include <map>
#include <sys/wait.h>

namespace KovaTest::Crash {
namespace {

class Kills {
public:
  Kills(Workloads workloads, std::uint64_t seed)
      : workloads_(std::move(workloads)), random_(seed) {}

  // Returns: the number of findings.
  std::size_t round(int number) {
    Findings findings;
    refusal().reset();
    for (const auto &workload : workloads_) {
      workload->prepare(random_);
    }
    Processes processes(workloads_);
    processes.start(random_);
    processes.killAtRandom(random_);
    const bool done = processes.wait([&](Workload &workload, int actor, int status) {
      const bool killed = WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL;
      kills_[workload.name()] += killed ? 1 : 0;
      all_ += killed ? 1 : 0;
      findings.expect(killed || (workload.isProgram(actor) && WIFEXITED(status) &&
                                 workload.mayExitWith(WEXITSTATUS(status))),
                      std::string(workload.name()) + " ended with " + std::to_string(status));
    });
    findings.expect(done, "processes outlive the one that started them");
    findings.expect(refusal().text().empty(), "refused: " + refusal().text());
    for (const auto &workload : workloads_) {
      workload->check(findings);
    }
    show("in round " + std::to_string(number), findings);
    return findings.list().size();
  }

  int kills() const { return all_; }

  void print() const {
    for (const auto &workload : workloads_) {
      std::printf("%-10s %6d kills, %8ld promises compared\n", workload->name(),
                  kills_.at(workload->name()), workload->promises());
    }
  }

private:
  Workloads workloads_;
  Random random_;
  std::map<std::string, int> kills_;
  int all_ = 0;
};

Workloads allWorkloads(const std::string &base) {
  Workloads all;
  all.push_back(makeCounters(base));
  all.push_back(makeSections(base));
  all.push_back(makeSecrets(base, base));
  all.push_back(makeArchives(base));
  all.push_back(makeSessions());
  if (std::string(KOVA_EXAMPLE_PATH).empty()) {
    std::printf("skipped in part: the example service requires libcli11-dev\n");
  } else {
    all.push_back(makeService(base));
  }
  return all;
}

// Where a file system can be mounted, the volume is one, otherwise a tmpfs.
void mountVolume() {
  const Disk disk(Faults::volume(), "/tmp/disk.img");
  std::string why = disk.make();
  why = why.empty() ? disk.mount() : why;
  if (!why.empty()) {
    std::printf("skipped in part: the volume is a tmpfs: %s\n", why.c_str());
  }
}

std::string killMany(const Options &options) {
  const std::string why = enterWorld();
  if (!why.empty()) {
    return why;
  }
  mountVolume();
  Kills kills(allWorkloads(Faults::volume()), options.seed);
  int round = 0;
  std::size_t wrong = 0;
  while (kills.kills() < options.count) {
    const int before = kills.kills();
    wrong += kills.round(++round);
    showProgress(before, kills.kills(), options.count, "kills");
  }
  kills.print();
  std::printf("kills: %d in %d rounds, %zu wrong, seed %llu\n", kills.kills(), round, wrong,
              static_cast<unsigned long long>(options.seed));
  if (wrong > 0) {
    setFailed();
  }
  return "";
}

std::string findDefects(const Options &options) {
  const std::string why = enterWorld();
  if (!why.empty()) {
    return why;
  }
  Workloads broken;
  addBrokenWorkloads(Faults::volume(), broken);
  for (auto &workload : broken) {
    const std::string name = workload->name();
    Workloads alone;
    alone.push_back(std::move(workload));
    Kills kills(std::move(alone), options.seed);
    int round = 1;
    constexpr int kMost = 500;
    while (kills.round(round) == 0 && round < kMost) {
      ++round;
    }
    std::printf("%-30s %s after %d kills\n", name.c_str(), round < kMost ? "found" : "NOT FOUND",
                kills.kills());
    if (round == kMost) {
      setFailed();
    }
  }
  return "";
}

} // namespace
} // namespace KovaTest::Crash

int main(int argc, char **argv) {
  using namespace KovaTest::Crash;
  Options options;
  if (!parse(argc, argv, options)) {
    return EXIT_FAILURE;
  }
  return runInNamespaces(
      [&] { return options.broken.empty() ? killMany(options) : findDefects(options); });
}
