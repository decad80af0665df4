// Temporary files whose name is too long, and whose creation fails at each of its calls.

#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/temp_file_fixture.h"

#include <cerrno>
#include <filesystem>
#include <gmock/gmock.h>
#include <syslog.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr const char *kModule = "temp_manager/temp_manager";

std::string times(std::size_t count, const std::string &text) {
  std::string result;
  for (std::size_t i = 0; i < count; ++i) {
    result += text;
  }
  return result;
}

// A message about a name that libc has filled in, with XXXXXX in its place again.
LogLine withPlaces(LogLine line) {
  if (line.text.size() > 7 && line.text.back() == ']') {
    line.text.replace(line.text.size() - 7, 6, "XXXXXX");
  }
  return line;
}

} // namespace

// --- names that are too long ---

TEST_F(TempFile, CutsANameThatIsTooLongAtACharacter) {
  const ScopedTempFile file(scratch / times(300, "\u00e9"), true);
  ASSERT_TRUE(file.isValid());
  const std::string name = file.getPath().substr(scratch.path().size() + 1);
  EXPECT_EQ(255U, name.size());
  EXPECT_EQ(times(124, "\u00e9") + ".", name.substr(0, 249));
  EXPECT_TRUE(isThere(file.getPath()));
}

TEST_F(TempFile, CutsAPathThatIsTooLong) {
  const std::string dir = scratch.path() + times(15, "/" + times(249, "d")) + "/" + times(237, "d");
  ASSERT_EQ(4000U, dir.size());
  std::filesystem::create_directories(dir);
  const ScopedTempFile file(dir + "/" + times(200, "e"), true);
  ASSERT_TRUE(file.isValid());
  EXPECT_EQ(4095U, file.getPath().size());
  EXPECT_TRUE(isThere(file.getPath()));
}

TEST_F(TempFile, DoesNotCutATemplate) {
  LogCapture log;
  const std::string name = scratch / times(300, "e") + "XXXXXX";
  const ScopedTempFile file(name, false);
  expectOwnsNothing(file);
  const auto lines = log.take();
  ASSERT_EQ(1U, lines.size());
  EXPECT_EQ(bareLine(LOG_DEBUG, kModule, 207, "mkstemp failed, File name too long [" + name + "]"),
            withPlaces(lines[0]));
}

TEST_F(TempFile, TriesANameEndingInASlashOnceMore) {
  LogCapture log;
  const std::string name = scratch / times(300, "e") + "/";
  const Fault count("mkstemp", 99, EIO);
  const ScopedTempFile file(name, false);
  expectOwnsNothing(file);
  EXPECT_EQ(2, count.calls());
  const auto lines = log.take();
  ASSERT_EQ(1U, lines.size());
  EXPECT_EQ(
      bareLine(LOG_ERR, kModule, 203, "mkstemp failed, File name too long [" + name + ".XXXXXX]"),
      withPlaces(lines[0]));
}

TEST_F(TempFile, LogsTheSecondAttemptWithItsOwnError) {
  const Fault first("mkstemp", 1, ENAMETOOLONG);
  const Fault second("mkstemp", 2, EDQUOT);
  LogCapture log;
  const std::string dir = scratch.path() + "/";
  const ScopedTempFile file(dir + times(260, "e"), false);
  expectOwnsNothing(file);
  EXPECT_EQ(EDQUOT, errno);
  EXPECT_THAT(log.take(), ElementsAre(bareLine(LOG_ERR, kModule, 203,
                                               "mkstemp failed, Disk quota exceeded [" + dir +
                                                   times(248, "e") + ".XXXXXX]")));
}

TEST_F(TempFile, DoesNotTryTheDefaultNameAgain) {
  const Fault fault("mkstemp", 1, ENAMETOOLONG);
  LogCapture log;
  const ScopedTempFile file("", false);
  expectOwnsNothing(file);
  EXPECT_EQ(1, fault.calls());
  EXPECT_THAT(log.take(),
              ElementsAre(bareLine(LOG_DEBUG, kModule, 207,
                                   "mkstemp failed, File name too long [/tmp/scoped_temp_file."
                                   "XXXXXX]")));
}

TEST_F(TempFile, DoesNotTryAgainWhenNothingIsLeftOfTheName) {
  const Fault fault("mkstemp", 1, ENAMETOOLONG);
  LogCapture log;
  const ScopedTempFile file(".", false);
  expectOwnsNothing(file);
  EXPECT_EQ(1, fault.calls());
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(TempFile, PutsErrnoBackBeforeTheSecondAttempt) {
  const Fault fault("mkstemp", 1, ENAMETOOLONG);
  errno = EXDEV;
  const ScopedTempFile file(scratch / "a", false);
  EXPECT_EQ(EXDEV, errno);
  EXPECT_TRUE(file.isValid());
}

// --- failing calls ---

TEST_F(TempFile, LogsAFailingMkstempAtDebugWithoutPidAndTag) {
  const Fault fault("mkstemp", 1, EMFILE);
  LogCapture log;
  ScopedTempFile file;
  EXPECT_FALSE(file.create(scratch / "a"));
  EXPECT_EQ(EMFILE, errno);
  EXPECT_THAT(log.take(),
              ElementsAre(bareLine(LOG_DEBUG, kModule, 207,
                                   "mkstemp failed, Too many open files [/tmp/scratch/a.XXXXXX]")));
}

TEST_F(TempFile, LeavesAFileWhoseModeCannotBeSetToNobody) {
  const int before = countOpenDescriptors();
  {
    const Fault fault("chmod", 1, EPERM);
    const ScopedTempFile file(scratch / "a", false);
    EXPECT_EQ(EPERM, errno);
    expectOwnsNothing(file);
  }
  EXPECT_EQ(1U, namesIn(scratch.path()).size()) << "deliberately left";
  EXPECT_EQ(before, countOpenDescriptors());
}

TEST_F(TempFile, FailsSilentlyWithoutMemoryForTheName) {
  const Fault fault("strdup", 1, ENOMEM);
  const ScopedTempFile file(scratch / "a", false);
  expectOwnsNothing(file);
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFile, FailsSilentlyWithoutMemoryForTheShortenedName) {
  const Fault first("mkstemp", 1, ENAMETOOLONG);
  const Fault fault("strdup", 4, ENOMEM); // the name, dirname, basename, the shorter name
  const ScopedTempFile file(scratch / "a", false);
  EXPECT_TRUE(fault.fired());
  expectOwnsNothing(file);
}

TEST_F(TempFile, LeavesNothingWhenMkstempFails) {
  const int before = countOpenDescriptors();
  forEachFailure("mkstemp", ENOSPC, [&](Fault &fault) {
    LogCapture log;
    {
      const ScopedTempFile file(scratch / "a", false);
      EXPECT_EQ(!fault.fired(), file.isValid());
      EXPECT_EQ(fault.fired() ? 1U : 0U, log.take().size());
    }
    EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
    EXPECT_EQ(before, countOpenDescriptors());
  });
}

TEST_F(TempFile, TriesAtMostTwiceWhenTheNameIsTooLong) {
  forEachFailure("mkstemp", ENAMETOOLONG, [&](Fault &fault) {
    LogCapture log;
    const ScopedTempFile file(scratch / "a", false);
    const bool both = fault.calls() == 2 && !file.isValid();
    EXPECT_LE(fault.calls(), 2);
    EXPECT_EQ(both ? 1U : 0U, log.take().size());
  });
}

TEST_F(TempFile, LeavesNothingWhileMemoryStaysShort) {
  forEachMalloc([&] { const ScopedTempFile file(scratch / "a name of some length", false); },
                [&](bool) { EXPECT_THAT(namesIn(scratch.path()), IsEmpty()); },
                Failing::OnceAndLasting);
}

TEST_F(TempFile, LeavesNothingWhenMemoryRunsOut) {
  const int before = countOpenDescriptors();
  for (const std::size_t length : {30U, 300U}) {
    forEachAllocation(
        [&] {
          const ScopedTempFile file(scratch / times(length, "e"), false);
          EXPECT_TRUE(file.isValid());
        },
        [&](bool) {
          EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
          EXPECT_EQ(before, countOpenDescriptors());
        });
  }
}

TEST_F(TempFile, HoldsNoDescriptorWhenMemoryRunsOut) {
  ScopedTempFile file;
  forEachAllocation(
      [&] {
        file.close();
        file.unlink();
        EXPECT_TRUE(file.create(scratch / "a name of some length"));
      },
      [&](bool threw) {
        EXPECT_EQ(!threw, file.isValid());
        EXPECT_EQ(threw, file.getFileDescripter() == -1);
      });
}
