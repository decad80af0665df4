// Each system call fails, once and lastingly.
#include "tests/service/session_hooks.h"
#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"
#include "tests/support/counting_loop.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::IsEmpty;
namespace fs = std::filesystem;

// What a removal calls and what may fail in it. The last one is that of a failed removal of the
// tree, which is then put back.
constexpr const char *kCalls[] = {"open",      "opendir", "readdir", "lstat",     "readlink",
                                  "symlink",   "unlink",  "flock",   "renameat2", "unlinkat",
                                  "getrandom", "read",    "statx"};

enum class Kind { Local, OnVolume, Lost };

class SessionStoreFailure : public SessionStoreTest {
protected:
  SessionInfo make(Kind kind) {
    if (kind == Kind::Lost) {
      const std::string path = makeLost(kDay);
      return findLost(path);
    }
    return find(kind == Kind::Local ? makeLocal(kDay) : makeOnVolume(kDay));
  }

  // Every directory and link of the test, as the list shows them.
  std::set<std::string> listed() {
    std::set<std::string> names;
    for (const SessionInfo &session : list()) {
      names.insert(session.path);
      names.insert(session.id.empty() ? session.path : linkOf(session.id));
    }
    return names;
  }

  // Nothing is on disk that the list does not show.
  void expectAllListed() {
    const std::set<std::string> names = listed();
    for (const std::string &name : namesIn(kSessionRoot)) {
      EXPECT_EQ(1U, names.count(linkOf(name))) << name;
    }
    for (const std::string &name : namesIn(volume.path)) {
      EXPECT_EQ(1U, names.count(folderOf(name))) << name;
    }
  }

  void expectNothingLeft() {
    EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
    EXPECT_THAT(namesIn(volume.path), IsEmpty());
  }

  // Whatever was left is removed by the next pruning.
  void expectPrunable() {
    EXPECT_TRUE(prune(0)) << testing::PrintToString(failuresOf(failed));
    expectNothingLeft();
  }

  // Calls operation(call, nth, code, lasting), which returns whether the call has failed. Not every
  // kind of session needs every call.
  template <typename Operation>
  void forEachCall(int code, Operation operation) {
    int failures = 0;
    for (const char *call : kCalls) {
      for (const bool lasting : {false, true}) {
        bool fired = true;
        for (int nth = 1; fired; ++nth) {
          ASSERT_LT(nth, 1000);
          SCOPED_TRACE(testing::Message()
                       << call << " fails at call " << nth << (lasting ? " and after" : ""));
          fired = operation(call, nth, code, lasting);
          failures += fired ? 1 : 0;
        }
      }
    }
    EXPECT_GT(failures, 20);
  }

  const OnlyProcesses only;
};

TEST_F(SessionStoreFailure, RemovalNeverClaimsWhatIsLeft) {
  for (const Kind kind : {Kind::Local, Kind::OnVolume, Kind::Lost}) {
    forEachCall(EIO, [&](const char *call, int nth, int code, bool lasting) {
      const SessionInfo session = make(kind);
      bool done = false;
      bool fired = false;
      {
        const Fault fault(call, nth, code, lasting);
        done = remove(session);
        fired = fault.fired();
      }
      if (done) {
        expectNothingLeft();
      } else {
        EXPECT_NE(0, error.code);
        EXPECT_NE("", error.step);
        expectAllListed();
      }
      expectPrunable();
      return fired;
    });
  }
}

TEST_F(SessionStoreFailure, PruningNeverClaimsWhatIsLeft) {
  forEachCall(EIO, [&](const char *call, int nth, int code, bool lasting) {
    make(Kind::Local);
    make(Kind::OnVolume);
    make(Kind::Lost);
    bool done = false;
    bool fired = false;
    {
      const Fault fault(call, nth, code, lasting);
      done = prune(kHour);
      fired = fault.fired();
    }
    EXPECT_EQ(done, failed.empty());
    EXPECT_TRUE(!done || removed.size() == 3);
    for (const SessionInfo &session : removed) {
      EXPECT_FALSE(isThere(session.path)) << session.path;
    }
    expectAllListed();
    expectPrunable();
    return fired;
  });
}

// A user arrives just before the session is renamed, so every failure may only keep it. It may be
// left under its fresh name.
TEST_F(SessionStoreFailure, AUsedSessionIsNeverRemoved) {
  for (const Kind kind : {Kind::Local, Kind::OnVolume, Kind::Lost}) {
    forEachCall(EIO, [&](const char *call, int nth, int code, bool lasting) {
      const SessionInfo session = make(kind);
      UniqueFd open;
      bool fired = false;
      removed.clear();
      {
        const EachCall each([&](const std::string &changed, const std::string &) {
          if (changed == "renameat2" && !open) { // not open(2), which the fault may count
            open.reset(static_cast<int>(::syscall(
                SYS_openat, AT_FDCWD, (session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC)));
          }
        });
        const Fault fault(call, nth, code, lasting);
        EXPECT_FALSE(remove(session));
        EXPECT_FALSE(open && prune(0));
        fired = fault.fired();
      }
      for (const SessionInfo &link : removed) { // a fresh one that could not be unlinked
        EXPECT_EQ(State::Dangling, link.state) << link.path;
      }
      struct stat info = {};
      EXPECT_TRUE(!open || (::fstat(open.get(), &info) == 0 && info.st_nlink == 1));
      expectAllListed();
      open.reset();
      expectPrunable();
      return fired;
    });
  }
}

TEST_F(SessionStoreFailure, AdoptionMakesOneLinkOrNone) {
  forEachCall(EIO, [&](const char *call, int nth, int code, bool lasting) {
    const SessionInfo lost = make(Kind::Lost);
    std::string id = "unchanged";
    bool done = false;
    bool fired = false;
    {
      const Fault fault(call, nth, code, lasting);
      done = store.adopt(lost, id, error);
      fired = fault.fired();
    }
    EXPECT_EQ(done ? 1U : 0U, namesIn(kSessionRoot).size());
    EXPECT_EQ(done, id != "unchanged");
    EXPECT_TRUE(isThere(lost.path + "/file"));
    expectPrunable();
    return fired;
  });
}

TEST_F(SessionStoreFailure, ToRemoveADanglingLinkIsReported) {
  const SessionInfo session = find(makeDangling("seln.000000", kDay));
  const Fault fault("unlink", 1, EACCES, true);
  EXPECT_FALSE(remove(session));
  EXPECT_EQ(EACCES, error.code);
  EXPECT_EQ("unlink", error.step);
  EXPECT_EQ(linkOf(session.id), error.path);
}

} // namespace
