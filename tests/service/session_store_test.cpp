#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"

#include <cerrno>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::ElementsAre;
using testing::IsEmpty;
namespace fs = std::filesystem;

TEST_F(SessionStoreTest, ListsNothingWithoutSessionsAndCreatesNothing) {
  EXPECT_THAT(list(), IsEmpty());
  EXPECT_FALSE(fs::exists("/tmp/kovabackup"));
}

TEST_F(SessionStoreTest, ListsEveryKindWithTheLostOnesLast) {
  const std::string local = makeLocal(2 * kDay);
  const std::string onVolume = makeOnVolume(3 * kDay);
  const std::string lost = makeLost(4 * kDay);
  makeDangling("seln.000000", kHour);
  fs::create_symlink("/etc", linkOf("seln.000001"));
  writeFile(linkOf("sess.000000"), "");
  const std::vector<SessionInfo> all = list();
  ASSERT_EQ(6U, all.size());
  EXPECT_EQ("seln.000000", all[0].id);
  EXPECT_EQ(State::Dangling, all[0].state);
  EXPECT_EQ(kHour, all[0].age.count() / kHour * kHour);
  EXPECT_EQ(State::Foreign, all[1].state);
  EXPECT_EQ("the link points to '/etc', which is not a session directory", all[1].problem);
  const SessionInfo &volumeSession = find(onVolume);
  EXPECT_EQ(State::Complete, volumeSession.state);
  EXPECT_EQ(folderOf(onVolume), volumeSession.path);
  EXPECT_TRUE(volumeSession.onVolume);
  EXPECT_EQ(3, volumeSession.age.count() / kDay);
  EXPECT_EQ(State::Complete, find(local).state);
  EXPECT_FALSE(find(local).onVolume);
  EXPECT_EQ(State::Broken, find("sess.000000").state);
  EXPECT_EQ(State::Lost, all[5].state);
  EXPECT_EQ("", all[5].id);
  EXPECT_EQ(lost, all[5].path);
  EXPECT_EQ(4, all[5].age.count() / kDay);
}

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

TEST_F(SessionStoreTest, AdoptsALostOneUnderTheNameOfItsDirectory) {
  const std::string path = makeLost(5 * kDay);
  std::string id;
  ASSERT_TRUE(store.adopt(findLost(path), id, error)) << error.step;
  EXPECT_EQ(fs::path(path).filename(), id);
  EXPECT_EQ(State::Complete, find(id).state);
  EXPECT_EQ(path, find(id).path);
  EXPECT_EQ(5, find(id).age.count() / kDay);
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

} // namespace
