// Users that arrive while a session is being removed.
#include "tests/service/session_hooks.h"
#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"

#include <cerrno>
#include <fcntl.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::IsEmpty;
namespace fs = std::filesystem;

using SessionStoreArrival = SessionStoreTest;

// Does something once, just before the session is renamed.
class AtRenaming {
public:
  explicit AtRenaming(const std::function<void()> &act)
      : each_([this, act](const std::string &call, const std::string &) {
          if (call == "renameat2" && !done_) {
            done_ = true;
            act();
          }
        }) {}

private:
  bool done_ = false;
  const EachCall each_;
};

TEST_F(SessionStoreArrival, OfAUserJustBeforeTheRenamingKeepsTheSession) {
  for (const bool onVolume : {false, true}) {
    const std::string id = onVolume ? makeOnVolume(kDay) : makeLocal(kDay);
    const SessionInfo session = find(id);
    const timespec before = modifiedOf(session.path);
    UniqueFd open;
    {
      const AtRenaming arrival(
          [&] { open.reset(::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC)); });
      EXPECT_FALSE(remove(session));
      EXPECT_EQ(EBUSY, error.code);
    }
    EXPECT_EQ(session.path, find(id).path);
    EXPECT_EQ(State::Complete, find(id).state);
    EXPECT_TRUE(isThere(session.path + "/file"));
    EXPECT_EQ(before.tv_sec, modifiedOf(session.path).tv_sec);
    EXPECT_EQ(before.tv_nsec, modifiedOf(session.path).tv_nsec);
    open.reset();
    EXPECT_TRUE(remove(session));
    EXPECT_THAT(list(), IsEmpty());
  }
}

// Loading leaves nothing open, but sets the time.
TEST_F(SessionStoreArrival, OfALoadJustBeforeTheRenamingKeepsTheSession) {
  for (const bool onVolume : {false, true}) {
    const std::string id = onVolume ? makeOnVolume(kDay) : makeLocal(kDay);
    const SessionInfo session = find(id);
    Session loaded;
    {
      const AtRenaming arrival([&] { EXPECT_TRUE(loaded.load(id)); });
      EXPECT_FALSE(prune(kHour));
      EXPECT_THAT(removed, IsEmpty());
      EXPECT_THAT(failuresOf(failed),
                  testing::ElementsAre("refused " + session.path + ": " + std::to_string(EAGAIN)));
    }
    EXPECT_EQ(session.path, find(id).path);
    EXPECT_LT(find(id).age.count(), kHour);
    EXPECT_TRUE(loaded.destroy());
  }
}

TEST_F(SessionStoreArrival, OfALoadAfterTheRenamingFindsNoSession) {
  const std::string id = makeOnVolume(kDay);
  LogCapture log;
  bool loaded = true;
  {
    bool renamed = false;
    const EachCall each([&](const std::string &call, const std::string &) {
      renamed = renamed || call == "renameat2";
      if (renamed && call == "opendir") {
        Session session;
        loaded = loaded && session.load(id);
      }
    });
    EXPECT_TRUE(remove(find(id)));
  }
  EXPECT_FALSE(loaded);
  EXPECT_FALSE(log.take().empty());
}

// Another session took the old name while the users were looked for.
TEST_F(SessionStoreArrival, OfAnotherSessionUnderTheOldNameKeepsBoth) {
  for (const bool onVolume : {false, true}) {
    const std::string id = onVolume ? makeOnVolume(kDay) : makeLocal(kDay);
    const SessionInfo session = find(id);
    UniqueFd open;
    {
      int renamings = 0;
      const EachCall each([&](const std::string &call, const std::string &) {
        if (call == "renameat2" && ++renamings == 1) {
          open.reset(::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC));
        } else if (call == "renameat2") {
          fs::create_directory(session.path);
        }
      });
      EXPECT_FALSE(remove(session));
    }
    EXPECT_EQ("renameat2", error.step);
    EXPECT_EQ(EEXIST, error.code);
    EXPECT_TRUE(isThere(error.path + "/file"));
    if (onVolume) { // its id leads to where it is now
      EXPECT_EQ(error.path, find(id).path);
      EXPECT_EQ(1U, namesIn(kSessionRoot).count(id));
    } else { // its id is the fresh name
      EXPECT_EQ(error.path, find(fs::path(error.path).filename()).path);
    }
    EXPECT_FALSE(isThere(session.path + "/file"));
    open.reset();
    fs::remove(session.path);
    EXPECT_TRUE(prune(0));
  }
}

} // namespace
