#include "kovabackup/temp_manager.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"
#include "tests/temp_manager/path_hash.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <ftw.h>
#include <functional>
#include <gmock/gmock.h>
#include <memory>
#include <sys/mount.h>
#include <sys/resource.h>
#include <type_traits>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

constexpr const char *kModule = "temp_manager/temp_manager";

// The layout of the object that is compiled into callers.
struct Fields {
  void *table;
  std::string path;
  std::uint32_t pathHash;
};
static_assert(sizeof(Fields) == sizeof(ScopedTempFolder), "path, hash and no more");

Fields &fieldsOf(ScopedTempFolder &folder) {
  return *reinterpret_cast<Fields *>(&folder);
}

void expectOwnsNothing(const ScopedTempFolder &folder) {
  EXPECT_FALSE(folder.isValid());
  EXPECT_EQ("", folder.getPath());
}

// Creates files, folders and a link out of the tree; returns the target of the link.
std::string fillTree(const std::string &dir, const TestFolder &scratch) {
  namespace fs = std::filesystem;
  const std::string outside = scratch / "outside";
  fs::create_directories(outside);
  writeFile(outside + "/precious", "text");
  fs::create_directories(dir + "/sub/sub/empty");
  writeFile(dir + "/file", "text");
  writeFile(dir + "/sub/sub/file", "text");
  writeFile(dir + "/sub/.hidden", "text");
  fs::create_symlink(outside, dir + "/sub/link");
  fs::create_symlink(outside + "/precious", dir + "/file link");
  fs::create_symlink("nowhere", dir + "/dangling");
  EXPECT_EQ(0, ::mkfifo((dir + "/pipe").c_str(), 0600));
  return outside;
}

// The last arguments of nftw below, and what it does instead of walking if a test sets it.
struct {
  int calls = 0;
  char path[64] = ""; // a fixed array, since memory may have run out
  int descriptors = 0;
  int flags = 0;
  std::function<void(__nftw_func_t)> instead;
} lastWalk;

class TempFolder : public testing::Test {
protected:
  ~TempFolder() override { lastWalk = {}; }

  TestFolder scratch;
};

} // namespace

extern "C" int nftw(const char *path, __nftw_func_t callback, int descriptors, int flags) {
  static auto *const real = realFunction<int(const char *, __nftw_func_t, int, int)>("nftw");
  ++lastWalk.calls;
  std::snprintf(lastWalk.path, sizeof lastWalk.path, "%s", path);
  lastWalk.descriptors = descriptors;
  lastWalk.flags = flags;
  if (lastWalk.instead) {
    lastWalk.instead(callback);
    return -1;
  }
  return real(path, callback, descriptors, flags);
}

// --- shape ---

TEST(TempFolderShape, IsNeitherCopiedNorMoved) {
  EXPECT_FALSE(std::is_copy_constructible<ScopedTempFolder>::value);
  EXPECT_FALSE(std::is_move_constructible<ScopedTempFolder>::value);
  EXPECT_FALSE(std::is_copy_assignable<ScopedTempFolder>::value);
  EXPECT_FALSE(std::is_move_assignable<ScopedTempFolder>::value);
  EXPECT_FALSE(std::is_copy_constructible<ScopedVolumeTempFolder>::value);
}

TEST(TempFolderShape, IsMadeOnlyWhenAskedFor) {
  EXPECT_FALSE((std::is_convertible<int, ScopedTempFolder>::value));
  EXPECT_FALSE((std::is_convertible<std::string, ScopedTempFolder>::value));
  EXPECT_TRUE(std::is_default_constructible<ScopedTempFolder>::value);
  EXPECT_TRUE(std::has_virtual_destructor<ScopedTempFolder>::value);
}

TEST_F(TempFolder, HoldsPathAndHashInThisOrder) {
  ScopedTempFolder folder(scratch / "a");
  ASSERT_TRUE(folder.isValid());
  EXPECT_EQ(folder.getPath(), fieldsOf(folder).path);
  EXPECT_EQ(plainHashOf(folder.getPath()), fieldsOf(folder).pathHash);
}

TEST_F(TempFolder, HoldsNothingAndZeroWhileEmpty) {
  ScopedTempFolder folder(7);
  expectOwnsNothing(folder);
  EXPECT_EQ(0U, fieldsOf(folder).pathHash);
  ASSERT_TRUE(folder.create(scratch / "a"));
  folder.unlink();
  EXPECT_EQ("", fieldsOf(folder).path);
  EXPECT_EQ(0U, fieldsOf(folder).pathHash);
}

TEST_F(TempFolder, OwnsNothingWithoutAPathWhateverItsHash) {
  ScopedTempFolder folder;
  fieldsOf(folder).pathHash = 5381; // that of an empty path
  expectOwnsNothing(folder);
  EXPECT_FALSE(folder.rename(scratch / "target"));
}

// --- creation ---

TEST_F(TempFolder, OfNoNameStandsInTmp) {
  const ScopedTempFolder folder("");
  ASSERT_TRUE(folder.isValid());
  EXPECT_THAT(folder.getPath(), MatchesRegex("/tmp/scoped_temp_folder\\.[A-Za-z0-9]{6}"));
  EXPECT_EQ(0700, modeOf(folder.getPath()));
  EXPECT_TRUE(std::filesystem::is_directory(folder.getPath()));
}

TEST_F(TempFolder, FollowsTheTemplateRule) {
  EXPECT_THAT(ScopedTempFolder(scratch / "abcXXXXXX").getPath(),
              MatchesRegex("/tmp/scratch/abc[A-Za-z0-9]{6}"));
  EXPECT_THAT(ScopedTempFolder(scratch / "abc").getPath(),
              MatchesRegex("/tmp/scratch/abc\\.[A-Za-z0-9]{6}"));
  EXPECT_THAT(ScopedTempFolder(scratch.path() + "/").getPath(),
              MatchesRegex("/tmp/scratch/\\.[A-Za-z0-9]{6}"));
}

TEST_F(TempFolder, OfABareNameStandsInTheWorkingDirectoryByItsAbsolutePath) {
  auto folder = std::make_unique<ScopedTempFolder>();
  {
    const ScopedWorkingDir inside(scratch.path());
    ASSERT_TRUE(folder->create("abc"));
  }
  EXPECT_THAT(folder->getPath(), MatchesRegex("/tmp/scratch/abc\\.[A-Za-z0-9]{6}"));
  folder.reset();
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty()) << "removed from elsewhere";
}

TEST_F(TempFolder, HasMode0700WhateverTheUmask) {
  for (const mode_t mask : {0U, 022U, 0777U}) {
    const ScopedUmask umask(mask);
    const ScopedTempFolder folder(scratch / "a");
    EXPECT_EQ(0700, modeOf(folder.getPath())) << mask;
  }
}

TEST_F(TempFolder, CreateRemovesTheFormerFolderFirst) {
  ScopedTempFolder folder(scratch / "a");
  const std::string former = folder.getPath();
  writeFile(former + "/file", "text");
  ASSERT_TRUE(folder.create(scratch / "b"));
  EXPECT_FALSE(isThere(former));
  EXPECT_TRUE(isThere(folder.getPath()));
  EXPECT_FALSE(folder.create("/missing/a"));
  expectOwnsNothing(folder);
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFolder, DoesNotCutANameThatIsTooLong) {
  const Fault count("mkdtemp", 99, EIO);
  const ScopedTempFolder folder(scratch / std::string(300, 'e'));
  EXPECT_EQ(ENAMETOOLONG, errno);
  expectOwnsNothing(folder);
  EXPECT_EQ(1, count.calls());
}

// --- failing calls ---

TEST_F(TempFolder, LeavesNothingWhenMkdtempFails) {
  forEachFailure("mkdtemp", ENOSPC, [&](Fault &fault) {
    {
      ScopedTempFolder folder;
      const bool created = folder.create(scratch / "a");
      EXPECT_EQ(!fault.fired(), created);
      if (!created) {
        EXPECT_EQ(ENOSPC, errno);
        expectOwnsNothing(folder);
      }
    }
    EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
  });
}

TEST_F(TempFolder, LeavesAFolderWhoseModeCannotBeSetToNobody) {
  {
    const Fault fault("chmod", 1, EPERM);
    const ScopedTempFolder folder(scratch / "a");
    EXPECT_EQ(EPERM, errno);
    expectOwnsNothing(folder);
  }
  EXPECT_EQ(1U, namesIn(scratch.path()).size()) << "deliberately left";
}

TEST_F(TempFolder, FailsSilentlyWithoutMemoryForTheName) {
  const Fault fault("strdup", 1, ENOMEM);
  const ScopedTempFolder folder(scratch / "a");
  expectOwnsNothing(folder);
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

// Removing a tree requires memory and descriptors, removing an empty folder does not.
TEST_F(TempFolder, IsRemovedWithoutDescriptorsWhileItIsEmpty) {
  ScopedTempFolder folder(scratch / "a");
  struct rlimit before = {};
  ASSERT_EQ(0, ::getrlimit(RLIMIT_NOFILE, &before));
  const struct rlimit none = {0, before.rlim_max};
  ASSERT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &none));
  folder.unlink();
  ASSERT_EQ(0, ::setrlimit(RLIMIT_NOFILE, &before));
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFolder, LeavesNothingWhileMemoryStaysShort) {
  forEachMalloc([&] { const ScopedTempFolder folder(scratch / "a name of some length"); },
                [&](bool) { EXPECT_THAT(namesIn(scratch.path()), IsEmpty()); },
                Failing::OnceAndLasting);
}

TEST_F(TempFolder, LeavesNothingWhenMemoryRunsOut) {
  forEachAllocation(
      [&] {
        const ScopedTempFolder folder(scratch / "a name of some length");
        EXPECT_TRUE(folder.isValid());
      },
      [&](bool) { EXPECT_THAT(namesIn(scratch.path()), IsEmpty()); });
}

// --- removal ---

TEST_F(TempFolder, DestructionRemovesTheTreeAndNothingThatALinkLeadsTo) {
  std::string outside;
  {
    const ScopedTempFolder folder(scratch / "a");
    outside = fillTree(folder.getPath(), scratch);
    errno = ELOOP;
  }
  EXPECT_EQ(ELOOP, errno);
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("outside"));
  EXPECT_EQ("text", readFile(outside + "/precious"));
}

TEST_F(TempFolder, UnlinkRemovesTheTreeAndGivesItUp) {
  ScopedTempFolder folder(scratch / "a");
  fillTree(folder.getPath(), scratch);
  folder.unlink();
  expectOwnsNothing(folder);
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("outside"));
  folder.unlink();
}

TEST_F(TempFolder, UnlinkOfAFolderThatIsGoneIsSilent) {
  ScopedTempFolder folder(scratch / "a");
  std::filesystem::remove(folder.getPath());
  errno = ELOOP;
  folder.unlink();
  EXPECT_EQ(ELOOP, errno);
  expectOwnsNothing(folder);
}

TEST_F(TempFolder, IsRemovedUnderTheWorkingDirectory) {
  ScopedTempFolder folder(scratch / "a");
  std::filesystem::create_directory(folder.getPath() + "/sub");
  const ScopedWorkingDir inside(folder.getPath() + "/sub");
  folder.unlink();
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFolder, RemovesALinkThatStandsInItsPlace) {
  ScopedTempFolder folder(scratch / "a");
  const std::string outside = scratch / "outside";
  std::filesystem::create_directories(outside);
  writeFile(outside + "/precious", "text");
  std::filesystem::remove(folder.getPath());
  std::filesystem::create_directory_symlink(outside, folder.getPath());
  folder.unlink();
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("outside"));
  EXPECT_TRUE(isThere(outside + "/precious"));
}

TEST_F(TempFolder, GoesOnSilentlyPastWhatCannotBeRemoved) {
  for (const char *function : {"unlink", "rmdir"}) {
    forEachFailure(function, EPERM, [&](Fault &fault) {
      ScopedTempFolder folder(scratch / "a");
      const std::string path = folder.getPath();
      std::filesystem::create_directories(path + "/x/y");
      std::filesystem::create_directories(path + "/z");
      writeFile(path + "/x/1", "");
      writeFile(path + "/x/y/2", "");
      writeFile(path + "/z/3", "");
      folder.unlink();
      expectOwnsNothing(folder);
      EXPECT_EQ(fault.fired(), isThere(path));
      EXPECT_EQ(std::string(function) == "unlink" ? 3 : 4, fault.calls()) << "every entry is tried";
      std::filesystem::remove_all(path);
    });
  }
}

TEST_F(TempFolder, IsWalkedDepthFirstWithTwentyDirectoriesOnItsFileSystem) {
  ScopedTempFolder folder(scratch / "a");
  const std::string path = folder.getPath();
  folder.unlink();
  EXPECT_EQ(1, lastWalk.calls);
  EXPECT_STREQ(path.c_str(), lastWalk.path);
  EXPECT_EQ(20, lastWalk.descriptors);
  EXPECT_EQ(FTW_PHYS | FTW_MOUNT | FTW_DEPTH, lastWalk.flags);
}

TEST_F(TempFolder, IsRemovedByTheCallForTheTypeOfEachEntryWhateverComesOfIt) {
  const struct {
    int type;
    bool directory;
  } types[] = {{FTW_D, true},   {FTW_DP, true},   {FTW_DNR, true}, {FTW_F, false},
               {FTW_SL, false}, {FTW_SLN, false}, {FTW_NS, false}};
  for (const auto &one : types) {
    SCOPED_TRACE(one.type);
    ScopedTempFolder folder(scratch / "a");
    const Fault rmdirs("rmdir", 1, EBUSY);
    const Fault unlinks("unlink", 1, EBUSY);
    lastWalk.instead = [&one](__nftw_func_t callback) {
      EXPECT_EQ(0, callback("/tmp/scratch/x", nullptr, one.type, nullptr)) << "the walk goes on";
    };
    folder.unlink();
    expectOwnsNothing(folder);
    EXPECT_EQ(one.directory ? 1 : 0, rmdirs.calls());
    EXPECT_EQ(one.directory ? 0 : 1, unlinks.calls());
  }
}

TEST_F(TempFolder, DoesNotEnterAMountPoint) {
  std::string path;
  {
    const ScopedTempFolder folder(scratch / "a");
    path = folder.getPath();
    std::filesystem::create_directory(path + "/mounted");
    writeFile(path + "/file", "text");
    if (::mount("tmpfs", (path + "/mounted").c_str(), "tmpfs", 0, "size=64k") != 0) {
      GTEST_SKIP() << "skipped: a tmpfs cannot be mounted: " << std::strerror(errno);
    }
    writeFile(path + "/mounted/precious", "text");
  }
  EXPECT_EQ("text", readFile(path + "/mounted/precious"));
  EXPECT_FALSE(isThere(path + "/file")) << "all else goes";
  ASSERT_EQ(0, ::umount((path + "/mounted").c_str()));
}

TEST_F(TempFolder, IsRemovedThroughAPointerToItsBase) {
  FakeVolumes platform(scratch.path());
  std::unique_ptr<ScopedTempFolder> folder = std::make_unique<ScopedVolumeTempFolder>(
      TempManager::maxVolume(freshLocation(), 1, false), "a");
  ASSERT_TRUE(folder->isValid());
  writeFile(folder->getPath() + "/file", "text");
  folder.reset();
  EXPECT_THAT(namesIn(scratch.path()), IsEmpty());
}

TEST_F(TempFolder, LeavesNoDescriptorOpen) {
  const int before = countOpenDescriptors();
  {
    const ScopedTempFolder folder(scratch / "a");
    EXPECT_EQ(before, countOpenDescriptors());
    fillTree(folder.getPath(), scratch);
  }
  EXPECT_EQ(before, countOpenDescriptors());
}

// --- rename and preserve ---

TEST_F(TempFolder, RenameMovesTheFolderAndGivesItUp) {
  {
    ScopedTempFolder folder(scratch / "a");
    writeFile(folder.getPath() + "/file", "text");
    EXPECT_TRUE(folder.rename(scratch / "target"));
    expectOwnsNothing(folder);
    EXPECT_EQ(0U, fieldsOf(folder).pathHash);
  }
  EXPECT_EQ("text", readFile(scratch / "target/file"));
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("target"));
}

TEST_F(TempFolder, RenameTakesARelativeTarget) {
  const ScopedWorkingDir inside(scratch.path());
  ScopedTempFolder folder("a");
  EXPECT_TRUE(folder.rename("target"));
  EXPECT_THAT(namesIn(scratch.path()), ElementsAre("target"));
}

TEST_F(TempFolder, RenameToTheSamePathIsRefusedAndLogged) {
  const ScopedWorkingDir inside(scratch.path());
  ScopedTempFolder folder("a");
  const std::string path = folder.getPath();
  for (const std::string &same : {path, path.substr(scratch.path().size() + 1)}) {
    LogCapture log;
    EXPECT_FALSE(folder.rename(same));
    EXPECT_THAT(
        log.take(),
        ElementsAre(errLine(kModule, 446, "rename temp folder to the same path[" + path + "]")));
    EXPECT_TRUE(folder.isValid());
    EXPECT_TRUE(isThere(path));
  }
}

TEST_F(TempFolder, RenameTakesThePlaceOfAnEmptyFolderOnly) {
  std::filesystem::create_directories(scratch / "full/sub");
  std::filesystem::create_directory(scratch / "empty");
  writeFile(scratch / "file", "text");
  ScopedTempFolder folder(scratch / "a");
  const std::string path = folder.getPath();
  writeFile(path + "/mine", "text");
  EXPECT_FALSE(folder.rename(scratch / "full"));
  EXPECT_EQ(ENOTEMPTY, errno);
  EXPECT_FALSE(folder.rename(scratch / "file"));
  EXPECT_EQ(ENOTDIR, errno);
  EXPECT_FALSE(folder.rename(path + "/inside"));
  EXPECT_EQ(EINVAL, errno);
  EXPECT_EQ(path, folder.getPath());
  EXPECT_TRUE(isThere(path + "/mine"));
  EXPECT_TRUE(folder.rename(scratch / "empty"));
  expectOwnsNothing(folder);
  EXPECT_THAT(namesIn(scratch / "empty"), ElementsAre("mine"));
}

TEST_F(TempFolder, AFailedRenameChangesNothing) {
  forEachFailure("rename", EXDEV, [&](Fault &fault) {
    ScopedTempFolder folder(scratch / "a");
    const std::string path = folder.getPath();
    const bool renamed = folder.rename(scratch / "target");
    EXPECT_EQ(!fault.fired(), renamed);
    if (!renamed) {
      EXPECT_EQ(EXDEV, errno);
      EXPECT_TRUE(folder.isValid());
      EXPECT_EQ(path, folder.getPath());
      EXPECT_TRUE(isThere(path));
    }
  });
}

TEST_F(TempFolder, RenameAndPreserveOfNothingFailSilently) {
  ScopedTempFolder folder;
  EXPECT_FALSE(folder.rename(scratch / "target"));
  EXPECT_EQ("", folder.preserve());
}

TEST_F(TempFolder, PreserveLeavesTheFolderToTheCaller) {
  std::string path;
  {
    ScopedTempFolder folder(scratch / "a");
    const std::string expected = folder.getPath();
    path = folder.preserve();
    EXPECT_EQ(expected, path);
    expectOwnsNothing(folder);
    EXPECT_EQ(0U, fieldsOf(folder).pathHash);
  }
  EXPECT_TRUE(isThere(path));
}

// --- the guard ---

TEST_F(TempFolder, WhosePathNoLongerFitsItsHashOwnsNothing) {
  const std::string other = scratch / "precious";
  std::filesystem::create_directory(other);
  std::string path;
  {
    ScopedTempFolder folder(scratch / "a");
    path = folder.getPath();
    fieldsOf(folder).path = other;
    EXPECT_FALSE(folder.isValid());
    EXPECT_FALSE(folder.rename(scratch / "target"));
    EXPECT_EQ("", folder.preserve());
    folder.unlink();
  }
  EXPECT_TRUE(isThere(path));
  EXPECT_TRUE(isThere(other));
  EXPECT_FALSE(isThere(scratch / "target"));
}

TEST_F(TempFolder, WhosePathNoLongerFitsForgetsItWhenCreateFails) {
  ScopedTempFolder folder(scratch / "a");
  fieldsOf(folder).pathHash += 1;
  EXPECT_FALSE(folder.create("/missing/a"));
  expectOwnsNothing(folder);
  EXPECT_EQ(0U, fieldsOf(folder).pathHash);
}
