// Share temporary directories and shares, on volumes that the configuration names below /mnt and on
// real ones where a test needs them.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include "tests/platform/real_mounts.h"
#include "tests/support/counting_loop.h"
#include "tests/support/interpose.h"
#include "tests/support/log_capture.h"
#include "tests/support/platform_conf.h"

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gmock/gmock.h>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

using namespace KovaTest;
namespace fs = std::filesystem;

namespace {

// Runs once, at the next open of the path, in place of another process that acts at that moment.
std::string watchedPath;
std::function<void()> meanwhile;
std::atomic<bool> allCloseOnExec{true}; // threads open files too

void noteFlags(int flags) {
  if ((flags & O_CLOEXEC) == 0) {
    allCloseOnExec = false;
  }
}

} // namespace

extern "C" {

int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  noteFlags(flags);
  if (meanwhile && watchedPath == path) {
    const std::function<void()> now = std::exchange(meanwhile, nullptr);
    now();
  }
  return failsNow("open") ? -1 : real(path, flags, mode);
}

int openat(int dir, const char *path, int flags, ...) {
  static auto *const real = realFunction<int(int, const char *, int, ...)>("openat");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  noteFlags(flags);
  return failsNow("openat") ? -1 : real(dir, path, flags, mode);
}
}

namespace {

class Shares : public testing::Test {
protected:
  void SetUp() override {
    KLIBCErrSetEx(0, nullptr, 0);
    nameVolume("vol");
    buf.fill('#');
    nameBuf.fill('#');
  }
  void TearDown() override { KLIBCErrSetEx(0, nullptr, 0); }

  void nameVolume(const std::string &name, const std::string &settings = "") {
    fs::create_directories("/mnt/" + name);
    named += "[volume " + name + "]\npath=\"/mnt/" + name + "\"\n" + settings;
    conf.write(named);
  }

  // The directory, or "" on failure; a failure must leave the buffer unchanged.
  std::string tmpPath(const std::string &mountPath) {
    buf.fill('#');
    if (KOVAShareTmpPathGet(mountPath.c_str(), buf.data(), static_cast<int>(buf.size())) < 0) {
      EXPECT_THAT(buf, testing::Each('#'));
      return "";
    }
    return buf.data();
  }

  // "<name>:<share path>", or "" on failure.
  std::string share(const std::string &path) {
    buf.fill('#');
    nameBuf.fill('#');
    if (KOVAShareNamePathGet(path.c_str(), nameBuf.data(), static_cast<int>(nameBuf.size()),
                             buf.data(), static_cast<int>(buf.size())) < 0) {
      EXPECT_THAT(buf, testing::Each('#'));
      EXPECT_THAT(nameBuf, testing::Each('#'));
      return "";
    }
    return std::string(nameBuf.data()) + ":" + buf.data();
  }

  static unsigned typeAndModeOf(const std::string &path) {
    struct stat status {};
    EXPECT_EQ(0, ::lstat(path.c_str(), &status)) << path;
    return status.st_mode;
  }

  PlatformConf conf;
  RealMounts mounts;
  std::string named;
  std::array<char, 4095> buf{};
  std::array<char, 492> nameBuf{};
};

constexpr unsigned kTmpMode = S_IFDIR | 01777;

} // namespace

// A chroot of which the root is a folder and not a mount point, as debootstrap makes it.
TEST_F(Shares, NamedVolumeInAChrootThatIsNotAMountPointHasATemporaryDirectory) {
  fs::create_directories("/mnt/jail/proc");
  fs::create_directories("/mnt/jail/data/share");
  const std::string why = mounts.bind("/proc", "jail/proc");
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  writeFile("/mnt/jail/platform.conf", "[volume data]\npath=\"/data\"\n");
  const pid_t child = ::fork();
  if (child == 0) {
    ::setenv("KOVA_PLATFORM_CONF", "/platform.conf", 1);
    std::array<char, 256> name = {};
    std::array<char, 256> path = {};
    if (::chroot("/mnt/jail") != 0 || ::chdir("/") != 0) {
      ::_exit(2);
    }
    const int tmp = ::KOVAShareTmpPathGet("/data", path.data(), 256);
    const bool isTmp = std::strcmp(path.data(), "/data/.kova_tmp") == 0;
    const int share = ::KOVAShareNamePathGet("/data/share", name.data(), 256, path.data(), 256);
    const bool isShare = std::strcmp(name.data(), "share") == 0;
    ::_exit(tmp == 0 && isTmp && share == 0 && isShare ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(child, ::waitpid(child, &status, 0));
  EXPECT_EQ(0, status);
  EXPECT_TRUE(fs::is_directory("/mnt/jail/data/.kova_tmp"));
}

TEST_F(Shares, TmpDirectoryIsMadeOnDemandForAll) {
  EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
  EXPECT_EQ(kTmpMode, typeAndModeOf("/mnt/vol/.kova_tmp"));
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(Shares, TmpDirectoryHasItsModeWhateverTheUmask) {
  const mode_t old = ::umask(0777);
  const std::string path = tmpPath("/mnt/vol");
  ::umask(old);
  EXPECT_EQ("/mnt/vol/.kova_tmp", path);
  EXPECT_EQ(kTmpMode, typeAndModeOf(path));
}

TEST_F(Shares, TmpDirectoryThatIsThereIsTaken) {
  ASSERT_NE("", tmpPath("/mnt/vol"));
  std::ofstream("/mnt/vol/.kova_tmp/kept") << "x";
  const Fault fault("fchmod", 1, EPERM); // as for another user, who must not change the mode
  EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
  EXPECT_EQ(0, fault.calls());
  EXPECT_TRUE(fs::exists("/mnt/vol/.kova_tmp/kept"));
}

TEST_F(Shares, TmpDirectoryWithAnotherModeGetsItsMode) {
  fs::create_directory("/mnt/vol/.kova_tmp");
  ASSERT_EQ(0, ::chmod("/mnt/vol/.kova_tmp", 0700));
  EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
  EXPECT_EQ(kTmpMode, typeAndModeOf("/mnt/vol/.kova_tmp"));
}

// Without it any user may remove what others have in the directory.
TEST_F(Shares, TmpDirectoryThatLacksOnlyTheStickyBitGetsIt) {
  fs::create_directory("/mnt/vol/.kova_tmp");
  ASSERT_EQ(0, ::chmod("/mnt/vol/.kova_tmp", 0777));
  EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
  EXPECT_EQ(kTmpMode, typeAndModeOf("/mnt/vol/.kova_tmp"));
}

TEST_F(Shares, LinkInPlaceOfTheTmpDirectoryIsRefused) {
  fs::create_directory("/mnt/elsewhere");
  ::chmod("/mnt/elsewhere", 0700);
  fs::create_directory_symlink("/mnt/elsewhere", "/mnt/vol/.kova_tmp");
  EXPECT_EQ("", tmpPath("/mnt/vol"));
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
  EXPECT_STREQ("sdk/shares.cpp", KLIBCErrorGetFile());
  EXPECT_EQ(S_IFDIR | 0700U, typeAndModeOf("/mnt/elsewhere"));
  EXPECT_TRUE(fs::is_symlink("/mnt/vol/.kova_tmp"));
}

TEST_F(Shares, DanglingLinkInPlaceOfTheTmpDirectoryIsRefused) {
  fs::create_symlink("/mnt/nowhere", "/mnt/vol/.kova_tmp");
  EXPECT_EQ("", tmpPath("/mnt/vol"));
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
  EXPECT_FALSE(fs::exists("/mnt/nowhere"));
}

TEST_F(Shares, FileOrFifoInPlaceOfTheTmpDirectoryIsRefused) {
  std::ofstream("/mnt/vol/.kova_tmp") << "x";
  EXPECT_EQ("", tmpPath("/mnt/vol"));
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
  fs::remove("/mnt/vol/.kova_tmp");
  ASSERT_EQ(0, ::mkfifo("/mnt/vol/.kova_tmp", 0600));
  EXPECT_EQ("", tmpPath("/mnt/vol"));
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
}

TEST_F(Shares, TmpPathMustFitTheBufferBeforeAnythingIsMade) {
  const std::string path = "/mnt/vol/.kova_tmp";
  for (const int size : {-1, 0, 1, static_cast<int>(path.size())}) {
    buf.fill('#');
    EXPECT_LT(KOVAShareTmpPathGet("/mnt/vol", buf.data(), size), 0) << size;
    EXPECT_EQ(KOVA_SDK_ERR_TOO_SMALL, KLIBCErrGet()) << size;
    EXPECT_THAT(buf, testing::Each('#'));
  }
  EXPECT_FALSE(fs::exists(path));
  EXPECT_GE(KOVAShareTmpPathGet("/mnt/vol", buf.data(), static_cast<int>(path.size()) + 1), 0);
  EXPECT_EQ(path, buf.data());
  EXPECT_EQ('#', buf[path.size() + 1]);
}

TEST_F(Shares, TmpDirectoryIsForVolumesOnly) {
  fs::create_directories("/mnt/plain");
  fs::create_directories("/mnt/vol/sub");
  for (const char *path : {"/mnt/plain", "/mnt/vol/sub", "/mnt/none", "/mnt", "mnt/vol"}) {
    EXPECT_EQ("", tmpPath(path)) << path;
    EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet()) << path;
    EXPECT_FALSE(fs::exists(std::string(path) + "/.kova_tmp")) << path;
  }
  EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol/"));
}

TEST_F(Shares, NamedVolumeThatIsNotThereHasNoTmpDirectory) {
  nameVolume("gone");
  fs::remove("/mnt/gone");
  EXPECT_EQ("", tmpPath("/mnt/gone"));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(Shares, VolumeUnmountedMeanwhileDoesNotFillTheDirectoryBelowIt) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("ram");
  watchedPath = "/mnt/ram";
  meanwhile = [&] { mounts.unmount("ram"); };
  EXPECT_EQ("", tmpPath("/mnt/ram"));
  EXPECT_EQ(nullptr, meanwhile) << "the mount path was not opened";
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
  EXPECT_FALSE(fs::exists("/mnt/ram/.kova_tmp"));
}

TEST_F(Shares, RealVolumesHaveTheirTmpDirectories) {
  for (const auto &[kind, size] : {std::pair("ext4", 16), std::pair("btrfs", 128)}) {
    const std::string why = mounts.disk(kind, kind, size);
    if (!why.empty()) {
      GTEST_SKIP() << "skipped: " << why;
    }
    const std::string path = std::string("/mnt/") + kind + "/.kova_tmp";
    EXPECT_EQ(path, tmpPath(std::string("/mnt/") + kind));
    EXPECT_EQ(kTmpMode, typeAndModeOf(path));
  }
}

TEST_F(Shares, ReadOnlyVolumeHasTheTmpDirectoryThatItHas) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("ram");
  ASSERT_EQ("", mounts.remount("ram", RealMounts::Access::ReadOnly));
  EXPECT_EQ("", tmpPath("/mnt/ram"));
  EXPECT_EQ(KOVA_SDK_ERR_TMP_DIR, KLIBCErrGet());
  ASSERT_EQ("", mounts.remount("ram", RealMounts::Access::ReadWrite));
  ASSERT_NE("", tmpPath("/mnt/ram"));
  ASSERT_EQ("", mounts.remount("ram", RealMounts::Access::ReadOnly));
  EXPECT_EQ("/mnt/ram/.kova_tmp", tmpPath("/mnt/ram"));
}

TEST_F(Shares, FailingSystemCallsLeaveATmpDirectoryThatTheNextCallMends) {
  for (const char *function : {"open", "mkdirat", "openat", "fstat", "fchmod"}) {
    forEachFailure(function, EIO, [&](Fault &fault) {
      fs::remove("/mnt/vol/.kova_tmp");
      const mode_t old = ::umask(022); // so that the mode needs a change
      LogCapture log;                  // some of the calls read the configuration
      const std::string path = tmpPath("/mnt/vol");
      ::umask(old);
      EXPECT_EQ(fault.fired(), path.empty());
      if (fault.fired()) {
        EXPECT_THAT(KLIBCErrGet(),
                    testing::AnyOf(KOVA_SDK_ERR_TMP_DIR, KOVA_CONF_ERR_OPEN, KOVA_SDK_ERR_MOUNTS));
      }
    });
    EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
    EXPECT_EQ(kTmpMode, typeAndModeOf("/mnt/vol/.kova_tmp"));
  }
}

TEST_F(Shares, SignalThatInterruptsAnOpenIsNoFailure) {
  for (const char *function : {"open", "openat"}) {
    countFailures(function, Failing::Once, [&](int nth, bool /*lasting*/) {
      fs::remove("/mnt/vol/.kova_tmp");
      const Fault fault(function, nth, EINTR);
      EXPECT_EQ("/mnt/vol/.kova_tmp", tmpPath("/mnt/vol"));
      return fault.fired();
    });
  }
}

TEST_F(Shares, ModeThatAForeignFileSystemDoesNotKeepIsNoFailure) {
  nameVolume("fat", "fsType=9\n");
  const mode_t old = ::umask(022);
  const Fault fault("fchmod", 1, EPERM);
  EXPECT_EQ("/mnt/fat/.kova_tmp", tmpPath("/mnt/fat"));
  ::umask(old);
  EXPECT_TRUE(fault.fired());
}

TEST_F(Shares, AnotherUserMayUseTheTmpDirectory) {
  constexpr int kNoOtherUser = 2;
  ASSERT_NE("", tmpPath("/mnt/vol"));
  const pid_t child = ::fork();
  if (child == 0) {
    const bool other = ::setgid(65534) == 0 && ::setuid(65534) == 0;
    ::_exit(!other ? kNoOtherUser : tmpPath("/mnt/vol") == "/mnt/vol/.kova_tmp" ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(child, ::waitpid(child, &status, 0));
  if (WIFEXITED(status) && WEXITSTATUS(status) == kNoOtherUser) {
    GTEST_SKIP() << "skipped: needs root to become another user";
  }
  EXPECT_EQ(0, status);
}

TEST_F(Shares, ManyMayMakeTheTmpDirectoryAtOnce) {
  for (int round = 0; round < 20; ++round) {
    fs::remove("/mnt/vol/.kova_tmp");
    std::vector<std::thread> threads;
    threads.reserve(8);
    for (int i = 0; i < 8; ++i) {
      threads.emplace_back([] {
        char own[64] = "";
        EXPECT_GE(KOVAShareTmpPathGet("/mnt/vol", own, sizeof own), 0);
        EXPECT_STREQ("/mnt/vol/.kova_tmp", own);
      });
    }
    for (std::thread &thread : threads) {
      thread.join();
    }
    EXPECT_EQ(kTmpMode, typeAndModeOf("/mnt/vol/.kova_tmp"));
  }
}

TEST_F(Shares, EveryDescriptorIsCloseOnExec) {
  allCloseOnExec = true;
  ASSERT_NE("", tmpPath("/mnt/vol"));
  EXPECT_TRUE(allCloseOnExec);
}

TEST_F(Shares, ShareIsTheFirstDirectoryBelowItsVolume) {
  fs::create_directories("/mnt/vol/music/rock/live");
  std::ofstream("/mnt/vol/music/rock/song") << "x";
  for (const char *path : {"/mnt/vol/music", "/mnt/vol/music/", "/mnt/vol/music/rock",
                           "/mnt/vol/music/rock/live", "/mnt/vol/music/rock/song"}) {
    EXPECT_EQ("music:/mnt/vol/music", share(path)) << path;
  }
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(Shares, PathIsResolvedBeforeItsShareIsTold) {
  fs::create_directories("/mnt/vol/a/sub");
  fs::create_directories("/mnt/vol/b");
  fs::create_directory_symlink("/mnt/vol/b", "/mnt/vol/a/link");
  fs::create_directory_symlink("/mnt/vol/a", "/mnt/outside");
  EXPECT_EQ("b:/mnt/vol/b", share("/mnt/vol/a/../b"));
  EXPECT_EQ("b:/mnt/vol/b", share("/mnt/vol/a/link"));
  EXPECT_EQ("a:/mnt/vol/a", share("/mnt/outside/sub"));
  EXPECT_EQ("a:/mnt/vol/a", share("/mnt/vol/./b//../a/sub/"));
  EXPECT_EQ("", share("/mnt/vol/a/../.."));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(Shares, RelativePathIsThatOfTheWorkingDirectory) {
  fs::create_directories("/mnt/vol/a/sub");
  const fs::path old = fs::current_path();
  fs::current_path("/mnt/vol/a");
  EXPECT_EQ("a:/mnt/vol/a", share("sub"));
  EXPECT_EQ("a:/mnt/vol/a", share("."));
  fs::current_path(old);
}

TEST_F(Shares, HiddenAndMarkedNamesAreNoShares) {
  ASSERT_NE("", tmpPath("/mnt/vol"));
  fs::create_directories("/mnt/vol/@eaDir/x");
  fs::create_directories("/mnt/vol/.trash/x");
  for (const char *path :
       {"/mnt/vol/@eaDir", "/mnt/vol/@eaDir/x", "/mnt/vol/.trash/x", "/mnt/vol/.kova_tmp"}) {
    EXPECT_EQ("", share(path)) << path;
    EXPECT_EQ(KOVA_SDK_ERR_NO_SHARE, KLIBCErrGet()) << path;
  }
  fs::create_directories("/mnt/vol/a/@eaDir/.x");
  EXPECT_EQ("a:/mnt/vol/a", share("/mnt/vol/a/@eaDir/.x"));
}

TEST_F(Shares, VolumeItselfAndItsFilesLieInNone) {
  std::ofstream("/mnt/vol/file") << "x";
  for (const char *path : {"/mnt/vol", "/mnt/vol/", "/mnt/vol/file"}) {
    EXPECT_EQ("", share(path)) << path;
    EXPECT_EQ(KOVA_SDK_ERR_NO_SHARE, KLIBCErrGet()) << path;
  }
}

TEST_F(Shares, PathOnNoVolumeLiesInNone) {
  fs::create_directories("/mnt/plain/x");
  EXPECT_EQ("", share("/mnt/plain/x"));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(Shares, MissingPathLiesInNone) {
  for (const char *path : {"/mnt/vol/missing", "/mnt/vol/missing/x", ""}) {
    EXPECT_EQ("", share(path)) << path;
    EXPECT_EQ(KOVA_SDK_ERR_PATH, KLIBCErrGet()) << path;
  }
}

TEST_F(Shares, BindMountOfAFolderLiesInTheShareOfThatFolder) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("ram");
  fs::create_directories("/mnt/ram/music/rock/live");
  ASSERT_EQ("", mounts.bind("/mnt/ram/music/rock", "bind"));
  EXPECT_EQ("music:/mnt/ram/music", share("/mnt/bind/live"));
}

TEST_F(Shares, FileSystemMountedInAShareIsNotTheShares) {
  fs::create_directories("/mnt/vol/a");
  ASSERT_EQ("", mounts.tmpfs("vol/a/ram"));
  EXPECT_EQ("", share("/mnt/vol/a/ram"));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(Shares, VolumeWhosePathDoesNotFitTheRecordHasShares) {
  const std::string name(60, 'x');
  nameVolume(name);
  fs::create_directories("/mnt/" + name + "/a/b");
  EXPECT_EQ("a:/mnt/" + name + "/a", share("/mnt/" + name + "/a/b"));
  EXPECT_EQ("/mnt/" + name + "/.kova_tmp", tmpPath("/mnt/" + name));
}

TEST_F(Shares, BuffersAreFilledToTheirLastByteAndNotOverrun) {
  fs::create_directories("/mnt/vol/music");
  const std::string path = "/mnt/vol/music";
  EXPECT_EQ(0, KOVAShareNamePathGet(path.c_str(), nameBuf.data(), 6, buf.data(), 15));
  EXPECT_STREQ("music", nameBuf.data());
  EXPECT_STREQ("/mnt/vol/music", buf.data());
  EXPECT_EQ('#', nameBuf[6]);
  EXPECT_EQ('#', buf[15]);
}

TEST_F(Shares, BufferThatIsTooSmallIsAFailureAndNeitherIsTouched) {
  fs::create_directories("/mnt/vol/music");
  const std::pair<int, int> rows[] = {{5, 15}, {6, 14}, {0, 15}, {6, 0}, {-1, 15}, {6, -1}};
  for (const auto &[nameSize, pathSize] : rows) {
    EXPECT_LT(
        KOVAShareNamePathGet("/mnt/vol/music", nameBuf.data(), nameSize, buf.data(), pathSize), 0);
    EXPECT_EQ(KOVA_SDK_ERR_TOO_SMALL, KLIBCErrGet()) << nameSize << " " << pathSize;
    EXPECT_THAT(nameBuf, testing::Each('#'));
    EXPECT_THAT(buf, testing::Each('#'));
  }
}

TEST_F(Shares, LongestNameFits) {
  const std::string name(255, 'n');
  fs::create_directories("/mnt/vol/" + name);
  EXPECT_EQ(name + ":/mnt/vol/" + name, share("/mnt/vol/" + name));
}

TEST_F(Shares, NullArgumentsAreFailures) {
  const auto refused = [](int result) {
    const bool recorded = KLIBCErrGet() == KOVA_SDK_ERR_ARGUMENT;
    KLIBCErrSetEx(0, nullptr, 0);
    return result < 0 && recorded;
  };
  EXPECT_TRUE(refused(KOVAShareTmpPathGet(nullptr, buf.data(), 100)));
  EXPECT_TRUE(refused(KOVAShareTmpPathGet("", buf.data(), 100)));
  EXPECT_TRUE(refused(KOVAShareTmpPathGet("/mnt/vol", nullptr, 100)));
  EXPECT_TRUE(refused(KOVAShareNamePathGet(nullptr, nameBuf.data(), 100, buf.data(), 100)));
  EXPECT_TRUE(refused(KOVAShareNamePathGet("/mnt/vol", nullptr, 100, buf.data(), 100)));
  EXPECT_TRUE(refused(KOVAShareNamePathGet("/mnt/vol", nameBuf.data(), 100, nullptr, 100)));
}
