// Starting /bin/true and waiting for it, compared with what a caller would write instead: system,
// posix_spawn, fork with a sweep that closes every descriptor number, and fork with close_range.
// The argument is the number of descriptors that the caller has open. Only call, the sweep and
// close_range close them for the command. The limit on descriptors is raised to its maximum, and
// the sweep visits every number up to it. The exit status of every run is checked. call writes two
// lines to the system log at LOG_DEBUG.

#include "kovabackup/subprocess.h"

#include "bench/open_descriptors.h"

#include <benchmark/benchmark.h>
#include <cstdlib>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace {

using KovaBench::OpenDescriptors;

constexpr char kProgram[] = "/bin/true";

char *const *arguments() {
  static char program[] = "/bin/true";
  static char *const argv[] = {program, nullptr};
  return argv;
}

int awaitStatus(pid_t child) {
  int status = -1;
  return ::waitpid(child, &status, 0) == child ? status : -1;
}

int byCall() {
  static const KOVA::Backup::SubProcess command(kProgram);
  return command.call();
}

int bySystem() {
  return std::system(kProgram);
}

int bySpawn() {
  pid_t child = -1;
  return ::posix_spawn(&child, kProgram, nullptr, nullptr, arguments(), environ) == 0
             ? awaitStatus(child)
             : -1;
}

template <typename Sweep>
int byFork(Sweep sweep) {
  const pid_t child = ::fork();
  if (child == 0) {
    sweep();
    (void)::execv(kProgram, arguments());
    ::_exit(127);
  }
  return awaitStatus(child);
}

int byForkAndNumbers() {
  return byFork([] {
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    for (int fd = 3; fd < static_cast<int>(limit.rlim_cur); ++fd) {
      (void)::close(fd);
    }
  });
}

int byForkAndCloseRange() {
  return byFork([] { (void)::syscall(SYS_close_range, 3U, ~0U, 0U); });
}

template <typename Run>
void run(benchmark::State &state, Run function) {
  const OpenDescriptors open(state.range(0));
  if (!open.areThere()) {
    state.SkipWithError("not enough descriptors");
    return;
  }
  state.counters["limit"] = static_cast<double>(open.limit());
  for (auto _ : state) {
    if (function() != 0) {
      state.SkipWithError("the exit status is not 0");
      return;
    }
  }
}

void call(benchmark::State &state) {
  run(state, byCall);
}
void system(benchmark::State &state) {
  run(state, bySystem);
}
void posixSpawn(benchmark::State &state) {
  run(state, bySpawn);
}
void forkSweepByNumber(benchmark::State &state) {
  run(state, byForkAndNumbers);
}
void forkCloseRange(benchmark::State &state) {
  run(state, byForkAndCloseRange);
}

BENCHMARK(call)->Arg(0)->Arg(3000)->UseRealTime()->Unit(benchmark::kMicrosecond);
BENCHMARK(system)->Arg(0)->Arg(3000)->UseRealTime()->Unit(benchmark::kMicrosecond);
BENCHMARK(posixSpawn)->Arg(0)->Arg(3000)->UseRealTime()->Unit(benchmark::kMicrosecond);
BENCHMARK(forkSweepByNumber)->Arg(0)->Arg(3000)->UseRealTime()->Unit(benchmark::kMicrosecond);
BENCHMARK(forkCloseRange)->Arg(0)->Arg(3000)->UseRealTime()->Unit(benchmark::kMicrosecond);

} // namespace
