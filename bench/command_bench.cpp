// Running /bin/true by Command, raced against posix_spawn(3) and SubProcess. The arguments are how
// many megabytes the caller has in memory, and how many descriptors it has open. posix_spawn closes
// none of them. The exit status is checked.

#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"

#include "bench/end_on_sigterm.h"
#include "bench/open_descriptors.h"
#include "bench/race.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

extern char **environ;

namespace {

using KovaBench::OpenDescriptors;
using KovaBench::Race;
using KovaBench::rounds;

constexpr char kProgram[] = "/bin/true";

// In small pages, as a heap has them that grew over time.
class Memory {
public:
  explicit Memory(std::size_t size)
      : size_(size),
        pages_(size == 0 ? MAP_FAILED
                         : ::mmap(nullptr, size, PROT_READ | PROT_WRITE,
                                  MAP_PRIVATE | MAP_ANONYMOUS, -1, 0)) {
    if (pages_ != MAP_FAILED) {
      (void)::madvise(pages_, size_, MADV_NOHUGEPAGE);
      std::fill_n(static_cast<char *>(pages_), size_, 'x');
    }
  }
  ~Memory() {
    if (pages_ != MAP_FAILED) {
      ::munmap(pages_, size_);
    }
  }
  Memory(const Memory &) = delete;
  Memory &operator=(const Memory &) = delete;

  bool isThere() const { return size_ == 0 || pages_ != MAP_FAILED; }

private:
  std::size_t size_;
  void *pages_;
};

bool byCommand() {
  static const KOVA::Backup::Service::Command command({kProgram});
  return command.run().ok();
}

bool bySubProcess() {
  static const KOVA::Backup::SubProcess command(kProgram);
  return command.call() == 0;
}

bool bySpawn() {
  static char program[] = "/bin/true";
  static char *const argv[] = {program, nullptr};
  pid_t child = -1;
  int status = -1;
  return ::posix_spawn(&child, kProgram, nullptr, nullptr, argv, environ) == 0 &&
         ::waitpid(child, &status, 0) == child && status == 0;
}

void command(benchmark::State &state) {
  const Memory memory(static_cast<std::size_t>(state.range(0)) << 20U);
  const OpenDescriptors open(state.range(1));
  if (!memory.isThere() || !open.areThere()) {
    state.SkipWithError("not enough memory or descriptors");
    return;
  }
  ::setlogmask(LOG_UPTO(LOG_ERR)); // SubProcess would write two lines for each run
  KovaBench::endOnSigterm();
  Race(state, byCommand)
      .peer("posix_spawn", bySpawn, state.range(1) <= 20 ? 1.3 : 2)
      .peer("subprocess", bySubProcess)
      .slice(0.02)
      .run();
}
BENCHMARK(command)
    ->ArgNames({"megabytes", "descriptors"})
    ->Args({0, 20})
    ->Args({1024, 20})
    ->Args({0, 19000})
    ->Args({1024, 19000})
    ->Apply(rounds);

} // namespace
