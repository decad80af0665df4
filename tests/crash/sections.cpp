// Several processes create sections in one file, save them, save them again and remove them, each
// under the lock of the option map.

#include "kovabackup/option_map.h"
#include "tests/crash/files.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"

#include <algorithm>
#include <list>

namespace KovaTest::Crash {
namespace {

using KOVA::Backup::OptionMap;

constexpr int kActors = 2;
constexpr int kPerActor = 4;
constexpr const char *kToken = "crash.sections";
constexpr const char *kPrefix = "job";

// A section of an actor. It is free, or its id is known; then generation says what was saved in it.
struct Entry {
  std::atomic<int> id{0};
  std::atomic<bool> isBeingRemoved{false};
  Progress generation;
};

using Entries = std::array<std::array<Entry, kPerActor>, kActors>;

std::string textOf(int generation) {
  return std::string(static_cast<std::size_t>(generation * 113 % 5000),
                     static_cast<char>('a' + generation % 26)) +
         "\n" + std::to_string(generation);
}

class Sections : public Workload {
public:
  explicit Sections(const std::string &base)
      : file_(makeFolder(base + "/sections") + "/jobs.conf") {}

  const char *name() const override { return "sections"; }
  int actors() const override { return kActors; }

  void act(int actor, Random &random) override {
    Entry &entry = entries_->at(static_cast<std::size_t>(actor))
                       .at(static_cast<std::size_t>(below(random, kPerActor)));
    if (entry.id == 0) {
      create(entry);
    } else if (below(random, 3) == 0) {
      remove(entry);
    } else {
      saveAgain(entry);
    }
  }

  void check(Findings &findings) override {
    std::list<int> ids;
    findings.expect(OptionMap::optSectionListId(file_, kPrefix, ids), "the file cannot be read");
    for (auto &ofActor : *entries_) {
      for (Entry &entry : ofActor) {
        const bool exists = std::count(ids.begin(), ids.end(), entry.id.load()) == 1;
        checkEntry(entry, exists, findings);
        ids.remove(entry.id);
      }
    }
    // Each process may have been killed between the creation of a section and its first save.
    findings.expect(ids.size() <= kActors, std::to_string(ids.size()) + " sections of no process");
    for (const int id : ids) {
      OptionMap map;
      findings.expect(remove(map, id), "the next writer fails");
      findings.expect(map.optInt("generation", 0) == 0, "a removed section is there again");
    }
    OptionMap next;
    findings.expect(next.setLockToken(kToken) && next.optSectionCreate(file_, "next", 1) &&
                        next.optSectionSave() && next.optSectionRemove(),
                    "the next writer fails");
    findings.expect(leftovers(file_).empty(), "left behind: " + leftovers(file_));
  }

private:
  void create(Entry &entry) const {
    OptionMap map;
    require(map.setLockToken(kToken) && map.optSectionCreate(file_, kPrefix, true),
            "optSectionCreate");
    entry.isBeingRemoved = false;
    entry.generation.settle(0);
    entry.id = map.optSectionGetId();
    save(entry, map);
  }

  void saveAgain(Entry &entry) const {
    OptionMap map;
    require(map.setLockToken(kToken) && map.optSectionLoad(file_, kPrefix, entry.id),
            "optSectionLoad");
    save(entry, map);
  }

  static void save(Entry &entry, OptionMap &map) {
    const int next = entry.generation.kept + 1;
    entry.generation.attempted = next;
    map.optSet("generation", next);
    map.optSet("text", textOf(next));
    map.optSet("again", next);
    require(map.optSectionSave(), "optSectionSave");
    entry.generation.kept = next;
  }

  void remove(Entry &entry) const {
    OptionMap map;
    entry.isBeingRemoved = true;
    require(remove(map, entry.id), "optSectionRemove");
    entry.id = 0;
  }

  bool remove(OptionMap &map, int id) const {
    return map.setLockToken(kToken) && map.optSectionLoad(file_, kPrefix, id) &&
           map.optSectionRemove();
  }

  void checkEntry(Entry &entry, bool exists, Findings &findings) {
    if (entry.id == 0) {
      return;
    }
    const std::string name = kPrefix + std::to_string(entry.id);
    if (!exists) {
      // A header is only certain to stay with what is first saved in the section.
      findings.expect(entry.isBeingRemoved || entry.generation.kept == 0, "lost: " + name);
      entry.id = 0;
      return;
    }
    OptionMap map;
    findings.expect(map.optSectionLoad(file_, kPrefix, entry.id), "cannot be loaded: " + name);
    const int found = map.optInt("generation", 0);
    findings.expect(entry.generation.allows(found),
                    differing("a save is lost, " + name, entry.generation, found));
    findings.expect(found == 0 ? map.optString("text", "") == ""
                               : map.optString("text", "") == textOf(found) &&
                                     map.optInt("again", 0) == found,
                    "torn: " + name);
    addPromises(1);
    entry.generation.settle(found);
    entry.isBeingRemoved = false;
  }

  const std::string file_;
  Entries *const entries_ = makeShared<Entries>();
};

} // namespace

std::unique_ptr<Workload> makeSections(const std::string &base) {
  return std::make_unique<Sections>(base);
}

} // namespace KovaTest::Crash
