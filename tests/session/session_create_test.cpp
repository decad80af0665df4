#include "tests/session/session_fixture.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"

#include <cerrno>
#include <filesystem>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {
constexpr const char *kModule = "session";
}

// --- local sessions ---

TEST_F(Sessions, LocalOneOnAFreshSystemMakesTheRootAndAPrivateDirectory) {
  Session session;
  ASSERT_TRUE(session.create());
  EXPECT_THAT(session.getId(), MatchesRegex("sess\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(linkOf(session.getId()), session.getPath());
  EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
  EXPECT_TRUE(std::filesystem::is_directory(session.getPath()));
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(0700, modeOf(kSessionRoot));
  EXPECT_EQ(0755, modeOf("/tmp/kovabackup"));
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(session.getId())) << "no lock file without need";
}

TEST_F(Sessions, HaveTheirModesWhateverTheUmask) {
  const ScopedUmask umask(0777);
  Session session;
  ASSERT_TRUE(session.create());
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(0700, modeOf(kSessionRoot));
}

TEST_F(Sessions, ResetTheModeOfTheRootOnEveryCreation) {
  ASSERT_TRUE(Session().create());
  ASSERT_EQ(0, ::chmod(kSessionRoot, 0777));
  ASSERT_TRUE(Session().create());
  EXPECT_EQ(0700, modeOf(kSessionRoot));
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
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
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
  EXPECT_EQ(1U, namesIn(kSessionRoot).size());
}

// --- volume sessions ---

TEST_F(Sessions, OnAVolumeAreLinkedFromTheRootByTheirId) {
  FakeVolumes platform(volume.path);
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_THAT(session.getId(), MatchesRegex("seln\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(volume.path + "/" + session.getId(), session.getPath());
  EXPECT_EQ(0700, modeOf(session.getPath()));
  EXPECT_EQ(session.getPath(), std::filesystem::read_symlink(linkOf(session.getId())).string());
  EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(session.getId())) << "no lock file without need";
  EXPECT_EQ(0700, modeOf(kSessionRoot));
}

TEST_F(Sessions, OnAVolumeUnderTmpAreLocalOnes) {
  const TestFolder scratch;
  FakeVolumes platform(scratch.path());
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_EQ(linkOf(session.getId()), session.getPath());
  EXPECT_EQ("sess.", session.getId().substr(0, 5));
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty()) << "the directory under /tmp is not used";
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
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

// --- every failing call ---

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
      EXPECT_EQ(!created && onlyTheModeFailed ? 1U : 0U, namesIn(kSessionRoot).size());
      std::filesystem::remove_all(kSessionRoot);
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
      EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
      for (const std::string &name : namesIn(volume.path)) {
        std::filesystem::remove_all(volume.path + "/" + name);
      }
      EXPECT_EQ(before, countOpenDescriptors());
    });
  }
}
