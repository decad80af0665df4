#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"
#include "tests/support/child_process.h"

#include <cerrno>
#include <ctime>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::ElementsAre;
using testing::IsEmpty;
namespace fs = std::filesystem;

std::time_t now = 0; // the time of day, when it must not pass

} // namespace

extern "C" std::time_t time(std::time_t *out) noexcept {
  static auto *const real = realFunction<std::time_t(std::time_t *)>("time");
  const std::time_t shown = now == 0 ? real(nullptr) : now;
  if (out != nullptr) {
    *out = shown;
  }
  return shown;
}

namespace {

// Stops the time of day while it exists.
class StoppedTime {
public:
  StoppedTime() { now = std::time(nullptr); }
  ~StoppedTime() { now = 0; }
  StoppedTime(const StoppedTime &) = delete;
  StoppedTime &operator=(const StoppedTime &) = delete;
};

TEST_F(SessionStoreTest, RemovesEachKind) {
  const std::string local = makeLocal();
  const std::string onVolume = makeOnVolume();
  const std::string lost = makeLost();
  makeDangling("seln.000000");
  writeFile(linkOf("sess.000000"), "");
  for (const SessionInfo &session : list()) {
    EXPECT_TRUE(remove(session)) << session.id << session.path << error.step << error.code;
  }
  EXPECT_THAT(list(), IsEmpty());
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionStoreTest, SparesAUsedSession) {
  for (const bool onVolume : {false, true}) {
    const std::string id = onVolume ? makeOnVolume(kDay) : makeLocal(kDay);
    const SessionInfo session = find(id);
    const timespec before = modifiedOf(session.path);
    const UniqueFd open(::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_FALSE(remove(session));
    EXPECT_EQ(EBUSY, error.code);
    EXPECT_EQ("refused", error.step);
    EXPECT_FALSE(prune(0));
    EXPECT_EQ(session.path, find(id).path);
    EXPECT_EQ(before.tv_sec, modifiedOf(session.path).tv_sec);
    EXPECT_EQ(before.tv_nsec, modifiedOf(session.path).tv_nsec);
  }
}

TEST_F(SessionStoreTest, RemovesPartByPart) {
  const SessionInfo session = find(makeLocal(kDay));
  fs::create_directory(session.path + "/folder");
  writeFile(session.path + "/folder/large", std::string(1000, 'x'));
  std::uint64_t files = 0;
  std::uint64_t bytes = 0;
  SessionRemoval how;
  EXPECT_TRUE(store.size(session, files, bytes, error, &how.parts));
  const std::string other = makeLocal();
  how.parts.push_back({"../" + other, 5});
  how.parts.push_back({"..", 5});
  how.parts.push_back({"", 5});
  std::vector<std::uint64_t> gone;
  how.gone = [&gone](std::uint64_t part) { gone.push_back(part); };
  EXPECT_TRUE(remove(session, how));
  EXPECT_THAT(gone, ElementsAre(5U, 1000U));
  EXPECT_FALSE(isThere(session.path));
  EXPECT_TRUE(isThere(find(other).path + "/file"));
}

TEST_F(SessionStoreTest, RemovesAUsedSessionWhenToldSo) {
  const SessionInfo session = find(makeOnVolume(kDay));
  const UniqueFd open(::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC));
  SessionRemoval how;
  how.evenInUse = true;
  EXPECT_TRUE(remove(session, how));
  EXPECT_THAT(list(), IsEmpty());
}

TEST_F(SessionStoreTest, RemovesNothingThatIsYoungerThanAsked) {
  const SessionInfo session = find(makeLocal(kHour));
  SessionRemoval how;
  how.olderThan = std::chrono::seconds(kDay);
  EXPECT_FALSE(remove(session, how));
  EXPECT_EQ(EAGAIN, error.code);
  EXPECT_TRUE(isThere(session.path + "/file"));
}

TEST_F(SessionStoreTest, CountsWhatIsGoneAsRemoved) {
  const SessionInfo session = find(makeLocal());
  const std::string lostPath = makeLost(kDay);
  const SessionInfo lost = findLost(lostPath);
  fs::remove_all(session.path);
  fs::remove_all(lostPath);
  EXPECT_TRUE(remove(session));
  EXPECT_TRUE(remove(lost));
  fs::remove_all("/tmp/kovabackup");
  EXPECT_TRUE(remove(session));
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

// A path that was listed may have got another meaning.
TEST_F(SessionStoreTest, RefusesWhatIsNoLongerWhatWasListed) {
  const std::string path = makeLost(kDay);
  const SessionInfo lost = findLost(path);
  std::string id;
  ASSERT_TRUE(store.adopt(lost, id, error));
  EXPECT_FALSE(remove(lost));
  EXPECT_EQ(ESTALE, error.code);
  EXPECT_FALSE(store.adopt(lost, id, error));
  EXPECT_EQ(EINVAL, error.code);
  const SessionInfo adopted = find(id);
  EXPECT_FALSE(store.adopt(adopted, id, error));
  EXPECT_EQ(EINVAL, error.code);
  fs::remove(linkOf(id));
  fs::create_symlink("/etc", linkOf(id));
  EXPECT_FALSE(remove(adopted));
  EXPECT_EQ(ESTALE, error.code);
  EXPECT_TRUE(isThere(path + "/file"));
}

TEST_F(SessionStoreTest, NeverTouchesForeignLinks) {
  const TestFolder precious;
  writeFile(precious / "file", "x");
  (void)makeLocal();
  fs::create_symlink(precious.path(), linkOf("seln.000000"));
  EXPECT_FALSE(remove(find("seln.000000")));
  EXPECT_EQ("refused " + linkOf("seln.000000") + ": " + std::to_string(EINVAL),
            failuresOf({error})[0]);
  EXPECT_TRUE(prune(0));
  EXPECT_TRUE(isThere(precious / "file"));
  EXPECT_TRUE(isThere(linkOf("seln.000000")));
}

TEST_F(SessionStoreTest, ChangesNothingInARootThatOthersMayChange) {
  const SessionInfo session = find(makeLocal(kDay));
  const std::string path = makeLost(kDay);
  const SessionInfo lost = findLost(path);
  std::string id;
  for (const char *folder : {"/tmp/kovabackup", kSessionRoot}) {
    const int before = modeOf(folder);
    ASSERT_EQ(0, ::chmod(folder, 0777));
    const std::string refusal = std::string("refused ") + folder + ": " + std::to_string(EPERM);
    EXPECT_FALSE(remove(session));
    EXPECT_EQ(refusal, failuresOf({error})[0]);
    EXPECT_FALSE(prune(0));
    EXPECT_THAT(failuresOf(failed), ElementsAre(refusal));
    EXPECT_FALSE(store.adopt(lost, id, error));
    EXPECT_EQ(refusal, failuresOf({error})[0]);
    EXPECT_FALSE(store.trusted(error));
    ASSERT_EQ(0, ::chmod(folder, static_cast<mode_t>(before)));
  }
  EXPECT_TRUE(store.trusted(error));
  EXPECT_TRUE(isThere(session.path + "/file"));
}

TEST_F(SessionStoreTest, PrunesByAgeAndShowsItInADryRun) {
  const std::string young = makeLocal(kHour);
  const std::string old = makeLocal(3 * kDay);
  const std::string onVolume = makeOnVolume(3 * kDay);
  const std::string lost = makeLost(3 * kDay);
  makeDangling("seln.000000", 3 * kDay);
  makeDangling("seln.000001", kHour);
  EXPECT_TRUE(prune(2 * kDay, true));
  EXPECT_EQ(4U, removed.size());
  EXPECT_EQ(6U, list().size());
  EXPECT_TRUE(prune(2 * kDay)) << testing::PrintToString(failuresOf(failed));
  EXPECT_EQ(4U, removed.size());
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre("seln.000001", young));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionStoreTest, PrunesFromExactlyTheAgeOn) {
  const StoppedTime stopped;
  const std::string young = makeLocal(kDay - 1);
  makeLocal(kDay);
  makeDangling("seln.000000", kDay);
  EXPECT_TRUE(prune(kDay)) << testing::PrintToString(failuresOf(failed));
  EXPECT_EQ(2U, removed.size());
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(young));
}

// Before that, it may be a session that is being created.
TEST_F(SessionStoreTest, TakesADirectoryForLostFromTenMinutesOn) {
  const StoppedTime stopped;
  makeLost(599);
  const std::string lost = makeLost(600);
  ASSERT_EQ(1U, list().size());
  EXPECT_EQ(lost, list()[0].path);
}

TEST_F(SessionStoreTest, TakesNoDirectoryWithMoreModeBitsForLost) {
  const std::string path = makeLost();
  for (const mode_t mode : {01700U, 02700U, 04700U, 0710U, 0701U, 0500U}) {
    ASSERT_EQ(0, ::chmod(path.c_str(), mode));
    EXPECT_THAT(list(), IsEmpty()) << mode;
  }
}

TEST_F(SessionStoreTest, TrustsNoRootThatItsGroupOrOthersMayWrite) {
  makeLocal();
  for (const char *folder : {"/tmp/kovabackup", kSessionRoot}) {
    const int before = modeOf(folder);
    for (const mode_t mode : {0720U, 0702U}) {
      ASSERT_EQ(0, ::chmod(folder, mode));
      EXPECT_FALSE(store.trusted(error)) << folder << " " << mode;
    }
    ASSERT_EQ(0, ::chmod(folder, static_cast<mode_t>(before)));
  }
  EXPECT_TRUE(store.trusted(error));
}

TEST_F(SessionStoreTest, TrustsNoRootOfAnotherUser) {
  makeLocal();
  for (const char *folder : {"/tmp/kovabackup", kSessionRoot}) {
    if (::chown(folder, 12345, 12345) != 0) {
      GTEST_SKIP() << "skipped: only root may give folders away";
    }
    EXPECT_FALSE(store.trusted(error)) << folder;
    ASSERT_EQ(0, ::chown(folder, ::geteuid(), ::getegid()));
  }
  EXPECT_TRUE(store.trusted(error));
}

TEST_F(SessionStoreTest, PrunesTheOthersBesideOneThatIsVeryDeep) {
  const std::string deep = makeLocal(kDay);
  makeLocal(kDay);
  makeOnVolume(kDay);
  int folder = ::open(find(deep).path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  for (int depth = 0; depth < 30000; ++depth) {
    ASSERT_EQ(0, ::mkdirat(folder, "d", 0700));
    const int inner = ::openat(folder, "d", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ::close(folder);
    folder = inner;
  }
  ::close(folder);
  EXPECT_TRUE(prune(0)) << testing::PrintToString(failuresOf(failed));
  EXPECT_EQ(3U, removed.size());
  EXPECT_THAT(list(), IsEmpty());
}

TEST_F(SessionStoreTest, SeveralProcessesPruneAtOnce) {
  for (int round = 0; round < 5; ++round) {
    for (int made = 0; made < 5; ++made) {
      makeLocal(kDay);
      makeOnVolume(kDay);
      makeLost(kDay);
    }
    const std::string used = makeOnVolume(kDay);
    const UniqueFd open(::open((folderOf(used) + "/file").c_str(), O_RDONLY | O_CLOEXEC));
    // Each may find what another is just removing, and says so; none removes what is in use.
    runInChildren(4, [&](int) {
      (void)prune(kHour);
      for (const Error &failure : failed) {
        const bool spared =
            failure.step == "refused" &&
            (failure.code == EBUSY || failure.code == ESTALE || failure.code == EAGAIN);
        EXPECT_TRUE(spared) << failure.step << " " << failure.path << " " << failure.code;
      }
      return !HasFailure();
    });
    EXPECT_FALSE(prune(kHour));
    EXPECT_THAT(failuresOf(failed),
                ElementsAre("refused " + folderOf(used) + ": " + std::to_string(EBUSY)));
    EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(used));
    EXPECT_THAT(namesIn(volume.path), ElementsAre(used));
    EXPECT_TRUE(isThere(folderOf(used) + "/file"));
    fs::remove_all(folderOf(used));
    fs::remove(linkOf(used));
  }
}

} // namespace
