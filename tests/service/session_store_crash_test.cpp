// The process is killed before each call that changes the disk.
#include "tests/service/session_hooks.h"
#include "tests/service/session_store_support.h"

#include "tests/support/child_process.h"

#include <csignal>
#include <set>
#include <unistd.h>

namespace {

using namespace KovaTest;
using testing::IsEmpty;
namespace fs = std::filesystem;

class SessionStoreCrash : public SessionStoreTest {
protected:
  const OnlyProcesses only;

  // Runs the operation in a child that is killed before its nth change of the disk. Returns: false
  // when it ended before that.
  static bool killedAt(
      int nth, const std::function<void()> &operation,
      const std::function<void()> &beforeRenaming = [] {}) {
    return runInChild([&] {
             int calls = 0;
             const EachCall each([&](const std::string &call, const std::string &) {
               if (call == "renameat2") {
                 beforeRenaming();
               }
               if (call != "opendir" && call != "flock" && ++calls == nth) {
                 ::kill(::getpid(), SIGKILL);
               }
             });
             operation();
             return 0;
           }) == -1;
  }

  // Calls check after each kill, and once after a complete run. make prepares each run.
  template <typename Make, typename Operation, typename Check>
  void forEachKill(Make make, Operation operation, Check check) {
    constexpr int kMost = 100;
    int nth = 1;
    for (bool killed = true; killed; ++nth) {
      ASSERT_LT(nth, kMost);
      SCOPED_TRACE(nth);
      const SessionInfo session = make();
      killed = killedAt(nth, [&] { operation(session); });
      check(session);
    }
    EXPECT_GT(nth, 3) << "nothing was changed";
  }

  // What is on disk is listed, and the next pruning removes it.
  void expectListedAndPrunable() {
    std::set<std::string> names;
    for (const SessionInfo &session : list()) {
      names.insert(session.path);
      names.insert(session.id.empty() ? session.path : linkOf(session.id));
    }
    for (const std::string &name : namesIn(kSessionRoot)) {
      EXPECT_EQ(1U, names.count(linkOf(name))) << name;
    }
    for (const std::string &name : namesIn(volume.path)) {
      EXPECT_EQ(1U, names.count(folderOf(name))) << name;
    }
    EXPECT_TRUE(prune(0)) << testing::PrintToString(failuresOf(failed));
    EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
    EXPECT_THAT(namesIn(volume.path), IsEmpty());
  }

  void expectSurvivesKills(const std::function<SessionInfo()> &make) {
    forEachKill(
        make, [&](const SessionInfo &session) { (void)remove(session); },
        [&](const SessionInfo &) { expectListedAndPrunable(); });
    forEachKill(
        make, [&](const SessionInfo &) { (void)prune(0); },
        [&](const SessionInfo &) { expectListedAndPrunable(); });
  }

  // With entries that take several steps to remove.
  std::string filled(const std::string &path) const {
    fs::create_directory(path + "/folder");
    writeFile(path + "/folder/one", "1");
    writeFile(path + "/folder/two", "2");
    setAge(path, kDay);
    return path;
  }
};

TEST_F(SessionStoreCrash, LeavesALocalSessionListed) {
  expectSurvivesKills([&] {
    const SessionInfo session = find(makeLocal());
    filled(session.path);
    return session;
  });
}

TEST_F(SessionStoreCrash, LeavesASessionOnAVolumeListed) {
  expectSurvivesKills([&] {
    const SessionInfo session = find(makeOnVolume());
    filled(session.path);
    return session;
  });
}

TEST_F(SessionStoreCrash, LeavesALostSessionListed) {
  expectSurvivesKills([&] { return findLost(filled(makeLost())); });
}

// A young one has no other trace than its links.
TEST_F(SessionStoreCrash, LeavesAYoungSessionOnAVolumeListed) {
  const auto make = [&] { return find(makeOnVolume(0)); };
  forEachKill(
      make, [&](const SessionInfo &session) { (void)remove(session); },
      [&](const SessionInfo &) { expectListedAndPrunable(); });
}

TEST_F(SessionStoreCrash, LeavesAnAdoptedSessionLostOrComplete) {
  int nth = 1;
  for (bool killed = true; killed; ++nth) {
    const SessionInfo lost = findLost(makeLost());
    killed = killedAt(nth, [&] {
      std::string id;
      (void)store.adopt(lost, id, error);
    });
    EXPECT_TRUE(isThere(lost.path + "/file"));
    expectListedAndPrunable();
  }
  EXPECT_EQ(3, nth);
}

// A user arrives just before the session is renamed, so it is found and the session put back.
TEST_F(SessionStoreCrash, LeavesAUsedSessionWithItsData) {
  for (const bool onVolume : {false, true}) {
    int nth = 1;
    for (bool killed = true; killed; ++nth) {
      SCOPED_TRACE(nth);
      const SessionInfo session = find(onVolume ? makeOnVolume(kDay) : makeLocal(kDay));
      int open = -1;
      killed = killedAt(
          nth, [&] { EXPECT_FALSE(remove(session)); },
          [&] {
            open =
                open >= 0 ? open : ::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC);
          });
      bool found = false;
      for (const SessionInfo &now : list()) {
        found = found || isThere(now.path + "/file");
      }
      EXPECT_TRUE(found);
      expectListedAndPrunable();
    }
    EXPECT_EQ(onVolume ? 7 : 4, nth); // five changes, or two
  }
}

} // namespace
