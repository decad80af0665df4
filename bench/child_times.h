#ifndef KOVABACKUP_BENCH_CHILD_TIMES_H
#define KOVABACKUP_BENCH_CHILD_TIMES_H

/// @file How long work takes in a child process, for benchmarks beside a command.

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace KovaBench {

/// In seconds; -1 when the child failed.
struct ChildTimes {
  double cpu = -1; ///< user and system together
  double wall = -1;
};

/// Runs action in a child process, which must end it with exit status 0.
template <typename Action>
ChildTimes timesOfChild(Action action) {
  const auto start = std::chrono::steady_clock::now();
  const pid_t child = ::fork();
  if (child == 0) {
    action();
    ::_exit(127);
  }
  int status = -1;
  rusage usage = {};
  if (child < 0 || ::wait4(child, &status, 0, &usage) != child || status != 0) {
    return {};
  }
  const std::chrono::duration<double> wall = std::chrono::steady_clock::now() - start;
  const auto seconds = [](const timeval &time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  };
  return {seconds(usage.ru_utime) + seconds(usage.ru_stime), wall.count()};
}

inline double median(std::vector<double> times) {
  std::sort(times.begin(), times.end());
  return times[times.size() / 2];
}

/// The load of the machine over the last minute, which explains odd times.
inline double load() {
  double now = -1;
  (void)::getloadavg(&now, 1);
  return now;
}

} // namespace KovaBench

#endif
