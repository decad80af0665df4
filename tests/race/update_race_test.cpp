// Many processes update one section under one lock token, through either library.

#include "kovabackup/service/section_update.h"
#include "tests/race/race_support.h"
#include "tests/support/child_process.h"
#include "tests/support/files.h"

#include <chrono>
#include <gmock/gmock.h>
#include <random>
#include <unistd.h>

using namespace KovaTest;

namespace {

using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Millis;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;

constexpr int kProcesses = 64;
constexpr const char *kToken = "run";

bool countIn(OptionMap &map, const std::string &key) {
  return map.optSet(key, map.optInt(key, 0) + 1);
}

// The ways in which programs update a section.
enum class Way { Waits, TriesAgain, HoldsTheLock };

bool updateOnce(const std::string &path, Way way, const std::string &key) {
  const auto change = [&](OptionMap &map) { return countIn(map, "all") && countIn(map, key); };
  if (way == Way::Waits || way == Way::TriesAgain) {
    const Millis limit = way == Way::Waits ? Millis(-1) : Millis(600000);
    return updateSection(path, "task", 1, kToken, change, limit) == Update::Saved;
  }
  OptionMap lock;
  OptionMap map;
  return lock.setLockToken(kToken) && lock.lock() && map.optSectionLoad(path, "task", 1) &&
         change(map) && map.optSectionSave() && lock.unlock();
}

int loaded(const std::string &path, const std::string &key) {
  OptionMap map;
  EXPECT_TRUE(map.optSectionLoad(path, "task", 1));
  return map.optInt(key, 0);
}

} // namespace

TEST(UpdateRace, LosesNoUpdateUnderOneToken) {
  const int updates = share(50, 200);
  const TestFolder folder;
  const std::string path = writeFile(folder / "task.conf", "[task1]\n[other]\nx=1\n");
  const unsigned seed = printedSeed();
  const auto begin = std::chrono::steady_clock::now();
  runInChildren(kProcesses, [&](int number) {
    std::mt19937 random(seed + static_cast<unsigned>(number));
    bool fine = true;
    for (int i = 0; i < updates && fine; ++i) {
      fine = updateOnce(path, static_cast<Way>(random() % 3), "of" + std::to_string(number));
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
  EXPECT_THAT(namesIn("/tmp/kovabackup/lock"), testing::ElementsAre(kToken));
}
