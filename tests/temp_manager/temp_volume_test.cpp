// Temporary files and folders on the volume that a filter chooses.

#include "tests/support/fault.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"
#include "tests/temp_manager/temp_file_fixture.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <syslog.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::MatchesRegex;

static_assert(sizeof(ScopedVolumeTempFile) == sizeof(ScopedTempFile), "adds no field");
static_assert(sizeof(ScopedVolumeTempFolder) == sizeof(ScopedTempFolder), "adds no field");

namespace {

constexpr const char *kModule = "temp_manager/temp_manager";

void expectOwnsNothing(const ScopedTempFolder &folder) {
  EXPECT_FALSE(folder.isValid());
  EXPECT_EQ("", folder.getPath());
}

class VolumeTempFile : public TempFile {};
class VolumeTempFolder : public TempFile {};

} // namespace

// --- files ---

TEST_F(VolumeTempFile, StandsInItsShareTemporaryDirectory) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), "job", false);
  ASSERT_TRUE(file.isValid());
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scratch/job\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(0600, modeOf(file.getPath()));
  EXPECT_TRUE(isOpen(file.getFileDescripter()));
}

TEST_F(VolumeTempFile, HasADefaultName) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), "", true);
  EXPECT_THAT(file.getPath(),
              MatchesRegex("/tmp/scratch/scoped_volume_temp_file\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(-1, file.getFileDescripter());
}

TEST_F(VolumeTempFile, TakesATemplateAsItStands) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), "jobXXXXXX",
                                  true);
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scratch/job[A-Za-z0-9]{6}"));
}

TEST_F(VolumeTempFile, OnNoVolumeOwnsNothingSilently) {
  FakeVolumes platform;
  const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), "job", false);
  expectOwnsNothing(file);
}

TEST_F(VolumeTempFile, OfANullFilterIsRefusedAndLogged) {
  LogCapture log;
  const ScopedVolumeTempFile file(boost::shared_ptr<FilterVolume>(), "a/b", false);
  expectOwnsNothing(file);
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 335, "volume temp filter is null!")));
}

TEST_F(VolumeTempFile, RefusesAPathForAName) {
  FakeVolumes platform(scratch.path());
  for (const char *name : {"a/b", "/a", "a/", "/"}) {
    LogCapture log;
    const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), name, false);
    expectOwnsNothing(file);
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 339, "name is invalid!"))) << name;
  }
  EXPECT_EQ(0, platform.enumerations);
}

TEST_F(VolumeTempFile, ReportsWhatCreateReports) {
  FakeVolumes platform(scratch.path());
  const Fault fault("mkstemp", 1, EROFS);
  LogCapture log;
  const ScopedVolumeTempFile file(TempManager::maxVolume(freshLocation(), 1, false), "a", true);
  expectOwnsNothing(file);
  EXPECT_THAT(log.take(), ElementsAre(bareLine(
                              LOG_DEBUG, kModule, 207,
                              "mkstemp failed, Read-only file system [/tmp/scratch/a.XXXXXX]")));
}
// --- folders ---

TEST_F(VolumeTempFolder, StandsInItsShareTemporaryDirectory) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFolder folder(TempManager::maxVolume(freshLocation(), 1, false), "job");
  ASSERT_TRUE(folder.isValid());
  EXPECT_THAT(folder.getPath(), MatchesRegex("/tmp/scratch/job\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(0700, modeOf(folder.getPath()));
}

TEST_F(VolumeTempFolder, HasADefaultName) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFolder folder(TempManager::maxVolume(freshLocation(), 1, false), "");
  EXPECT_THAT(folder.getPath(),
              MatchesRegex("/tmp/scratch/scoped_volume_temp_folder\\.[A-Za-z0-9]{6}"));
}

TEST_F(VolumeTempFolder, TakesATemplateAsItStands) {
  FakeVolumes platform(scratch.path());
  const ScopedVolumeTempFolder folder(TempManager::maxVolume(freshLocation(), 1, false),
                                      "jobXXXXXX");
  EXPECT_THAT(folder.getPath(), MatchesRegex("/tmp/scratch/job[A-Za-z0-9]{6}"));
}

TEST_F(VolumeTempFolder, OnNoVolumeOwnsNothingSilently) {
  FakeVolumes platform;
  expectOwnsNothing(
      ScopedVolumeTempFolder(TempManager::maxVolume(freshLocation(), 1, false), "job"));
}

TEST_F(VolumeTempFolder, OfANullFilterIsRefusedAndLogged) {
  LogCapture log;
  expectOwnsNothing(ScopedVolumeTempFolder(boost::shared_ptr<FilterVolume>(), "a/b"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 477, "volume temp filter is null!")));
}

TEST_F(VolumeTempFolder, RefusesAPathForAName) {
  FakeVolumes platform(scratch.path());
  for (const char *name : {"a/b", "/a", "a/", "/"}) {
    LogCapture log;
    expectOwnsNothing(
        ScopedVolumeTempFolder(TempManager::maxVolume(freshLocation(), 1, false), name));
    EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 481, "name is invalid!"))) << name;
  }
  EXPECT_EQ(0, platform.enumerations);
}

// --- the examples of the header ---

namespace {

bool writeReport(const std::string &dir) {
  ScopedTempFile file(dir + "/report", false);
  if (!file.isValid()) {
    return false;
  }
  if (::write(file.getFileDescripter(), "text", 4) != 4) {
    return false;
  }
  return file.rename(dir + "/report");
}

std::string buildIndex(const boost::shared_ptr<FilterVolume> &filter) {
  ScopedVolumeTempFolder work(filter, "index");
  if (!work.isValid()) {
    return "";
  }
  writeFile(work.getPath() + "/entries", "text");
  return work.preserve();
}

} // namespace

TEST_F(VolumeTempFile, IsUsedAsTheHeaderShows) {
  EXPECT_TRUE(writeReport(scratch.path()));
  EXPECT_EQ("text", readFile(scratch / "report"));
  EXPECT_EQ(1U, namesIn(scratch.path()).size());
}

TEST_F(VolumeTempFolder, IsUsedAsTheHeaderShows) {
  FakeVolumes platform(scratch.path());
  platform.supportedLocation = freshLocation();
  const std::string kept = buildIndex(TempManager::maxExtVolume(true));
  EXPECT_THAT(kept, MatchesRegex("/tmp/scratch/index\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ("text", readFile(kept + "/entries"));
}
