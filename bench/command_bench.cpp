// Running /bin/true by Command, against posix_spawn(3) and SubProcess. The arguments are how many
// megabytes the caller has in memory, and how many descriptors it has open. posix_spawn closes none
// of them. Each iteration runs every peer once, in turns, so that other work on the machine meets
// all of them alike; what is compared is the CPU time of this process and the command. The counters
// are medians: microseconds per run, and Command's ratio to each peer.

#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"

#include "bench/open_descriptors.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <ctime>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>
#include <vector>

extern char **environ;

namespace {

using KovaBench::OpenDescriptors;

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

double microseconds(const timeval &time) {
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
}

// Of this process and of the children that it has waited for.
double cpuTime() {
  timespec own = {};
  rusage children = {};
  ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &own);
  ::getrusage(RUSAGE_CHILDREN, &children);
  return static_cast<double>(own.tv_sec) * 1e6 + static_cast<double>(own.tv_nsec) / 1e3 +
         microseconds(children.ru_utime) + microseconds(children.ru_stime);
}

class Peer {
public:
  explicit Peer(bool (*run)()) : run_(run) {}

  bool measure() {
    const double before = cpuTime();
    const bool good = run_();
    times_.push_back(cpuTime() - before);
    return good;
  }

  double median() {
    const auto middle = times_.begin() + static_cast<std::ptrdiff_t>(times_.size() / 2);
    std::nth_element(times_.begin(), middle, times_.end());
    return *middle;
  }

private:
  bool (*run_)();
  std::vector<double> times_;
};

void commandBesidePeers(benchmark::State &state) {
  const Memory memory(static_cast<std::size_t>(state.range(0)) << 20U);
  const OpenDescriptors open(state.range(1));
  if (!memory.isThere() || !open.areThere()) {
    state.SkipWithError("not enough memory or descriptors");
    return;
  }
  ::setlogmask(LOG_UPTO(LOG_ERR)); // SubProcess would write two lines for each run
  Peer command(byCommand);
  Peer spawn(bySpawn);
  Peer subprocess(bySubProcess);
  for (auto _ : state) {
    if (!command.measure() || !spawn.measure() || !subprocess.measure()) {
      state.SkipWithError("a command did not end with 0");
      return;
    }
  }
  state.counters["command_us"] = command.median();
  state.counters["spawn_us"] = spawn.median();
  state.counters["subprocess_us"] = subprocess.median();
  state.counters["to_spawn"] = command.median() / spawn.median();
  state.counters["to_subprocess"] = command.median() / subprocess.median();
}

BENCHMARK(commandBesidePeers)
    ->Args({0, 0})
    ->Args({1024, 0})
    ->Args({0, 19000})
    ->Args({1024, 19000})
    ->Iterations(300)
    ->Unit(benchmark::kMicrosecond);

} // namespace
