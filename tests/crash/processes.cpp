#include "tests/crash/processes.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <map>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

using Clock = std::chrono::steady_clock;

[[noreturn]] void actUntilKilled(Workload &workload, int actor, std::uint64_t seed) {
  Random random(seed);
  for (;;) {
    workload.act(actor, random);
  }
}

} // namespace

void Processes::start(Random &random) {
  std::fflush(nullptr);
  for (const auto &workload : workloads_) {
    for (int actor = 0; actor < workload->actors(); ++actor) {
      const std::uint64_t seed = random();
      const pid_t pid = ::fork();
      if (pid == 0) {
        actUntilKilled(*workload, actor, seed);
      }
      all_.push_back({workload.get(), actor, pid});
    }
  }
}

void Processes::killAtRandom(Random &random) {
  std::multimap<Clock::time_point, pid_t> due;
  const Clock::time_point now = Clock::now();
  for (const Process &process : all_) {
    const auto span = static_cast<int>(process.workload->span(process.actor).count());
    due.emplace(now + std::chrono::microseconds(below(random, span)), process.pid);
  }
  for (const auto &[moment, pid] : due) {
    std::this_thread::sleep_until(moment);
    (void)::kill(pid, SIGKILL);
  }
}

void Processes::kill() {
  for (const Process &process : all_) {
    (void)::kill(process.pid, SIGKILL);
  }
}

int Processes::statusOf(pid_t pid) {
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  return status;
}

// This process is the first of its PID namespace, so all others become its children.
bool Processes::othersEnd() {
  const auto limit = Clock::now() + std::chrono::seconds(20);
  for (;;) {
    const pid_t pid = ::waitpid(-1, nullptr, WNOHANG);
    if (pid < 0 && errno == ECHILD) {
      return true;
    }
    if (pid == 0) {
      if (Clock::now() > limit) {
        return false;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
  }
}

} // namespace KovaTest::Crash
