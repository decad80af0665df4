// Starting /bin/true and waiting for it, raced against what a caller would write instead: fork and
// execv alone, posix_spawn, system, fork with close_range, and fork with a sweep that closes every
// descriptor number. The argument is the number of descriptors that the caller has open. Only call,
// close_range and the sweep close them for the command. The limit on descriptors is raised to its
// maximum, and the sweep visits every number up to it. The exit status is checked. call writes two
// lines to the system log at LOG_DEBUG.

#include "kovabackup/subprocess.h"

#include "bench/end_on_sigterm.h"
#include "bench/open_descriptors.h"
#include "bench/race.h"

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
using KovaBench::Race;
using KovaBench::rounds;

constexpr char kProgram[] = "/bin/true";

char *const *arguments() {
  static char program[] = "/bin/true";
  static char *const argv[] = {program, nullptr};
  return argv;
}

bool endsWithZero(pid_t child) {
  int status = -1;
  return ::waitpid(child, &status, 0) == child && status == 0;
}

bool byCall() {
  static const KOVA::Backup::SubProcess command(kProgram);
  return command.call() == 0;
}

bool bySystem() {
  return std::system(kProgram) == 0;
}

bool bySpawn() {
  pid_t child = -1;
  return ::posix_spawn(&child, kProgram, nullptr, nullptr, arguments(), environ) == 0 &&
         endsWithZero(child);
}

template <typename Sweep>
bool byFork(Sweep sweep) {
  const pid_t child = ::fork();
  if (child == 0) {
    sweep();
    (void)::execv(kProgram, arguments());
    ::_exit(127);
  }
  return endsWithZero(child);
}

bool byForkAlone() {
  return byFork([] {});
}

bool byForkAndCloseRange() {
  return byFork([] { (void)::syscall(SYS_close_range, 3U, ~0U, 0U); });
}

bool byForkAndNumbers() {
  return byFork([] {
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    for (int fd = 3; fd < static_cast<int>(limit.rlim_cur); ++fd) {
      (void)::close(fd);
    }
  });
}

void call(benchmark::State &state) {
  const OpenDescriptors open(state.range(0));
  if (!open.areThere()) {
    state.SkipWithError("not enough descriptors");
    return;
  }
  KovaBench::endOnSigterm();
  Race(state, byCall)
      .peer("fork_execv", byForkAlone, state.range(0) <= 20 ? 1.10 : 2)
      .peer("posix_spawn", bySpawn)
      .peer("system", bySystem)
      .peer("fork_close_range", byForkAndCloseRange)
      .peer("fork_sweep", byForkAndNumbers)
      .slice(0.02)
      .run();
}
BENCHMARK(call)->Arg(20)->Arg(1000)->Arg(5000)->Arg(19000)->Apply(rounds);

} // namespace
