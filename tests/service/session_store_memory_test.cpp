// Memory runs out at each allocation.
#include "tests/service/session_hooks.h"
#include "tests/service/session_store_support.h"

#include "tests/support/alloc_failure.h"

namespace {

using namespace KovaTest;
using testing::IsEmpty;

class SessionStoreMemory : public SessionStoreTest {
protected:
  const OnlyProcesses only;

  // Whatever was thrown, the sessions are listed and can be removed.
  void expectPrunable() {
    EXPECT_TRUE(prune(0)) << testing::PrintToString(failuresOf(failed));
    EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
    EXPECT_THAT(namesIn(volume.path), IsEmpty());
  }
};

TEST_F(SessionStoreMemory, ListsCompletelyOrThrows) {
  makeLocal(kDay);
  makeOnVolume(kDay);
  makeLost(kDay);
  makeDangling("seln.000000", kDay);
  std::vector<SessionInfo> all;
  bool complete = false;
  forEachAllocation([&] { complete = store.list(all, error); },
                    [&](bool threw) {
                      EXPECT_TRUE(threw || (complete && all.size() == 4));
                      complete = false;
                    });
}

TEST_F(SessionStoreMemory, FindsTheUsersOrThrows) {
  const SessionInfo session = find(makeLocal());
  std::vector<SessionUser> users;
  bool known = false;
  forEachAllocation([&] { known = store.users(session, users); },
                    [&](bool threw) {
                      EXPECT_TRUE(threw || (known && users.empty()));
                      known = false;
                    });
}

TEST_F(SessionStoreMemory, RemovesOrThrowsAndKeepsEverySessionListed) {
  for (const bool onVolume : {false, true}) {
    SessionInfo session;
    bool done = false;
    forEachAllocation(
        [&] {
          if (session.path.empty() || !isThere(session.path)) {
            session = find(onVolume ? makeOnVolume(kDay) : makeLocal(kDay));
          }
          done = store.remove(session, error);
        },
        [&](bool threw) {
          EXPECT_TRUE(threw || done);
          EXPECT_TRUE(!done || !isThere(session.path));
          done = false;
        });
    expectPrunable();
  }
}

TEST_F(SessionStoreMemory, PrunesOrThrows) {
  bool done = false;
  forEachAllocation([&] { done = prune(kHour); },
                    [&](bool threw) {
                      EXPECT_TRUE(threw || done);
                      done = false;
                      (void)prune(0);
                      makeLocal(kDay);
                      makeOnVolume(kDay);
                      makeLost(kDay);
                    });
  expectPrunable();
}

TEST_F(SessionStoreMemory, AdoptsOrThrowsWithoutALink) {
  const SessionInfo lost = findLost(makeLost());
  std::string id;
  bool done = false;
  forEachAllocation([&] { done = store.adopt(lost, id, error); },
                    [&](bool threw) {
                      EXPECT_TRUE(threw || done);
                      EXPECT_EQ(done ? 1U : 0U, namesIn(kSessionRoot).size());
                      done = false;
                    });
}

} // namespace
