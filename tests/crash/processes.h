#ifndef KOVABACKUP_TESTS_CRASH_PROCESSES_H
#define KOVABACKUP_TESTS_CRASH_PROCESSES_H

/// @file The processes of all workloads in one round.

#include "tests/crash/workload.h"

#include <sys/types.h>
#include <vector>

namespace KovaTest::Crash {

class Processes {
public:
  explicit Processes(Workloads &workloads) : workloads_(workloads) {}

  /// Starts all of them, each with a seed of its own.
  void start(Random &random);

  /// Kills each at a random moment while the others go on.
  void killAtRandom(Random &random);
  /// Kills all at once.
  void kill();

  /// Waits for all. ended is called for each: its workload, and its status as waitpid reports it.
  /// Returns: false when a process that they started does not end.
  template <typename Ended>
  bool wait(Ended ended) {
    for (const Process &process : all_) {
      ended(*process.workload, process.actor, statusOf(process.pid));
    }
    all_.clear();
    return othersEnd();
  }

private:
  struct Process {
    Workload *workload = nullptr;
    int actor = 0;
    pid_t pid = -1;
  };

  static int statusOf(pid_t pid);
  static bool othersEnd();

  Workloads &workloads_;
  std::vector<Process> all_;
};

} // namespace KovaTest::Crash

#endif
