// Processes make and remove sessions while names are so few that links and folders collide all the
// time: some names are taken by the links of earlier sessions, others by sessions on other volumes.

#include "tests/race/few_names.h"
#include "tests/race/race_support.h"
#include "tests/session/session_fixture.h"
#include "tests/session/session_ring.h"

#include "tests/support/child_process.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <regex>
#include <vector>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::IsEmpty;
namespace fs = std::filesystem;

namespace {

constexpr int kProcesses = 32;
constexpr int kVolumes = 4;
constexpr unsigned kNames = 128;
constexpr unsigned kTaken = 48;

class SessionCollisions : public Sessions {
protected:
  SessionCollisions() : names(kNames, printedSeed()) {
    fs::create_directories(kSessionRoot);
    fs::permissions(kSessionRoot, fs::perms::owner_all);
    for (unsigned number = 0; number < kTaken; ++number) {
      fs::create_symlink("stale", linkOf("seln." + FewNames::letters(number)));
    }
    for (int number = 0; number < kVolumes; ++number) {
      folders.push_back(volume.path + "/" + std::to_string(number));
      filters.push_back(boost::make_shared<FixedFilter>(folders.back()));
    }
  }
  void SetUp() override {
    Sessions::SetUp();
    for (const std::string &folder : folders) {
      fs::create_directory(folder);
    }
  }

  // One of six sessions is local. A creation fails when another process takes the name of the link
  // in the moment at which it is free; it is repeated then.
  bool create(Session &session, int process, int round) {
    const int kind = (process + round) % 6;
    if (kind == 0) {
      return session.create();
    }
    const auto &filter = filters[static_cast<std::size_t>((process + round) % kVolumes)];
    for (int tries = 0; tries < 1000; ++tries) {
      if (session.create(filter)) {
        *collisions += fs::path(session.getPath()).filename() != session.getId() ? 1 : 0;
        return true;
      }
      ++*refusals;
    }
    return false;
  }

  // Without the lines of the creations that were refused; each has two.
  int complaintsOf(const std::string &file, std::vector<std::string> &others) const {
    const std::regex refused(R"(3 \(PID\) \[err\] session:(60 failed to create symlink\[.*\])"
                             R"(|113 failed to create_sesslink\[.*\]))");
    int lines = 0;
    std::ifstream in(file);
    for (std::string line; std::getline(in, line);) {
      if (std::regex_match(line, refused)) {
        ++lines;
      } else {
        others.push_back(line);
      }
    }
    return lines / 2;
  }

  static std::set<std::string> takenNames() {
    std::set<std::string> taken;
    for (unsigned number = 0; number < kTaken; ++number) {
      taken.insert("seln." + FewNames::letters(number));
    }
    return taken;
  }

  const FewNames names;
  std::vector<std::string> folders;
  std::vector<boost::shared_ptr<FilterVolume>> filters;
  const SharedCounter collisions;
  const SharedCounter refusals;
};

} // namespace

TEST_F(SessionCollisions, LoseNoSessionAndLeaveNothing) {
  const TestFolder scratch;
  const std::string complaints = writeFile(scratch / "complaints", "");
  const int rounds = share(64, 313);
  {
    LogCapture log(complaints);
    runRing(
        {kProcesses, rounds,
         [&](Session &session, int process, int round) { return create(session, process, round); },
         complaints});
  }
  std::printf("%d sessions of %d processes; names of links taken: %d, creations refused: %d\n",
              kProcesses * rounds, kProcesses, collisions->load(), refusals->load());
  std::vector<std::string> others;
  EXPECT_EQ(*refusals, complaintsOf(complaints, others));
  EXPECT_THAT(others, IsEmpty());
  EXPECT_LT(kProcesses * rounds / 10, *collisions) << "too few collisions to show anything";
  std::set<std::string> expected = takenNames();
  expected.insert("__sess__.lock");
  EXPECT_EQ(expected, namesIn(kSessionRoot));
  for (const std::string &folder : folders) {
    EXPECT_THAT(namesIn(folder), IsEmpty());
  }
}
