#include "tests/session/session_fixture.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"

#include <cerrno>
#include <filesystem>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {
constexpr const char *kModule = "session";
}

TEST_F(Sessions, DestroyRemovesALocalOneWithAllInIt) {
  Session session;
  ASSERT_TRUE(session.create());
  std::filesystem::create_directories(session.getPath() + "/a/b");
  writeFile(session.getPath() + "/a/b/c", "text");
  EXPECT_TRUE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  EXPECT_TRUE(session.create()) << "the object may be used again";
}

TEST_F(Sessions, DestroyRemovesAVolumeOneAndItsLink) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  writeFile(made.getPath() + "/file", "text");
  Session session;
  ASSERT_TRUE(session.load(made.getId()));
  EXPECT_TRUE(session.destroy());
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(Sessions, DestroyOfNoneDoesNothing) {
  Session session;
  EXPECT_TRUE(session.destroy());
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

TEST_F(Sessions, DestroyTakesWhatIsGoneForRemoved) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  std::filesystem::remove(session.getPath());
  std::filesystem::remove(linkOf(session.getId()));
  EXPECT_TRUE(session.destroy());
}

TEST_F(Sessions, DestroyForgetsWhatItCannotRemove) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  const std::string path = session.getPath();
  const Fault fault("rmdir", 1, EBUSY);
  LogCapture log;
  EXPECT_FALSE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 32,
                                  "rmdir " + path + " failed. Device or resource busy"),
                          errLine(kModule, 200, "failed to remove session[" + path + "]")));
  EXPECT_TRUE(isThere(path));
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty()) << "the link goes all the same";
}

TEST_F(Sessions, DestroyLooksForNoLinkOfALocalOne) {
  Session session;
  ASSERT_TRUE(session.create());
  const std::string path = session.getPath();
  const std::string id = session.getId();
  const Fault removal("rmdir", 1, EBUSY, true);
  const Fault link("unlink", 99, EPERM);
  LogCapture log;
  EXPECT_FALSE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 32,
                                  "rmdir " + path + " failed. Device or resource busy"),
                          errLine(kModule, 200, "failed to remove session[" + path + "]")));
  EXPECT_FALSE(Session::destroyById(id));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 32,
                                  "rmdir " + path + " failed. Device or resource busy"),
                          errLine(kModule, 234, "failed to remove session[" + path + "]")));
  EXPECT_EQ(0, link.calls());
}

TEST_F(Sessions, DestroyLogsALinkThatCannotBeRemoved) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  const std::string link = linkOf(session.getId());
  const Fault fault("unlink", 1, EPERM);
  LogCapture log;
  EXPECT_FALSE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 206, "failed to unlink session link[" + link + "]")));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(Sessions, DestroyRemovesTheDirectoryBeforeTheLink) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  const std::string path = session.getPath();
  const std::string link = linkOf(session.getId());
  const Fault directoryFault("rmdir", 1, EBUSY);
  const Fault linkFault("unlink", 1, EPERM);
  LogCapture log;
  EXPECT_FALSE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 32,
                                  "rmdir " + path + " failed. Device or resource busy"),
                          errLine(kModule, 200, "failed to remove session[" + path + "]"),
                          errLine(kModule, 206, "failed to unlink session link[" + link + "]")));
}

TEST_F(Sessions, DestroyByIdRefusesAnEmptyId) {
  LogCapture log;
  EXPECT_FALSE(Session::destroyById(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 228, "invalid parameter, empty session id")));
}

TEST_F(Sessions, DestroyByIdRemovesEitherKind) {
  FakeVolumes platform(volume.path);
  Session local;
  Session onVolume;
  ASSERT_TRUE(local.create());
  ASSERT_TRUE(onVolume.create(anyVolume()));
  writeFile(local.getPath() + "/file", "text");
  writeFile(onVolume.getPath() + "/file", "text");
  EXPECT_TRUE(Session::destroyById(local.getId()));
  EXPECT_TRUE(Session::destroyById(onVolume.getId()));
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(Sessions, DestroyByIdOfWhatIsGoneSucceeds) {
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA"));
  EXPECT_TRUE(Session::destroyById("sess.AAAAAA"));
  std::filesystem::create_directories(kSessionRoot);
  std::filesystem::create_symlink(volume.path + "/seln.AAAAAA", linkOf("seln.AAAAAA"));
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA")) << "only the link is left";
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(Sessions, DestroyByIdLogsWhatItCannotRemove) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  const std::string path = session.getPath();
  const std::string link = linkOf(session.getId());
  const Fault directory("rmdir", 1, EBUSY);
  const Fault linkFault("unlink", 1, EPERM);
  LogCapture log;
  EXPECT_FALSE(Session::destroyById(session.getId()));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 32,
                                  "rmdir " + path + " failed. Device or resource busy"),
                          errLine(kModule, 234, "failed to remove session[" + path + "]"),
                          errLine(kModule, 240, "failed to unlink session link[" + link + "]")));
}

TEST_F(Sessions, DestroyByIdRemovesAFileInTheLinksPlace) {
  std::filesystem::create_directories(kSessionRoot);
  writeFile(linkOf("seln.AAAAAA"), "text");
  LogCapture log;
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(
                              kModule, 259, "failed to read link[" + linkOf("seln.AAAAAA") + "]")));
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(Sessions, DestroyByIdFailsForADirectoryInTheLinksPlace) {
  std::filesystem::create_directories(linkOf("seln.AAAAAA"));
  LogCapture log;
  EXPECT_FALSE(Session::destroyById("seln.AAAAAA"));
  EXPECT_THAT(
      log.take(),
      ElementsAre(
          errLine(kModule, 259, "failed to read link[" + linkOf("seln.AAAAAA") + "]"),
          errLine(kModule, 240, "failed to unlink session link[" + linkOf("seln.AAAAAA") + "]")));
}

TEST_F(Sessions, DestroyReportsEveryFailingCallAndForgetsTheSession) {
  FakeVolumes platform(volume.path);
  const int before = countOpenDescriptors();
  for (const char *function : {"unlink", "rmdir"}) {
    forEachFailure(function, EPERM, [&](Fault &fault) {
      Session session;
      LogCapture log;
      ASSERT_TRUE(session.create(anyVolume()));
      std::filesystem::create_directory(session.getPath() + "/sub");
      writeFile(session.getPath() + "/sub/file", "text");
      const std::string path = session.getPath();
      const std::string link = linkOf(session.getId());
      const bool destroyed = session.destroy();
      EXPECT_EQ(!fault.fired(), destroyed);
      EXPECT_EQ(destroyed, !isThere(path) && !isThere(link));
      EXPECT_EQ(destroyed, log.take().empty());
      expectEmpty(session);
      std::filesystem::remove_all(path);
      std::filesystem::remove(link);
    });
  }
  EXPECT_EQ(before, countOpenDescriptors());
}
