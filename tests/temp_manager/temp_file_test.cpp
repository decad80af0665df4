#include "kovabackup/temp_manager.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"
#include "tests/temp_manager/path_hash.h"
#include "tests/temp_manager/temp_file_fixture.h"

#include <cerrno>
#include <filesystem>
#include <gmock/gmock.h>
#include <memory>
#include <sys/wait.h>
#include <syslog.h>
#include <type_traits>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

constexpr const char *kModule = "temp_manager/temp_manager";

// Called before each removal of a file.
void (*watchUnlink)() = nullptr;

} // namespace

extern "C" int unlink(const char *path) noexcept {
  static auto *const real = realFunction<int(const char *)>("unlink");
  if (watchUnlink != nullptr) {
    watchUnlink();
  }
  return failsNow("unlink") ? -1 : real(path);
}

// --- shape ---

TEST(TempFileShape, IsNeitherCopiedNorMoved) {
  EXPECT_FALSE(std::is_copy_constructible<ScopedTempFile>::value);
  EXPECT_FALSE(std::is_move_constructible<ScopedTempFile>::value);
  EXPECT_FALSE(std::is_copy_assignable<ScopedTempFile>::value);
  EXPECT_FALSE(std::is_move_assignable<ScopedTempFile>::value);
  EXPECT_FALSE(std::is_copy_constructible<ScopedVolumeTempFile>::value);
  EXPECT_FALSE(std::is_move_constructible<ScopedVolumeTempFile>::value);
}

TEST(TempFileShape, IsMadeFromAnIntOnlyWhenAskedFor) {
  EXPECT_FALSE((std::is_convertible<int, ScopedTempFile>::value));
  EXPECT_TRUE((std::is_constructible<ScopedTempFile, int>::value));
  EXPECT_TRUE(std::is_default_constructible<ScopedTempFile>::value);
  EXPECT_TRUE(std::has_virtual_destructor<ScopedTempFile>::value);
}

TEST_F(TempFile, HoldsDescriptorPathAndHashInThisOrder) {
  ScopedTempFile file(scratch / "a", false);
  ASSERT_TRUE(file.isValid());
  EXPECT_EQ(file.getFileDescripter(), fieldsOf(file).descriptor);
  EXPECT_EQ(file.getPath(), fieldsOf(file).path);
  EXPECT_EQ(plainHashOf(file.getPath()), fieldsOf(file).pathHash);
}

TEST_F(TempFile, HoldsMinusOneNothingAndZeroWhileEmpty) {
  ScopedTempFile file(7);
  expectOwnsNothing(file);
  EXPECT_EQ(0U, fieldsOf(file).pathHash);
  ASSERT_TRUE(file.create(scratch / "a"));
  file.unlink();
  EXPECT_EQ("", fieldsOf(file).path);
  EXPECT_EQ(0U, fieldsOf(file).pathHash);
}

TEST_F(TempFile, OwnsNothingWithoutAPathWhateverItsHash) {
  ScopedTempFile file;
  fieldsOf(file).pathHash = 5381; // that of an empty path
  expectOwnsNothing(file);
  EXPECT_FALSE(file.rename(scratch / "target"));
}

// --- creation ---

TEST_F(TempFile, OfNoNameStandsInTmp) {
  const ScopedTempFile file("", false);
  ASSERT_TRUE(file.isValid());
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scoped_temp_file\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(0600, modeOf(file.getPath()));
  EXPECT_TRUE(isOpen(file.getFileDescripter()));
}

TEST_F(TempFile, TakesATemplateAsItStands) {
  const ScopedTempFile file(scratch / "abcXXXXXX", true);
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scratch/abc[A-Za-z0-9]{6}"));
}

TEST_F(TempFile, AppendsThePlacesToAPlainName) {
  const ScopedTempFile file(scratch / "abc", true);
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scratch/abc\\.[A-Za-z0-9]{6}"));
}

TEST_F(TempFile, OfANameEndingInASlashIsAHiddenFileInThatFolder) {
  const ScopedTempFile file(scratch.path() + "/", true);
  EXPECT_THAT(file.getPath(), MatchesRegex("/tmp/scratch/\\.[A-Za-z0-9]{6}"));
}

TEST_F(TempFile, OfABareNameStandsInTheWorkingDirectoryByItsAbsolutePath) {
  auto file = std::make_unique<ScopedTempFile>();
  {
    const ScopedWorkingDir inside(scratch.path());
    ASSERT_TRUE(file->create("abc"));
  }
  EXPECT_THAT(file->getPath(), MatchesRegex("/tmp/scratch/abc\\.[A-Za-z0-9]{6}"));
  EXPECT_TRUE(isThere(file->getPath()));
  file.reset();
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty()) << "removed from elsewhere";
}

TEST_F(TempFile, StaysRelativeWhereTheWorkingDirectoryCannotBeRead) {
  const ScopedWorkingDir inside(scratch.path());
  const Fault fault("getcwd", 1, ENOENT);
  const ScopedTempFile file("abc", true);
  EXPECT_TRUE(file.isValid());
  EXPECT_THAT(file.getPath(), MatchesRegex("abc\\.[A-Za-z0-9]{6}"));
}

TEST_F(TempFile, HasMode0600WhateverTheUmask) {
  for (const mode_t mask : {0U, 022U, 0777U}) {
    const ScopedUmask umask(mask);
    const ScopedTempFile file(scratch / "a", true);
    EXPECT_EQ(0600, modeOf(file.getPath())) << mask;
  }
}

TEST_F(TempFile, IsOpenForReadingAndWritingAndNotInherited) {
  const ScopedTempFile file(scratch / "a", false);
  const int fd = file.getFileDescripter();
  EXPECT_EQ(FD_CLOEXEC, ::fcntl(fd, F_GETFD));
  ASSERT_EQ(4, ::write(fd, "text", 4));
  char back[4] = "";
  EXPECT_EQ(4, ::pread(fd, back, 4, 0));
  EXPECT_EQ("text", readFile(file.getPath()));
}

TEST_F(TempFile, MadeWithoutItsDescriptorIsStillOwned) {
  const int before = countOpenDescriptors();
  const ScopedTempFile file(scratch / "a", true);
  EXPECT_TRUE(file.isValid());
  EXPECT_EQ(-1, file.getFileDescripter());
  EXPECT_EQ(before, countOpenDescriptors());
  EXPECT_TRUE(isThere(file.getPath()));
}

TEST_F(TempFile, CreateRemovesAndClosesTheFormerFileFirst) {
  const int before = countOpenDescriptors();
  ScopedTempFile file(scratch / "a", false);
  const std::string former = file.getPath();
  ASSERT_TRUE(file.create(scratch / "b"));
  EXPECT_FALSE(isThere(former));
  EXPECT_TRUE(isThere(file.getPath()));
  EXPECT_EQ(before + 1, countOpenDescriptors());
}

TEST_F(TempFile, AFailedCreateHasRemovedTheFormerFile) {
  ScopedTempFile file(scratch / "a", false);
  LogCapture log;
  EXPECT_FALSE(file.create("/missing/a"));
  expectOwnsNothing(file);
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFile, NamesAreCutAtANulByteAsLibcDoes) {
  LogCapture log;
  const ScopedTempFile file(scratch / std::string("a\0b", 3), false);
  expectOwnsNothing(file);
  EXPECT_THAT(log.take(),
              ElementsAre(bareLine(LOG_DEBUG, kModule, 207,
                                   "mkstemp failed, Invalid argument [/tmp/scratch/a]")));
}

TEST_F(TempFile, MayHaveTheDescriptor0) {
  const int standardInput = ::fcntl(0, F_DUPFD_CLOEXEC, 3);
  const int before = countOpenDescriptors();
  ::close(0);
  {
    ScopedTempFile file(scratch / "a", false);
    EXPECT_EQ(0, file.getFileDescripter());
    file.close();
    EXPECT_FALSE(isOpen(0));
    ASSERT_TRUE(file.create(scratch / "b"));
    EXPECT_EQ(0, file.getFileDescripter());
  }
  EXPECT_FALSE(isOpen(0));
  EXPECT_EQ(0, ::dup2(standardInput, 0));
  EXPECT_EQ(before, countOpenDescriptors());
  ::close(standardInput);
}

// --- close and unlink ---

TEST_F(TempFile, ClosesBeforeItRemoves) {
  static int closedYet;
  static int fd;
  closedYet = 0;
  watchUnlink = [] { closedYet += isOpen(fd) ? 0 : 1; };
  {
    ScopedTempFile file(scratch / "a", false);
    fd = file.getFileDescripter();
    ASSERT_TRUE(file.create(scratch / "b"));
    EXPECT_EQ(1, closedYet) << "a new one";
    fd = file.getFileDescripter();
  }
  EXPECT_EQ(2, closedYet) << "destruction";
  watchUnlink = nullptr;
}

TEST_F(TempFile, CloseKeepsErrnoWhenItFails) {
  ScopedTempFile file(scratch / "a", false);
  ASSERT_EQ(0, ::close(file.getFileDescripter())); // without notifying the object
  errno = ELOOP;
  file.close();
  EXPECT_EQ(ELOOP, errno);
  EXPECT_EQ(-1, file.getFileDescripter());
}

TEST_F(TempFile, CloseKeepsTheFileOwned) {
  ScopedTempFile file(scratch / "a", false);
  const int fd = file.getFileDescripter();
  file.close();
  EXPECT_FALSE(isOpen(fd));
  EXPECT_EQ(-1, file.getFileDescripter());
  EXPECT_TRUE(file.isValid());
  file.close();
  EXPECT_EQ(-1, file.getFileDescripter());
}

TEST_F(TempFile, UnlinkLeavesTheDescriptorOpen) {
  int fd = -1;
  {
    ScopedTempFile file(scratch / "a", false);
    fd = file.getFileDescripter();
    const std::string path = file.getPath();
    file.unlink();
    EXPECT_FALSE(isThere(path));
    EXPECT_FALSE(file.isValid());
    EXPECT_EQ("", file.getPath());
    EXPECT_EQ(fd, file.getFileDescripter());
    EXPECT_EQ(1, ::write(fd, "x", 1));
  }
  EXPECT_FALSE(isOpen(fd)) << "the destructor closes it";
}

TEST_F(TempFile, UnlinkGivesUpAFileThatCannotBeRemoved) {
  ScopedTempFile file(scratch / "a", false);
  const std::string path = file.getPath();
  const Fault fault("unlink", 1, EPERM);
  file.unlink();
  EXPECT_TRUE(fault.fired());
  EXPECT_FALSE(file.isValid());
  EXPECT_TRUE(isThere(path));
}

TEST_F(TempFile, DestructionRemovesAndClosesAndKeepsErrno) {
  int fd = -1;
  {
    const ScopedTempFile file(scratch / "a", false);
    fd = file.getFileDescripter();
    std::filesystem::remove(file.getPath()); // so that removing fails
    errno = ELOOP;
  }
  EXPECT_EQ(ELOOP, errno);
  EXPECT_FALSE(isOpen(fd));
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFile, IsRemovedThroughAPointerToItsBase) {
  FakeVolumes platform(scratch.path());
  std::unique_ptr<ScopedTempFile> file = std::make_unique<ScopedVolumeTempFile>(
      TempManager::maxVolume(freshLocation(), 1, false), "a", false);
  ASSERT_TRUE(file->isValid());
  file.reset();
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFile, IsRemovedByAForkedChildThatDestroysTheObject) {
  auto file = std::make_unique<ScopedTempFile>(scratch / "a", true);
  const pid_t child = ::fork();
  if (child == 0) {
    file.reset();
    ::_exit(0);
  }
  ASSERT_EQ(child, ::waitpid(child, nullptr, 0));
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
  EXPECT_TRUE(file->isValid()) << "and the parent does not know";
}

// --- rename and preserve ---

TEST_F(TempFile, RenameMovesTheFileAndGivesItUp) {
  const std::string target = scratch / "target";
  {
    ScopedTempFile file(scratch / "a", false);
    const int fd = file.getFileDescripter();
    ASSERT_EQ(4, ::write(fd, "text", 4));
    writeFile(target, "what stood there");
    EXPECT_TRUE(file.rename(target));
    expectOwnsNothing(file);
    EXPECT_EQ(0U, fieldsOf(file).pathHash);
    EXPECT_FALSE(isOpen(fd));
  }
  EXPECT_EQ("text", readFile(target));
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("target"));
}

TEST_F(TempFile, RenameTakesARelativeTarget) {
  const ScopedWorkingDir inside(scratch.path());
  ScopedTempFile file("a", true);
  EXPECT_TRUE(file.rename("target"));
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("target"));
}

TEST_F(TempFile, RenameToTheSamePathIsRefusedAndLogged) {
  ScopedTempFile file(scratch / "a", false);
  const std::string path = file.getPath();
  LogCapture log;
  EXPECT_FALSE(file.rename(path));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 249,
                                              "rename temp file to the same path[" + path + "]")));
  EXPECT_TRUE(file.isValid());
  EXPECT_TRUE(isOpen(file.getFileDescripter()));
}

TEST_F(TempFile, RenameToTheSamePathIsRefusedForARelativePathToo) {
  const ScopedWorkingDir inside(scratch.path());
  ScopedTempFile file("a", true);
  const std::string path = file.getPath();
  LogCapture log;
  EXPECT_FALSE(file.rename(path.substr(scratch.path().size() + 1)));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 249,
                                              "rename temp file to the same path[" + path + "]")));
  EXPECT_TRUE(isThere(path));
}

TEST_F(TempFile, RenameOnlyComparesTheBytesOfTheSamePath) {
  ScopedTempFile file(scratch / "a", true);
  const std::string path = file.getPath();
  EXPECT_TRUE(file.rename("/tmp/./scratch/" + path.substr(scratch.path().size() + 1)));
  EXPECT_TRUE(isThere(path)) << "rename(2) of a file to itself";
  expectOwnsNothing(file);
}

TEST_F(TempFile, RenameOntoAFolderFailsAndChangesNothing) {
  const ScopedWorkingDir inside(scratch.path());
  std::filesystem::create_directory("folder");
  ScopedTempFile file("a", false);
  const std::string path = file.getPath();
  for (const char *target : {"folder", "", ".", "/tmp/scratch/folder"}) {
    EXPECT_FALSE(file.rename(target)) << target;
    EXPECT_THAT(errno, testing::AnyOf(EISDIR, ENOTEMPTY)) << target;
    EXPECT_EQ(path, file.getPath());
    EXPECT_TRUE(isThere(path));
    EXPECT_TRUE(isOpen(file.getFileDescripter()));
  }
}

TEST_F(TempFile, AFailedRenameChangesNothing) {
  forEachFailure("rename", EXDEV, [&](Fault &fault) {
    ScopedTempFile file(scratch / "a", false);
    const std::string path = file.getPath();
    const int fd = file.getFileDescripter();
    const bool renamed = file.rename(scratch / "target");
    EXPECT_EQ(!fault.fired(), renamed);
    if (!renamed) {
      EXPECT_EQ(EXDEV, errno);
      EXPECT_TRUE(file.isValid());
      EXPECT_EQ(path, file.getPath());
      EXPECT_EQ(fd, file.getFileDescripter());
      EXPECT_TRUE(isOpen(fd));
      EXPECT_TRUE(isThere(path));
    }
  });
}

TEST_F(TempFile, RenameAndPreserveOfNothingFailSilently) {
  ScopedTempFile file;
  EXPECT_FALSE(file.rename(scratch / "target"));
  EXPECT_FALSE(file.rename(""));
  EXPECT_EQ("", file.preserve());
}

TEST_F(TempFile, PreserveLeavesTheFileToTheCaller) {
  std::string path;
  {
    ScopedTempFile file(scratch / "a", false);
    const std::string expected = file.getPath();
    const int fd = file.getFileDescripter();
    path = file.preserve();
    EXPECT_EQ(expected, path);
    expectOwnsNothing(file);
    EXPECT_EQ(0U, fieldsOf(file).pathHash);
    EXPECT_FALSE(isOpen(fd));
    EXPECT_EQ("", file.preserve());
  }
  EXPECT_TRUE(isThere(path));
}

// --- the guard ---

TEST_F(TempFile, WhosePathNoLongerFitsItsHashOwnsNothing) {
  std::string path;
  {
    ScopedTempFile file(scratch / "a", false);
    path = file.getPath();
    fieldsOf(file).pathHash += 1;
    EXPECT_FALSE(file.isValid());
    EXPECT_FALSE(file.rename(scratch / "target"));
    EXPECT_EQ("", file.preserve());
    file.unlink();
    EXPECT_TRUE(isThere(path));
    EXPECT_TRUE(isOpen(file.getFileDescripter()));
  }
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre(path.substr(scratch.path().size() + 1)));
}

TEST_F(TempFile, WhosePathWasChangedUnderItTouchesNeitherFile) {
  const std::string other = scratch / "precious";
  writeFile(other, "text");
  std::string path;
  {
    ScopedTempFile file(scratch / "a", true);
    path = file.getPath();
    fieldsOf(file).path = other;
  }
  EXPECT_TRUE(isThere(other));
  EXPECT_TRUE(isThere(path));
}

TEST_F(TempFile, WhosePathNoLongerFitsForgetsItWhenCreateFails) {
  ScopedTempFile file(scratch / "a", true);
  fieldsOf(file).pathHash += 1;
  LogCapture log;
  EXPECT_FALSE(file.create("/missing/a"));
  expectOwnsNothing(file);
  EXPECT_EQ(0U, fieldsOf(file).pathHash);
}
