// What is listed, found, counted and adopted.
#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"
#include "kovaplatform/kovacore.h"
#include "tests/support/child_process.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::ElementsAre;
using testing::IsEmpty;
namespace fs = std::filesystem;

using SessionStoreList = SessionStoreTest;

TEST_F(SessionStoreList, ListsNothingWithoutSessionsAndCreatesNothing) {
  EXPECT_THAT(list(), IsEmpty());
  EXPECT_FALSE(fs::exists("/tmp/kovabackup"));
}

TEST_F(SessionStoreList, ListsEveryKindWithTheLostOnesLast) {
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

TEST_F(SessionStoreList, AdoptsALostOneUnderTheNameOfItsDirectory) {
  const std::string path = makeLost(5 * kDay);
  std::string id;
  ASSERT_TRUE(store.adopt(findLost(path), id, error)) << error.step;
  EXPECT_EQ(fs::path(path).filename(), id);
  EXPECT_EQ(State::Complete, find(id).state);
  EXPECT_EQ(path, find(id).path);
  EXPECT_EQ(5, find(id).age.count() / kDay);
}

TEST_F(SessionStoreList, ListsAsLostOnlyWhatASessionMayHaveBeen) {
  makeLost(kDay);
  const std::string young = makeLost(9 * 60);
  const std::string open = makeLost(kDay);
  ASSERT_EQ(0, ::chmod(open.c_str(), 0755));
  fs::rename(makeLost(kDay), folderOf("seln.toolong"));
  fs::rename(makeLost(kDay), folderOf("sess.abcdef"));
  fs::rename(makeLost(kDay), folderOf("seln.abc_ef"));
  writeFile(folderOf("seln.afile0"), "");
  ASSERT_EQ(0, ::chmod(folderOf("seln.afile0").c_str(), 0700));
  setAge(folderOf("seln.afile0"), kDay);
  fs::create_directory_symlink("/etc", folderOf("seln.alink0"));
  setAge(folderOf("seln.alink0"), kDay);
  EXPECT_EQ(1U, list().size());
  setAge(young, 11 * 60);
  EXPECT_EQ(2U, list().size());
  setAge(young, -kDay); // the clock was set back
  EXPECT_EQ(1U, list().size());
}

TEST_F(SessionStoreList, ListsAllLostSessionsToRootAndTheirOwnToOthers) {
  const std::string path = makeLost(kDay);
  if (::chown(path.c_str(), 12345, 12345) != 0) {
    GTEST_SKIP() << "skipped: not root";
  }
  EXPECT_EQ(1U, list().size());
  const auto listAs = [this](uid_t user) {
    return runInChild([&] {
      return ::chmod("/tmp/kovabackup/session", 0755) == 0 && ::setuid(user) == 0
                 ? static_cast<int>(list().size())
                 : -1;
    });
  };
  EXPECT_EQ(1, listAs(12345));
  EXPECT_EQ(0, listAs(12346));
}

// The link may name another path of the same directory.
TEST_F(SessionStoreList, ListsNoDirectoryAsLostToWhichALinkLeadsByAnotherPath) {
  const std::string path = makeLost(kDay);
  fs::create_symlink(volume.path + "/../" + path, linkOf("seln.other1"));
  const std::vector<SessionInfo> all = list();
  ASSERT_EQ(1U, all.size());
  EXPECT_EQ(State::Complete, all[0].state);
}

TEST_F(SessionStoreList, ListsLostSessionsWhenTheRootIsGone) {
  const std::string path = makeLost(kDay);
  fs::remove_all("/tmp/kovabackup");
  EXPECT_EQ(path, findLost(path).path);
  EXPECT_TRUE(prune(kHour, true));
  EXPECT_EQ(1U, removed.size());
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
  EXPECT_TRUE(prune(kHour)) << testing::PrintToString(failuresOf(failed));
  EXPECT_FALSE(isThere(path));
}

// Every directory on a volume would look lost.
TEST_F(SessionStoreList, ListsNoLostSessionsWhenTheRootCannotBeRead) {
  makeOnVolume(kDay);
  std::vector<SessionInfo> all;
  {
    const Fault fault("opendir", 1, EACCES);
    EXPECT_FALSE(store.list(all, error));
  }
  EXPECT_EQ("opendir /tmp/kovabackup/session: 13", failuresOf({error})[0]);
  EXPECT_THAT(all, IsEmpty());
}

TEST_F(SessionStoreList, ListsTheOtherEntriesWhenOneCannotBeExamined) {
  makeLocal(kDay);
  makeLocal(kDay);
  const std::string path = makeLost(kDay);
  std::vector<SessionInfo> all;
  {
    const Fault fault("lstat", 1, EIO);
    EXPECT_FALSE(store.list(all, error));
  }
  EXPECT_EQ("lstat", error.step);
  EXPECT_EQ(1U, all.size()) << "nor the lost one, to which the other entry might lead";
}

TEST_F(SessionStoreList, ListsTheOtherVolumesWhenOneCannotBeRead) {
  platform.volumes.push_back({"/volume0", 50});
  platform.mountOf["/volume0"] = "/volume0";
  platform.tmpPaths["/volume0"] = "/tmp"; // removed between the platform's check and the search
  const std::string path = makeLost(kDay);
  std::vector<SessionInfo> all;
  {
    const Fault fault("opendir", 3, EIO); // the root and the first volume precede
    EXPECT_FALSE(store.list(all, error));
  }
  EXPECT_EQ("opendir /tmp: 5", failuresOf({error})[0]);
  ASSERT_EQ(1U, all.size());
  EXPECT_EQ(path, all[0].path);
}

// Null means both that there is no volume and that the platform failed.
TEST_F(SessionStoreList, IsNotCompleteWhenThePlatformCannotListTheVolumes) {
  const std::string id = makeLocal();
  makeLost(kDay);
  platform.enumerationError = 0x2a01;
  std::vector<SessionInfo> all;
  EXPECT_FALSE(store.list(all, error));
  EXPECT_EQ("KOVAMountVolAllEnum", error.step);
  EXPECT_NE(0, error.code);
  ASSERT_EQ(1U, all.size());
  EXPECT_EQ(id, all[0].id);
}

TEST_F(SessionStoreList, DoesNotPruneCompletelyWhenThePlatformCannotListTheVolumes) {
  const std::string path = makeLost(kDay);
  platform.enumerationError = 0x2a01;
  EXPECT_FALSE(prune(0));
  EXPECT_EQ(1U, failed.size());
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(SessionStoreList, IsNotCompleteWhenThePlatformHasNoLocations) {
  platform.supportedLocation = 0;
  platform.locationError = 0x2a01;
  std::vector<SessionInfo> all;
  EXPECT_FALSE(store.list(all, error));
  EXPECT_EQ("KOVAVolumeSupportLocGet", error.step);
}

TEST_F(SessionStoreList, IsCompleteWhereNoVolumeIsSupported) {
  const std::string id = makeLocal();
  platform.supportedLocation = 0;
  ASSERT_EQ(1U, list().size());
  EXPECT_EQ(id, list()[0].id);
}

TEST_F(SessionStoreList, IsCompleteWhenThePlatformLeavesAnErrorButSucceeds) {
  platform.locationError = 0x2a01;
  platform.volumes.clear();
  EXPECT_TRUE(list().empty());
}

TEST_F(SessionStoreList, LeavesOutAVolumeWithoutAMountPath) {
  platform.volumes.push_back({"", 50});
  platform.tmpPathsAsked.clear();
  EXPECT_TRUE(list().empty());
  EXPECT_THAT(platform.tmpPathsAsked, testing::Not(testing::Contains("")));
}

TEST_F(SessionStoreList, KeepsThePlatformsLastErrorWhenThereAreNoVolumes) {
  platform.volumes.clear();
  KLIBCErrSetEx(0x77, "caller.c", 5);
  EXPECT_TRUE(list().empty());
  EXPECT_EQ(0x77, KLIBCErrGet());
  EXPECT_STREQ("caller.c", KLIBCErrorGetFile());
  EXPECT_EQ(5, KLIBCErrorGetLine());
}

TEST_F(SessionStoreList, FindsASessionByItsId) {
  const std::string id = makeOnVolume(kDay);
  SessionInfo session;
  EXPECT_TRUE(store.find(id, session, error));
  EXPECT_EQ(id, session.id);
  for (const char *bad : {"", "sess.", "sess.abc/ef", "seln.abcdefg", "__sess__.lock", ".."}) {
    EXPECT_FALSE(store.find(bad, session, error));
    EXPECT_EQ(EINVAL, error.code) << bad;
  }
  EXPECT_FALSE(store.find("sess.abcdef", session, error));
  EXPECT_EQ(ENOENT, error.code);
  EXPECT_EQ(id, session.id) << "untouched";
}

TEST_F(SessionStoreList, AddsUpFilesBytesAndParts) {
  const SessionInfo session = find(makeLocal(kDay));
  fs::create_directories(session.path + "/folder/inner");
  writeFile(session.path + "/folder/inner/large", std::string(1000, 'x'));
  fs::create_directory_symlink("/usr", session.path + "/link");
  std::uint64_t files = 99;
  std::uint64_t bytes = 99;
  std::vector<KOVA::Backup::Service::SessionPart> parts;
  EXPECT_TRUE(store.size(session, files, bytes, error, &parts));
  EXPECT_EQ(3U, files);
  EXPECT_EQ(1005U, bytes);
  ASSERT_EQ(3U, parts.size());
  EXPECT_EQ("file", parts[0].name);
  EXPECT_EQ(5U, parts[0].bytes);
  EXPECT_EQ("folder", parts[1].name);
  EXPECT_EQ(1000U, parts[1].bytes);
  EXPECT_EQ("link", parts[2].name);
  EXPECT_TRUE(store.size(session, files, bytes, error, &parts));
  EXPECT_EQ(3U, parts.size()) << "those of the call before are not kept";
  EXPECT_TRUE(store.size(find(makeDangling("seln.000000")), files, bytes, error, &parts));
  EXPECT_EQ(0U, files);
  EXPECT_THAT(parts, IsEmpty());
}

TEST_F(SessionStoreList, SaysThatASizeIsIncomplete) {
  const SessionInfo session = find(makeLocal(kDay));
  std::uint64_t files = 0;
  std::uint64_t bytes = 0;
  const Fault fault("openat", 1, EIO, true);
  EXPECT_FALSE(store.size(session, files, bytes, error));
  EXPECT_EQ(EIO, error.code);
}

TEST_F(SessionStoreList, AdoptsUnderAFreshNameWhenTheOldOneIsTaken) {
  const std::string path = makeLost(kDay);
  const std::string name = fs::path(path).filename();
  makeDangling(name, kDay);
  std::string id;
  ASSERT_TRUE(store.adopt(findLost(path), id, error));
  EXPECT_NE(name, id);
  EXPECT_TRUE(SessionStore::isId(id));
  EXPECT_EQ(path, find(id).path);
  EXPECT_EQ(State::Dangling, find(name).state);
}

TEST_F(SessionStoreList, AdoptsOnlyWhatBelongsToTheOwnerOfTheRoot) {
  const std::string path = makeLost(kDay);
  if (::chown(path.c_str(), 12345, 12345) != 0) {
    GTEST_SKIP() << "skipped: not root";
  }
  std::string id;
  EXPECT_FALSE(store.adopt(findLost(path), id, error));
  EXPECT_EQ("refused " + path + ": " + std::to_string(EPERM), failuresOf({error})[0]);
}

TEST_F(SessionStoreList, AdoptsWithoutARoot) {
  const std::string path = makeLost(kDay);
  fs::remove_all("/tmp/kovabackup");
  std::string id;
  ASSERT_TRUE(store.adopt(findLost(path), id, error));
  EXPECT_EQ(0700, modeOf(kSessionRoot));
  Session session;
  EXPECT_TRUE(session.load(id));
  EXPECT_TRUE(session.destroy());
}

TEST_F(SessionStoreList, HandlesManySessions) {
  for (int made = 0; made < 500; ++made) {
    fs::create_directory(folderOf("seln.M" + std::to_string(10000 + made)));
    ASSERT_EQ(0, ::chmod(folderOf("seln.M" + std::to_string(10000 + made)).c_str(), 0700));
    setAge(folderOf("seln.M" + std::to_string(10000 + made)), kDay);
  }
  EXPECT_EQ(500U, list().size());
}

} // namespace
