// Many processes and threads update one file, and long runs of updates against a plain model.

#include "kovabackup/service/section_update.h"

#include "tests/service/lock_support.h"

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <random>
#include <thread>

using namespace KovaTest;

namespace {

using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;

// scripts/soak makes the runs longer.
int timesMore() {
  const char *soak = std::getenv("KOVA_SOAK");
  return soak == nullptr ? 1 : std::max(1, static_cast<int>(std::strtol(soak, nullptr, 10)));
}

bool countIn(OptionMap &map, const std::string &key) {
  return map.optSet(key, map.optInt(key, 0) + 1);
}

int loaded(const std::string &path, const std::string &key) {
  OptionMap map;
  EXPECT_TRUE(map.optSectionLoad(path, "task", 1));
  return map.optInt(key, 0);
}

} // namespace

TEST(SectionUpdateRace, LosesNoUpdateOfManyProcesses) {
  constexpr int kProcesses = 32;
  const int updates = 100 * timesMore();
  const TestFolder folder;
  const std::string path = writeFile(folder / "task.conf", "[task1]\n[other]\nx=1\n");
  const auto begin = std::chrono::steady_clock::now();
  runInChildren(kProcesses, [&](int number) {
    bool fine = true;
    for (int i = 0; i < updates && fine; ++i) {
      // A limit makes a process try again and again, among others that wait in the kernel.
      const Millis limit = number % 8 == 0 ? Millis(600000) : Millis(-1);
      fine = updateSection(
                 path, "task", 1, "run",
                 [&](OptionMap &map) {
                   return countIn(map, "all") && countIn(map, "of" + std::to_string(number));
                 },
                 limit) == Update::Saved;
    }
    return fine;
  });
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - begin;
  std::printf("%d updates by %d processes in %.2f s\n", updates * kProcesses, kProcesses,
              took.count());
  EXPECT_EQ(kProcesses * updates, loaded(path, "all"));
  for (int number = 0; number < kProcesses; ++number) {
    EXPECT_EQ(updates, loaded(path, "of" + std::to_string(number)));
  }
  EXPECT_THAT(folder.names(), testing::ElementsAre("task.conf"));
}

TEST(SectionUpdateRace, LosesNoUpdateOfMapsThatHoldTheLock) {
  constexpr int kUpdates = 40;
  const TestFolder folder;
  const std::string path = writeFile(folder / "task.conf", "[task1]\n");
  runInChildren(4, [&](int number) {
    bool fine = true;
    for (int i = 0; i < kUpdates && fine; ++i) {
      if (number % 2 == 0) {
        fine = updateSection(path, "task", 1, "run",
                             [](OptionMap &map) { return countIn(map, "all"); }) == Update::Saved;
        continue;
      }
      OptionMap lock;
      OptionMap map;
      fine = lock.setLockToken("run") && lock.lock() && map.optSectionLoad(path, "task", 1) &&
             countIn(map, "all") && map.optSectionSave() && lock.unlock();
    }
    return fine;
  });
  EXPECT_EQ(4 * kUpdates, loaded(path, "all"));
}

TEST(SectionUpdateRace, LosesNoUpdateOfManyThreads) {
  constexpr int kThreads = 8;
  constexpr int kUpdates = 25;
  const TestFolder folder;
  const std::string path = writeFile(folder / "task.conf", "[task1]\n");
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int number = 0; number < kThreads; ++number) {
    threads.emplace_back([&] {
      for (int i = 0; i < kUpdates; ++i) {
        EXPECT_EQ(Update::Saved, updateSection(path, "task", 1, "run",
                                               [](OptionMap &map) { return countIn(map, "all"); }));
      }
    });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
  EXPECT_EQ(kThreads * kUpdates, loaded(path, "all"));
}

// Writers are killed at any moment. Each that was not has its update in the file, and a killed one
// has either none or all of it.
TEST(SectionUpdateRace, KilledWritersLoseNothingOfOthers) {
  std::mt19937 random(20261122); // NOLINT(cert-msc51-cpp): the rounds must be the same each time
  const TestFolder folder;
  const std::string path = writeFile(folder / "task.conf", "[task1]\n");
  int finished = 0;
  int killed = 0;
  for (int round = 0; round < 50 * timesMore(); ++round) {
    SharedCounter begun;
    const pid_t victim = ::fork();
    if (victim == 0) {
      for (;;) {
        (void)updateSection(path, "task", 1, "run", [&](OptionMap &map) {
          ++*begun;
          return countIn(map, "first") && countIn(map, "second");
        });
      }
    }
    const int turns = 1 + static_cast<int>(random() % 4);
    while (*begun < turns) {
      ::sched_yield();
    }
    volatile unsigned spin = static_cast<unsigned>(random() % 40000);
    while (spin > 0) {
      spin = spin - 1;
    }
    ASSERT_EQ(0, ::kill(victim, SIGKILL));
    ASSERT_EQ(victim, ::waitpid(victim, nullptr, 0));
    const int first = loaded(path, "first");
    ASSERT_EQ(first, loaded(path, "second")) << "one update is saved completely or not at all";
    ASSERT_LE(killed + *begun - 1, first);
    ASSERT_GE(killed + *begun, first);
    killed = first;
    ASSERT_EQ(Update::Saved, updateSection(path, "task", 1, "run",
                                           [](OptionMap &map) { return countIn(map, "all"); }));
    ASSERT_EQ(++finished, loaded(path, "all"));
    ASSERT_THAT(folder.names(), testing::ElementsAre("task.conf"));
  }
}

namespace {

using Model = std::map<std::pair<int, std::string>, std::string>; // section and key: value

Model modelOf(const std::string &path) {
  Model model;
  for (const int id : {1, 2, 3}) {
    OptionMap map;
    EXPECT_TRUE(map.optSectionLoad(path, "task", id));
    for (int key = 0; key < 6; ++key) {
      std::string value;
      if (map.optGet("key" + std::to_string(key), value)) {
        model[{id, "key" + std::to_string(key)}] = value;
      }
    }
  }
  return model;
}

const std::vector<std::string> kValues = {"",
                                          "plain",
                                          "[task1]",
                                          "a=b",
                                          " spaced ",
                                          "\"quoted\"",
                                          "back\\slash",
                                          "line\nbreak\r\n",
                                          std::string("nul\0byte", 8),
                                          "\xC3\xBC\xFF",
                                          "# comment"};

} // namespace

TEST(SectionUpdateRandom, AgreesWithAPlainModel) {
  std::mt19937 random(1122); // NOLINT(cert-msc51-cpp): the run must be the same each time
  const TestFolder folder;
  const std::string path =
      writeFile(folder / "task.conf", "# top\n[task1]\n# one\n[task2]\n\n[task3]");
  Model model;
  for (int step = 0; step < 600 * timesMore(); ++step) {
    SCOPED_TRACE(step);
    const int id = 1 + static_cast<int>(random() % 4); // section 4 does not exist
    const std::string key = "key" + std::to_string(random() % 6);
    const std::string &value = kValues[random() % kValues.size()];
    const unsigned what = static_cast<unsigned>(random() % 8);
    Update result = Update::Saved;
    bool threw = false;
    try {
      result = updateSection(path, "task", id, "run", [&](OptionMap &map) {
        (void)(what < 2 ? map.optRemove(key) : map.optSet(key, value));
        if (what == 7) {
          throw std::runtime_error("no");
        }
        return what != 6;
      });
    } catch (const std::runtime_error &) {
      threw = true;
    }
    if (id == 4) {
      ASSERT_EQ(Update::NoSection, result);
    } else {
      ASSERT_EQ(what == 7, threw);
      ASSERT_EQ(what == 6 ? Update::Declined : Update::Saved, result);
      if (what < 2) {
        model.erase({id, key});
      } else if (what < 6) {
        model[{id, key}] = value;
      }
    }
    ASSERT_EQ(model, modelOf(path));
  }
}
