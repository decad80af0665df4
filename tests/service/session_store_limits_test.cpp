// Sessions that are just old enough and those that are a second too young, at a time that does not
// change, what a lost session may be, and which root is trusted.

#include "tests/service/session_store_support.h"
#include "tests/support/child_process.h"

#include <cerrno>
#include <sys/stat.h>
#include <utility>

using namespace KovaTest;
namespace fs = std::filesystem;

namespace {

std::time_t frozen = 0; // what time(2) returns; 0 for the real time

class SessionStoreLimits : public SessionStoreTest {
protected:
  void SetUp() override { frozen = std::time(nullptr); }
  void TearDown() override { frozen = 0; }
};

} // namespace

extern "C" time_t time(time_t *out) noexcept {
  struct timespec now {};
  (void)::clock_gettime(CLOCK_REALTIME, &now);
  const time_t result = frozen != 0 ? frozen : now.tv_sec;
  if (out != nullptr) {
    *out = result;
  }
  return result;
}

TEST_F(SessionStoreLimits, ASessionIsLostAfterTenMinutes) {
  const std::string path = makeLost(600);
  EXPECT_EQ(1U, list().size());
  setAge(path, 599);
  EXPECT_EQ(0U, list().size());
}

TEST_F(SessionStoreLimits, ASessionOfTheGivenAgeIsPruned) {
  const std::string old = makeLocal(kHour);
  const std::string young = makeLocal(kHour - 1);
  for (const bool dryRun : {true, false}) {
    removed.clear();
    EXPECT_TRUE(prune(kHour, dryRun)) << testing::PrintToString(failuresOf(failed));
    ASSERT_EQ(1U, removed.size());
    EXPECT_EQ(old, removed[0].id);
  }
  ASSERT_EQ(1U, list().size());
  EXPECT_EQ(young, list()[0].id);
}

TEST_F(SessionStoreLimits, ADanglingLinkOfTheGivenAgeIsPruned) {
  makeDangling("seln.000000", kHour);
  makeDangling("seln.000001", kHour - 1);
  EXPECT_TRUE(prune(kHour)) << testing::PrintToString(failuresOf(failed));
  ASSERT_EQ(1U, list().size());
  EXPECT_EQ("seln.000001", list()[0].id);
}

TEST_F(SessionStoreLimits, ASessionBelowTheGivenAgeIsNotRemoved) {
  SessionRemoval how;
  how.olderThan = std::chrono::seconds(kHour);
  const SessionInfo young = find(makeLocal(kHour - 1));
  EXPECT_FALSE(remove(young, how));
  EXPECT_EQ("refused", error.step);
  EXPECT_EQ(EAGAIN, error.code);
  EXPECT_TRUE(fs::exists(young.path));
  const SessionInfo old = find(makeLocal(kHour));
  EXPECT_TRUE(remove(old, how)) << error.step;
  EXPECT_FALSE(fs::exists(old.path));
}

TEST_F(SessionStoreLimits, ADanglingLinkBelowTheGivenAgeIsNotRemoved) {
  SessionRemoval how;
  how.olderThan = std::chrono::seconds(kHour);
  const SessionInfo young = find(makeDangling("seln.000000", kHour - 1));
  EXPECT_FALSE(remove(young, how));
  EXPECT_EQ(EAGAIN, error.code);
  EXPECT_TRUE(fs::is_symlink(linkOf(young.id)));
}

TEST_F(SessionStoreLimits, ARootOfTheSuperuserIsTrustedByEveryUser) {
  (void)makeLocal();
  if (::geteuid() != 0) {
    GTEST_SKIP() << "skipped: not root";
  }
  EXPECT_TRUE(store.trusted(error));
  EXPECT_EQ(0, runInChild([this] { return ::setuid(12345) == 0 && store.trusted(error) ? 0 : 1; }));
}

TEST_F(SessionStoreLimits, ARootThatIsAFileIsNotTrusted) {
  (void)KOVA::Backup::Path::createIpcTempPath("lock", 0700);
  writeFile(SessionStore::root(), "");
  ASSERT_EQ(0, ::chmod(SessionStore::root().c_str(), 0600));
  EXPECT_FALSE(store.trusted(error));
  EXPECT_EQ("refused", error.step);
  fs::remove(SessionStore::root());
}

TEST_F(SessionStoreLimits, ADirectoryOfAnyOtherModeIsNotALostSession) {
  const std::string path = makeLost(kDay);
  for (const mode_t mode :
       {0600U, 0500U, 0300U, 0710U, 0720U, 0740U, 0701U, 0702U, 0704U, 01700U, 02700U, 04700U}) {
    ASSERT_EQ(0, ::chmod(path.c_str(), mode));
    EXPECT_EQ(0U, list().size()) << std::oct << mode;
  }
  ASSERT_EQ(0, ::chmod(path.c_str(), 0700));
  EXPECT_EQ(1U, list().size());
}
