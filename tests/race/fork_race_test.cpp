// Commands are started while other threads allocate memory: a lock of the allocator that is held at
// the moment of the fork must not keep the child waiting.

#include "kovabackup/subprocess.h"
#include "tests/proc/process_helper.h"
#include "tests/race/race_support.h"

#include <atomic>
#include <chrono>
#include <gmock/gmock.h>
#include <memory>
#include <string>
#include <sys/resource.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

using namespace KovaTest;

namespace {

constexpr int kThreads = 8;

// Allocates and releases blocks of all sizes, at the lowest priority: the commands then take most
// of the time, and threads are interrupted while they hold a lock.
void allocate(unsigned seed, const std::atomic<bool> &done, std::atomic<long> &blocks) {
  EXPECT_EQ(0, ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), 19));
  std::mt19937 random(seed);
  std::vector<std::unique_ptr<char[]>> kept(64);
  while (!done) {
    const std::size_t size = std::size_t{1} << (random() % 19); // from 1 byte to what is mapped
    auto &place = kept[random() % kept.size()];
    place = std::make_unique<char[]>(size);
    place[size - 1] = 'x';
    ++blocks;
  }
}

} // namespace

TEST(ForkRace, CallReturnsWhileThreadsAllocate) {
  const int calls = share(300, 5000);
  const unsigned seed = printedSeed();
  std::atomic<bool> done{false};
  std::atomic<long> blocks{0};
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (unsigned number = 0; number < kThreads; ++number) {
    threads.emplace_back([&, number] { allocate(seed + number, done, blocks); });
  }
  const auto begin = std::chrono::steady_clock::now();
  for (int i = 0; i < calls; ++i) {
    KOVA::Backup::SubProcess command(kHelper);
    command.addArgList("exit", "3", nullptr);
    command.setEnv("NAME", std::string(static_cast<std::size_t>(i % 1000), 'x'));
    const int status = command.call();
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 3) << status;
  }
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - begin;
  done = true;
  for (std::thread &thread : threads) {
    thread.join();
  }
  std::printf("%d calls beside %d threads in %.2f s, %ld blocks\n", calls, kThreads, took.count(),
              blocks.load());
}
