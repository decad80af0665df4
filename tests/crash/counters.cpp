// Several processes count in one section by updateSection, each with a number of its own besides.

#include "kovabackup/option_map.h"
#include "kovabackup/service/section_update.h"
#include "tests/crash/files.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"

#include <filesystem>

namespace KovaTest::Crash {
namespace {

using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;

constexpr int kActors = 2;
constexpr const char *kToken = "crash.counters";
constexpr const char *kNeighbour = "stays as it is";
// One that waits with a limit may find the lock taken each time that it tries.
constexpr KOVA::Backup::Service::Millis kNoLimit(-1);
constexpr std::chrono::seconds kSoon(1);

std::string keyOf(int actor) {
  return "by" + std::to_string(actor);
}

// So the file has another size after each update.
std::string fillOf(int count) {
  return std::string(static_cast<std::size_t>(1000 + count * 37 % 9000),
                     static_cast<char>('a' + count % 26));
}

class Counters : public Workload {
public:
  explicit Counters(const std::string &base)
      : file_(makeFolder(base + "/counters") + "/task.conf") {
    OptionMap map;
    map.optSet("text", kNeighbour);
    const bool first = map.optSectionExport(file_, "first", true);
    map.optClear();
    count(map, 0);
    const bool counter = map.optSectionExport(file_, "counter1", true);
    map.optClear();
    map.optSet("text", kNeighbour);
    mustHold(first && counter && map.optSectionExport(file_, "last", true), "making the counters");
  }

  const char *name() const override { return "counters"; }
  int actors() const override { return kActors; }

  void act(int actor, Random & /*random*/) override {
    Progress &own = progress_->at(static_cast<std::size_t>(actor));
    const int next = own.kept + 1;
    own.attempted = next;
    require(change(
                [&](OptionMap &map) {
                  map.optSet(keyOf(actor), next);
                  count(map, map.optInt("count", 0) + 1);
                },
                kNoLimit),
            "updateSection");
    own.kept = next;
  }

  void check(Findings &findings) override {
    OptionMap map;
    findings.expect(map.optSectionLoad(file_, "counter", 1), "the section is lost");
    int sum = 0;
    for (int actor = 0; actor < kActors; ++actor) {
      Progress &own = progress_->at(static_cast<std::size_t>(actor));
      const int found = map.optInt(keyOf(actor), 0);
      findings.expect(own.allows(found), differing("an update is lost", own, found));
      addPromises(1);
      own.settle(found);
      sum += found;
    }
    const int counted = map.optInt("count", -1);
    findings.expect(counted == sum && map.optString("fill", "") == fillOf(counted),
                    "the section is torn");
    for (const char *neighbour : {"first", "last"}) {
      OptionMap other;
      findings.expect(other.optSectionLoad(file_, neighbour, -1) &&
                          other.optString("text", "") == kNeighbour,
                      std::string("another section has changed: ") + neighbour);
    }
    // The next writer gets the lock, and removes what the killed ones left.
    findings.expect(change([](OptionMap &) {}, kSoon), "the next writer fails");
    findings.expect(leftovers(file_).empty(), "left behind: " + leftovers(file_));
  }

private:
  static void count(OptionMap &map, int counted) {
    map.optSet("count", counted);
    map.optSet("fill", fillOf(counted));
  }

  template <typename Change>
  bool change(Change change, KOVA::Backup::Service::Millis limit) const {
    const auto save = [&](OptionMap &map) { return change(map), true; };
    return updateSection(file_, "counter", 1, kToken, save, limit) == Update::Saved;
  }

  const std::string file_;
  std::array<Progress, kActors> *const progress_ = makeShared<std::array<Progress, kActors>>();
};

} // namespace

std::unique_ptr<Workload> makeCounters(const std::string &base) {
  return std::make_unique<Counters>(base);
}

} // namespace KovaTest::Crash
