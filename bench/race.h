#ifndef KOVABACKUP_BENCH_RACE_H
#define KOVABACKUP_BENCH_RACE_H

/// @file The library and its peers, measured by turns in one process.

#include "bench/child_times.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <ctime>
#include <functional>
#include <iterator>
#include <string>
#include <sys/resource.h>
#include <utility>
#include <vector>

namespace KovaBench {

/// The processor time in seconds of this process and of the children that it has waited for.
inline double secondsOfProcessor() {
  timespec own = {};
  rusage children = {};
  (void)::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &own);
  (void)::getrusage(RUSAGE_CHILDREN, &children);
  const auto seconds = [](const timeval &time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) * 1e-6;
  };
  return static_cast<double>(own.tv_sec) + static_cast<double>(own.tv_nsec) * 1e-9 +
         seconds(children.ru_utime) + seconds(children.ru_stime);
}

/// Runs the library's job and its peers by turns, one slice of each a round, so that whatever slows
/// the machine slows all of them. A race with a wrong result fails. Its counters report:
///   ns:NAME     the median processor time of one operation, in nanoseconds
///   ratio:PEER  the median over all rounds of the library's time divided by the peer's
///   spread:PEER how far the ratios of the rounds lie apart: the width of their middle half as a
///               share of ratio:PEER. scripts/bench decides with it whether two runs differ
///   goal:PEER   the highest ratio that we accept, where one was set
///   load        the load of the machine, which explains odd times
///
/// A benchmark makes one Race, calls run at its end, and is registered with ->Apply(rounds).
class Race {
public:
  /// Runs one operation, or `operations` of them, and returns whether the result was right.
  using Job = std::function<bool()>;

  /// The library's own job. operations is the number of operations that one call of job does.
  Race(benchmark::State &state, Job job, double operations = 1)
      : state_(state), operations_(operations) {
    runners_.push_back({"kova", std::move(job), 1, 0, {}, true});
  }

  /// Another way to the same result. goal is the highest ratio that we accept; 0 means none is set.
  Race &peer(const std::string &name, Job job, double goal = 0) {
    runners_.push_back({name, std::move(job), 1, goal, {}, true});
    return *this;
  }

  /// The shortest slice of a round in seconds; longer slices suit jobs that start processes.
  Race &slice(double seconds) {
    slice_ = seconds;
    return *this;
  }

  void run() {
    for (Runner &runner : runners_) {
      calibrate(runner);
    }
    for (auto _ : state_) {
      for (std::size_t turn = 0; turn < runners_.size(); ++turn) {
        Runner &runner = runners_[(turn + round_) % runners_.size()];
        runner.times.push_back(measured(runner) / static_cast<double>(runner.repeats));
      }
      ++round_;
      state_.SetIterationTime(runners_.front().times.back() / operations_);
    }
    for (const Runner &runner : runners_) {
      if (!runner.isRight) {
        state_.SkipWithError((runner.name + ": wrong result").c_str());
        return;
      }
    }
    report();
  }

private:
  struct Runner {
    std::string name;
    Job job;
    std::size_t repeats;
    double goal;
    std::vector<double> times; ///< of one call of job, in seconds, one a round
    bool isRight;              ///< whether every result was right
  };

  static double measured(Runner &runner) {
    const double start = secondsOfProcessor();
    for (std::size_t i = 0; i < runner.repeats; ++i) {
      runner.isRight = runner.job() && runner.isRight;
    }
    return secondsOfProcessor() - start;
  }

  /// Doubles the repeats until they fill a slice, which also warms caches.
  void calibrate(Runner &runner) const {
    while (measured(runner) < slice_ && runner.repeats < kMostRepeats) {
      runner.repeats *= 2;
    }
  }

  void report() {
    for (const Runner &runner : runners_) {
      state_.counters["ns:" + runner.name] = median(runner.times) / operations_ * 1e9;
    }
    for (auto peer = std::next(runners_.begin()); peer != runners_.end(); ++peer) {
      reportPeer(*peer);
    }
    state_.counters["load"] = load();
  }

  void reportPeer(const Runner &peer) {
    std::vector<double> ratios;
    std::transform(runners_.front().times.begin(), runners_.front().times.end(), peer.times.begin(),
                   std::back_inserter(ratios), std::divides<double>());
    std::sort(ratios.begin(), ratios.end());
    const std::size_t quarter = ratios.size() / 4;
    const double ratio = median(ratios);
    state_.counters["ratio:" + peer.name] = ratio;
    state_.counters["spread:" + peer.name] =
        (ratios[ratios.size() - 1 - quarter] - ratios[quarter]) / ratio;
    if (peer.goal > 0) {
      state_.counters["goal:" + peer.name] = peer.goal;
    }
  }

  static constexpr std::size_t kMostRepeats = std::size_t{1} << 24;
  benchmark::State &state_;
  double operations_;
  std::vector<Runner> runners_;
  std::size_t round_ = 0;
  double slice_ = 0.005;
};

/// How a race is registered: eleven rounds, timed by the race itself.
inline void rounds(benchmark::internal::Benchmark *race) {
  race->Iterations(11)->UseManualTime()->Unit(benchmark::kMicrosecond);
}

} // namespace KovaBench

#endif
