#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "tests/session/session_fixture.h"
#include "tests/support/census.h"

#include <cerrno>
#include <type_traits>
#include <utime.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

constexpr const char *kModule = "session";
constexpr const char *kRoot = "/tmp/kovabackup/session";

std::string linkOf(const std::string &id) {
  return std::string(kRoot) + "/" + id;
}

void expectEmpty(const Session &session) {
  EXPECT_EQ("", session.getId());
  EXPECT_EQ("", session.getPath());
}

void makeOld(const std::string &path) {
  const utimbuf old{1000, 1000};
  ASSERT_EQ(0, ::utime(path.c_str(), &old));
}

} // namespace

// --- shape --------------------------------------------------------------------------------------

TEST(SessionShape, IsOneOwningPointer) {
  EXPECT_EQ(sizeof(void *), sizeof(Session));
  EXPECT_FALSE(std::is_copy_constructible<Session>::value);
  EXPECT_FALSE(std::is_copy_assignable<Session>::value);
  EXPECT_FALSE(std::is_move_constructible<Session>::value);
  EXPECT_FALSE(std::is_move_assignable<Session>::value);
  EXPECT_FALSE(std::is_polymorphic<Session>::value);
}

TEST_F(Sessions, HoldsIdAndPathInThisOrderBehindIt) {
  Session session;
  ASSERT_TRUE(session.create());
  struct Record {
    std::string id, path;
  };
  const Record *record = *reinterpret_cast<Record **>(&session);
  EXPECT_EQ(session.getId(), record->id);
  EXPECT_EQ(session.getPath(), record->path);
}

TEST(SessionShape, IsEmptyAtFirst) {
  expectEmpty(Session());
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

// --- local sessions
// -------------------------------------------------------------------------------

TEST_F(Sessions, LocalOneOnAFreshSystemMakesTheRootAndAPrivateDirectory) {
  Session session;
  ASSERT_TRUE(session.create());
  EXPECT_THAT(session.getId(), MatchesRegex("sess\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(linkOf(session.getId()), session.getPath());
  EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
  EXPECT_TRUE(std::filesystem::is_directory(session.getPath()));
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(0700, modeOf(kRoot));
  EXPECT_EQ(0755, modeOf("/tmp/kovabackup"));
  EXPECT_THAT(namesIn(kRoot), ElementsAre(session.getId())) << "no lock file without need";
}

TEST_F(Sessions, HaveTheirModesWhateverTheUmask) {
  const ScopedUmask umask(0777);
  Session session;
  ASSERT_TRUE(session.create());
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(0700, modeOf(kRoot));
}

TEST_F(Sessions, ResetTheModeOfTheRootOnEveryCreation) {
  Session().create();
  ASSERT_EQ(0, ::chmod(kRoot, 0777));
  Session().create();
  EXPECT_EQ(0700, modeOf(kRoot));
}

TEST_F(Sessions, OutliveTheirObject) {
  std::string path;
  {
    Session session;
    ASSERT_TRUE(session.create());
    path = session.getPath();
  }
  EXPECT_TRUE(isThere(path));
}

TEST_F(Sessions, DoNotReplaceABoundOne) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create());
  const std::string id = session.getId();
  const std::string path = session.getPath();
  const std::string bound = "session has already existed[" + id + "][" + path + "]";
  LogCapture log;
  EXPECT_FALSE(session.create());
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 136, bound)));
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 153, bound)));
  EXPECT_EQ(0, platform.enumerations);
  EXPECT_EQ(id, session.getId());
  EXPECT_EQ(path, session.getPath());
  EXPECT_THAT(namesIn(kRoot), ElementsAre(id));
}

TEST_F(Sessions, LocalOneLogsARootThatCannotBeMade) {
  const Fault fault("mkdir", 2, ENOSPC);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create());
  expectEmpty(session);
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("path/path_util", 409,
                                  "mkdir /tmp/kovabackup/session path failed. No space left on "
                                  "device"),
                          errLine(kModule, 82, "failed to create temp directory []")));
}

TEST_F(Sessions, LocalOneLogsADirectoryThatCannotBeMadeBySelnAllTheSame) {
  const Fault fault("mkdtemp", 1, ENOSPC);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create());
  expectEmpty(session);
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 99,
                                              "ScopedTempFolder failed"
                                              "[/tmp/kovabackup/session/seln]")));
}

TEST_F(Sessions, LocalOneLeavesADirectoryWhoseModeCannotBeSet) {
  const Fault fault("chmod", 3, EPERM); // after those of the two levels above
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create());
  EXPECT_EQ(1U, log.take().size());
  EXPECT_EQ(1U, namesIn(kRoot).size());
}

// --- volume sessions
// ------------------------------------------------------------------------------

TEST_F(Sessions, OnAVolumeAreLinkedFromTheRootByTheirId) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_THAT(session.getId(), MatchesRegex("seln\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(volume.path + "/" + session.getId(), session.getPath());
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(session.getPath(), std::filesystem::read_symlink(linkOf(session.getId())).string());
  EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
  EXPECT_THAT(namesIn(kRoot), ElementsAre(session.getId())) << "no lock file without need";
  EXPECT_EQ(0700, modeOf(kRoot));
}

TEST_F(Sessions, OnAVolumeUnderTmpAreLocalOnes) {
  const Scratch scratch;
  FakeVolumes platform(scratch.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_EQ(linkOf(session.getId()), session.getPath());
  EXPECT_EQ("sess.", session.getId().substr(0, 5));
  EXPECT_THAT(namesIn(scratch.path), IsEmpty()) << "the directory under /tmp is not used";
}

TEST_F(Sessions, TellTheKindByFourBytesAlone) {
  for (const char *dir : {"/tmp", "/tmpdata", "/tmp/"}) {
    Session session;
    EXPECT_TRUE(session.create(boost::make_shared<FixedFilter>(dir)));
    EXPECT_EQ("sess.", session.getId().substr(0, 5)) << dir;
  }
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(boost::make_shared<FixedFilter>("/tm")));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 99, "ScopedTempFolder failed[/tm/seln]")));
}

TEST_F(Sessions, OnAVolumeByARelativePathHaveAnAbsoluteOne) {
  const ScopedWorkingDir inside(volume.path);
  Session session;
  ASSERT_TRUE(session.create(boost::make_shared<FixedFilter>(".")));
  EXPECT_EQ(volume.path + "/" + session.getId(), session.getPath());
  EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
}

TEST_F(Sessions, OnNoVolumeAreNotMade) {
  FakeVolumes platform;
  for (const auto &filter : {anyVolume(), boost::shared_ptr<FilterVolume>()}) {
    LogCapture log;
    Session session;
    EXPECT_FALSE(session.create(filter));
    expectEmpty(session);
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 126, "failed to getVolumePath()")));
    EXPECT_FALSE(isThere("/tmp/kovabackup"));
  }
}

TEST_F(Sessions, OnAVolumeLogADirectoryThatCannotBeMade) {
  FakeVolumes platform(volume.path);
  const Fault fault("mkdtemp", 1, EROFS);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_THAT(log.take(), ElementsAre(errLine(
                              kModule, 99, "ScopedTempFolder failed[" + volume.path + "/seln]")));
}

TEST_F(Sessions, WithoutTheirLinkAreRemovedAgain) {
  FakeVolumes platform(volume.path);
  const Fault fault("symlink", 1, EDQUOT);
  const ChosenName chosen("AAAAAA");
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  expectEmpty(session);
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 108,
                                              "failed to create symlink[" + volume.path +
                                                  "/seln.AAAAAA][" + linkOf("seln.AAAAAA") + "]")));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
}

// --- by id
// ----------------------------------------------------------------------------------------

TEST_F(Sessions, PathOfNoIdIsRefused) {
  LogCapture log;
  EXPECT_EQ("", Session::getPathById(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 250, "invalid parameter, empty session id")));
}

TEST_F(Sessions, PathOfALocalIdIsComputed) {
  for (const char *id : {"sess.AAAAAA", "sess", "other", "sel", "Seln.AAAAAA"}) {
    EXPECT_EQ(linkOf(id), Session::getPathById(id));
  }
  EXPECT_FALSE(isThere(kRoot));
}

TEST_F(Sessions, PathOfAMissingLinkIsNoneSilently) {
  EXPECT_EQ("", Session::getPathById("seln.AAAAAA"));
  EXPECT_EQ("", Session::getPathById("seln"));
}

TEST_F(Sessions, PathOfWhatIsNoLinkIsNone) {
  std::filesystem::create_directories(linkOf("seln.AAAAAA"));
  LogCapture log;
  EXPECT_EQ("", Session::getPathById("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(
                              kModule, 259, "failed to read link[" + linkOf("seln.AAAAAA") + "]")));
}

TEST_F(Sessions, PathIsWhatTheLinkHoldsUpTo1024Bytes) {
  std::filesystem::create_directories(kRoot);
  for (const std::size_t length : {1U, 1023U, 1024U, 1025U, 4000U}) {
    const std::string target(length, 't');
    ASSERT_EQ(0, ::symlink(target.c_str(), linkOf("seln.AAAAAA").c_str()));
    EXPECT_EQ(target.substr(0, 1024), Session::getPathById("seln.AAAAAA"));
    std::filesystem::remove(linkOf("seln.AAAAAA"));
  }
}

// --- loading
// --------------------------------------------------------------------------------------

TEST_F(Sessions, LoadBindsALocalOneAndRefreshesItsTimes) {
  Session made;
  ASSERT_TRUE(made.create());
  makeOld(made.getPath());
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  EXPECT_EQ(made.getId(), session.getId());
  EXPECT_EQ(made.getPath(), session.getPath());
  struct stat info;
  ASSERT_EQ(0, ::lstat(made.getPath().c_str(), &info));
  EXPECT_GT(info.st_atime, 1000);
  EXPECT_GT(info.st_mtime, 1000);
}

TEST_F(Sessions, LoadLeavesTheTimesOfWhatLiesInIt) {
  Session made;
  ASSERT_TRUE(made.create());
  const std::string file = made.getPath() + "/file";
  writeText(file, "text");
  makeOld(file);
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  struct stat info;
  ASSERT_EQ(0, ::lstat(file.c_str(), &info));
  EXPECT_EQ(1000, info.st_mtime);
}

TEST_F(Sessions, LoadBindsAVolumeOneByItsLink) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  makeOld(made.getPath());
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  EXPECT_EQ(made.getId(), session.getId());
  EXPECT_EQ(made.getPath(), session.getPath());
  struct stat info;
  ASSERT_EQ(0, ::lstat(made.getPath().c_str(), &info));
  EXPECT_GT(info.st_mtime, 1000);
}

TEST_F(Sessions, LoadDoesNotReplaceABoundOne) {
  Session session;
  ASSERT_TRUE(session.create());
  LogCapture log;
  EXPECT_FALSE(session.load(""));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 170,
                                              "session has been loaded[" + session.getId() + "][" +
                                                  session.getPath() + "]")));
  EXPECT_NE("", session.getId());
}

TEST_F(Sessions, LoadRefusesAnEmptyId) {
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 174, "invalid parameter, empty session id")));
}

TEST_F(Sessions, LoadFailsForWhatIsNoDirectory) {
  const Scratch scratch;
  std::filesystem::create_directories(kRoot);
  writeText(linkOf("sess.file"), "text");
  std::filesystem::create_directory_symlink(scratch.path, linkOf("sess.link"));
  for (const char *id : {"sess.missing", "sess.file", "sess.link"}) {
    Session session;
    LogCapture log;
    EXPECT_FALSE(session.load(id));
    expectEmpty(session);
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, 180, "failed to lstat session[" + linkOf(id) + "]")));
  }
}

TEST_F(Sessions, LoadOfAMissingLinkNamesAnEmptyPath) {
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 180, "failed to lstat session[]")));
}

TEST_F(Sessions, LoadOfWhatIsNoLinkLogsThatToo) {
  std::filesystem::create_directories(linkOf("seln.AAAAAA"));
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 259,
                                              "failed to read link[" + linkOf("seln.AAAAAA") + "]"),
                                      errLine(kModule, 180, "failed to lstat session[]")));
}

TEST_F(Sessions, LoadOfALinkToALinkFails) {
  const Scratch scratch;
  std::filesystem::create_directories(kRoot);
  std::filesystem::create_directory_symlink(volume.path, scratch / "link");
  std::filesystem::create_symlink(scratch / "link", linkOf("seln.AAAAAA"));
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 180, "failed to lstat session[/tmp/scratch/link]")));
}

TEST_F(Sessions, LoadNeedsAccessAndSetsTheTimes) {
  Session made;
  ASSERT_TRUE(made.create());
  struct Case {
    const char *function;
    int number;
    const char *text;
  };
  const Case cases[] = {{"lstat", 180, "failed to lstat session["},
                        {"access", 184, "failed to access session["},
                        {"utime", 188, "failed to touch session["}};
  for (const Case &one : cases) {
    forEachFailure(one.function, EACCES, [&](Fault &fault) {
      LogCapture log;
      Session session;
      const bool loaded = session.load(made.getId());
      EXPECT_EQ(!fault.fired(), loaded);
      if (loaded) {
        EXPECT_THAT(log.take(), IsEmpty());
        EXPECT_EQ(made.getPath(), session.getPath());
      } else {
        EXPECT_THAT(log.take(),
                    ElementsAre(errLine(kModule, one.number, one.text + made.getPath() + "]")));
        expectEmpty(session);
      }
    });
  }
}

TEST_F(Sessions, LoadFailsWhenTheLinkCannotBeRead) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  forEachFailure("readlink", EIO, [&](Fault &fault) {
    LogCapture log;
    Session session;
    const bool loaded = session.load(made.getId());
    EXPECT_EQ(!fault.fired(), loaded);
    if (!loaded) {
      EXPECT_THAT(
          log.take(),
          ElementsAre(errLine(kModule, 259, "failed to read link[" + linkOf(made.getId()) + "]"),
                      errLine(kModule, 180, "failed to lstat session[]")));
    }
  });
}

// --- destroying
// -----------------------------------------------------------------------------------

TEST_F(Sessions, DestroyRemovesALocalOneWithAllInIt) {
  Session session;
  ASSERT_TRUE(session.create());
  std::filesystem::create_directories(session.getPath() + "/a/b");
  writeText(session.getPath() + "/a/b/c", "text");
  EXPECT_TRUE(session.destroy());
  expectEmpty(session);
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
  EXPECT_TRUE(session.create()) << "the object may be used again";
}

TEST_F(Sessions, DestroyRemovesAVolumeOneAndItsLink) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  writeText(made.getPath() + "/file", "text");
  Session session;
  ASSERT_TRUE(session.load(made.getId()));
  EXPECT_TRUE(session.destroy());
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
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
  EXPECT_THAT(namesIn(kRoot), IsEmpty()) << "the link goes all the same";
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
  writeText(local.getPath() + "/file", "text");
  writeText(onVolume.getPath() + "/file", "text");
  EXPECT_TRUE(Session::destroyById(local.getId()));
  EXPECT_TRUE(Session::destroyById(onVolume.getId()));
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(Sessions, DestroyByIdOfWhatIsGoneSucceeds) {
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA"));
  EXPECT_TRUE(Session::destroyById("sess.AAAAAA"));
  std::filesystem::create_directories(kRoot);
  std::filesystem::create_symlink(volume.path + "/seln.AAAAAA", linkOf("seln.AAAAAA"));
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA")) << "only the link is left";
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
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
  std::filesystem::create_directories(kRoot);
  writeText(linkOf("seln.AAAAAA"), "text");
  LogCapture log;
  EXPECT_TRUE(Session::destroyById("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(
                              kModule, 259, "failed to read link[" + linkOf("seln.AAAAAA") + "]")));
  EXPECT_THAT(namesIn(kRoot), IsEmpty());
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

// --- every failing call
// -----------------------------------------------------------------------------

TEST_F(Sessions, DestroyReportsEveryFailingCallAndForgetsTheSession) {
  FakeVolumes platform(volume.path);
  const int before = countOpenDescriptors();
  for (const char *function : {"unlink", "rmdir"}) {
    forEachFailure(function, EPERM, [&](Fault &fault) {
      Session session;
      LogCapture log;
      ASSERT_TRUE(session.create(anyVolume()));
      std::filesystem::create_directory(session.getPath() + "/sub");
      writeText(session.getPath() + "/sub/file", "text");
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

TEST_F(Sessions, LocalCreationLeavesNothingWhenACallFails) {
  const int before = countOpenDescriptors();
  for (const char *function : {"mkdir", "mkdtemp", "chmod", "strdup"}) {
    forEachFailure(function, ENOMEM, [&](Fault &fault) {
      LogCapture log;
      Session session;
      const bool created = createOrThrow(session, {});
      if (created) {
        EXPECT_FALSE(fault.fired());
        EXPECT_TRUE(session.destroy());
      } else {
        EXPECT_TRUE(fault.fired());
        expectEmpty(session);
      }
      const bool onlyTheModeFailed = std::string(function) == "chmod" && fault.calls() == 3;
      EXPECT_EQ(!created && onlyTheModeFailed ? 1U : 0U, namesIn(kRoot).size());
      std::filesystem::remove_all(kRoot);
      EXPECT_EQ(before, countOpenDescriptors());
    });
  }
}

TEST_F(Sessions, VolumeCreationLeavesNothingWhenACallFails) {
  FakeVolumes platform(volume.path);
  const int before = countOpenDescriptors();
  for (const char *function : {"mkdir", "mkdtemp", "chmod", "strdup", "symlink", "access"}) {
    forEachFailure(function, ENOMEM, [&](Fault &fault) {
      LogCapture log;
      Session session;
      const bool created = createOrThrow(session, anyVolume());
      EXPECT_EQ(!fault.fired(), created);
      EXPECT_EQ(created, !session.getId().empty());
      EXPECT_TRUE(session.destroy());
      const bool onlyTheModeFailed = std::string(function) == "chmod" && fault.calls() == 3;
      EXPECT_EQ(!created && onlyTheModeFailed ? 1U : 0U, namesIn(volume.path).size());
      EXPECT_THAT(namesIn(kRoot), IsEmpty());
      for (const std::string &name : namesIn(volume.path)) {
        std::filesystem::remove_all(volume.path + "/" + name);
      }
      EXPECT_EQ(before, countOpenDescriptors());
    });
  }
}
