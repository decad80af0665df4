// The volumes of this machine, with file systems that the test mounts below /mnt. Other volumes of
// the machine are ignored.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include "tests/platform/real_mounts.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/fault.h"
#include "tests/support/log_capture.h"
#include "tests/support/platform_conf.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <memory>
#include <string>
#include <sys/statvfs.h>
#include <syslog.h>
#include <thread>
#include <vector>

struct libmnt_table;
struct libmnt_iter;

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

namespace {
unsigned long blockFactor = 1; // how many fragments make one block
}

extern "C" {

int statvfs(const char *path, struct statvfs *out) noexcept {
  static auto *const real = realFunction<int(const char *, struct statvfs *)>("statvfs");
  if (failsNow("statvfs") || real(path, out) != 0) {
    return -1;
  }
  out->f_bsize *= blockFactor;
  return 0;
}

// The function of libmount that reads the mount table.
libmnt_table *mnt_new_table() {
  static auto *const real = realFunction<libmnt_table *()>("mnt_new_table");
  return failsNow("mnt_new_table") ? nullptr : real();
}

libmnt_iter *mnt_new_iter(int direction) {
  static auto *const real = realFunction<libmnt_iter *(int)>("mnt_new_iter");
  return failsNow("mnt_new_iter") ? nullptr : real(direction);
}

int mnt_table_parse_file(libmnt_table *table, const char *path) {
  static auto *const real = realFunction<int(libmnt_table *, const char *)>("mnt_table_parse_file");
  return failsNow("mnt_table_parse_file") ? -EIO : real(table, path);
}
}

namespace {

constexpr int kAll = KOVA_VOL_LOC_INTERNAL | KOVA_VOL_LOC_REMOVABLE;

class SdkVolumes : public testing::Test {
protected:
  void SetUp() override { KLIBCErrSetEx(0, nullptr, 0); }
  void TearDown() override { KLIBCErrSetEx(0, nullptr, 0); }

  // Records of the volumes below /mnt.
  static std::vector<KOVAVOLInfo> list(int location = kAll, int flags = KOVA_VOL_ENUM_MOUNTED) {
    const std::unique_ptr<KOVAVOLInfo, decltype(&KOVAMountVolInfoFree)> head(
        KOVAMountVolAllEnum(0, location, flags), &KOVAMountVolInfoFree);
    std::vector<KOVAVOLInfo> found;
    for (const KOVAVOLInfo *volume = head.get(); volume != nullptr; volume = volume->next) {
      if (std::strncmp(volume->mountPath, "/mnt/", 5) == 0) {
        found.push_back(*volume);
      }
    }
    return found;
  }

  static std::vector<std::string> paths(int location = kAll, int flags = KOVA_VOL_ENUM_MOUNTED) {
    std::vector<std::string> found;
    for (const KOVAVOLInfo &volume : list(location, flags)) {
      found.emplace_back(volume.mountPath);
    }
    return found;
  }

  static std::string holder(const std::string &path) {
    KOVAVOLInfo info{};
    return KOVAMountVolInfoGet(path.c_str(), &info) < 0 ? "none" : info.mountPath;
  }

  static std::uint64_t totalBytes(const char *path) {
    struct statvfs status {};
    EXPECT_EQ(0, ::statvfs(path, &status));
    return std::uint64_t{status.f_blocks} * status.f_frsize;
  }

  // A volume that needs no privilege: a directory of the tmpfs on /mnt.
  void nameVolume(const std::string &name, const std::string &settings = "") {
    std::filesystem::create_directories("/mnt/" + name);
    named += "[volume " + name + "]\npath=\"/mnt/" + name + "\"\n" + settings;
    conf.write(named);
  }

  PlatformConf conf;
  RealMounts mounts;
  std::string named;
};

struct Kind {
  const char *fileSystem;
  int code;
  int mebibytes;
};

void PrintTo(const Kind &kind, std::ostream *os) {
  *os << kind.fileSystem;
}

class SdkVolumesOfKind : public SdkVolumes, public testing::WithParamInterface<Kind> {};

} // namespace

TEST_P(SdkVolumesOfKind, RealFileSystemIsListedWithItsNumbers) {
  const Kind kind = GetParam();
  const std::string why = mounts.disk(kind.fileSystem, "disk", kind.mebibytes);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  const auto volumes = list();
  ASSERT_EQ(1U, volumes.size());
  EXPECT_STREQ("/mnt/disk", volumes[0].mountPath);
  EXPECT_EQ(kind.code, volumes[0].fsType);
  EXPECT_EQ(totalBytes("/mnt/disk"), volumes[0].size);
  EXPECT_GT(volumes[0].size, std::uint64_t{1} << 20);
  EXPECT_NE(0U, volumes[0].status);
  EXPECT_NE(0U, volumes[0].accessStatus);
  EXPECT_EQ("/mnt/disk", holder("/mnt/disk"));
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, SdkVolumesOfKind,
    testing::Values(Kind{"ext2", KOVA_VOL_FS_EXT, 16}, Kind{"ext3", KOVA_VOL_FS_EXT, 16},
                    Kind{"ext4", KOVA_VOL_FS_EXT4, 16}, Kind{"btrfs", KOVA_VOL_FS_BTRFS, 128},
                    Kind{"xfs", KOVA_VOL_FS_XFS, 320}, Kind{"vfat", KOVA_VOL_FS_VFAT, 16}),
    [](const auto &kind) { return std::string(kind.param.fileSystem); });

TEST_F(SdkVolumes, ReadOnlyVolumesAreListedWhenAskedForOnly) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  ASSERT_EQ("", mounts.remount("disk", RealMounts::Access::ReadOnly));
  EXPECT_THAT(list(), IsEmpty());
  const auto volumes = list(kAll, KOVA_VOL_ENUM_MOUNTED | KOVA_VOL_ENUM_READ_ONLY);
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ(0U, volumes[0].accessStatus);
  EXPECT_NE(0U, volumes[0].status);
  EXPECT_EQ("/mnt/disk", holder("/mnt/disk"));
  ASSERT_EQ("", mounts.remount("disk", RealMounts::Access::ReadWrite));
  EXPECT_THAT(paths(), ElementsAre("/mnt/disk"));
}

TEST_F(SdkVolumes, BindMountsCountOnceAndAPathOnThemHasItsVolume) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  std::filesystem::create_directories("/mnt/disk/share/deep");
  ASSERT_EQ("", mounts.bind("/mnt/disk/share", "bind"));
  ASSERT_EQ("", mounts.bind("/mnt/disk", "twin"));
  EXPECT_THAT(paths(), ElementsAre("/mnt/disk"));
  EXPECT_EQ("/mnt/disk", holder("/mnt/bind/deep"));
  EXPECT_EQ("/mnt/disk", holder("/mnt/twin"));
}

TEST_F(SdkVolumes, VolumeThatIsLeftThroughItsBindMountOnlyIsThatOne) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  std::filesystem::create_directories("/mnt/disk/share");
  ASSERT_EQ("", mounts.bind("/mnt/disk/share", "bind"));
  mounts.unmount("disk");
  EXPECT_THAT(paths(), ElementsAre("/mnt/bind"));
  EXPECT_EQ("/mnt/bind", holder("/mnt/bind"));
  EXPECT_EQ("none", holder("/mnt/disk"));
}

TEST_F(SdkVolumes, SubvolumesOfOneDeviceCountOnce) {
  const std::string why = mounts.disk("btrfs", "disk", 128);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  ASSERT_EQ("",
            run("btrfs subvolume create /mnt/disk/one && btrfs subvolume create /mnt/disk/two"));
  const std::string device = "$(findmnt -n -o SOURCE /mnt/disk)";
  ASSERT_EQ("", mounts.mount("mount -n -o subvol=/two " + device, "two"));
  ASSERT_EQ("", mounts.mount("mount -n -o subvol=/one " + device, "one"));
  EXPECT_THAT(paths(), ElementsAre("/mnt/disk"));
  EXPECT_EQ("/mnt/disk", holder("/mnt/one"));
  mounts.unmount("disk");
  EXPECT_THAT(paths(), ElementsAre("/mnt/two"));
  EXPECT_EQ("/mnt/two", holder("/mnt/one"));
}

TEST_F(SdkVolumes, CoveredMountIsNoVolume) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  ASSERT_EQ("", mounts.tmpfs("disk"));
  nameVolume("other"); // without any volume a line would be logged
  EXPECT_THAT(paths(), ElementsAre("/mnt/other"));
  EXPECT_EQ("none", holder("/mnt/disk"));
}

TEST_F(SdkVolumes, UnmountedVolumeIsGoneFromTheNextListOn) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  EXPECT_THAT(paths(), ElementsAre("/mnt/disk"));
  mounts.unmount("disk");
  nameVolume("other"); // without any volume a line would be logged
  EXPECT_THAT(paths(), ElementsAre("/mnt/other"));
}

TEST_F(SdkVolumes, TmpfsIsNoVolumeUntilItIsNamed) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("other");
  EXPECT_THAT(paths(), ElementsAre("/mnt/other"));
  EXPECT_EQ("none", holder("/mnt/ram"));
  nameVolume("ram");
  EXPECT_THAT(paths(), ElementsAre("/mnt/other", "/mnt/ram"));
  EXPECT_EQ("/mnt/ram", holder("/mnt/ram"));
}

TEST_F(SdkVolumes, NamedVolumeTellsWhatItsFileSystemDoes) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("ram/data");
  const auto volumes = list();
  ASSERT_EQ(1U, volumes.size());
  EXPECT_STREQ("/mnt/ram/data", volumes[0].mountPath);
  EXPECT_EQ(KOVA_VOL_FS_OTHER, volumes[0].fsType);
  EXPECT_EQ(8U << 20, volumes[0].size);
  EXPECT_NE(0U, volumes[0].status);
  EXPECT_NE(0U, volumes[0].accessStatus);
  EXPECT_EQ(nullptr, volumes[0].next);
}

TEST_F(SdkVolumes, SizeIsCountedInFragmentsNotInBlocks) {
  nameVolume("a");
  blockFactor = 8;
  const std::vector<KOVAVOLInfo> volumes = list();
  blockFactor = 1;
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ(totalBytes("/mnt/a"), volumes[0].size);
}

TEST_F(SdkVolumes, NamedVolumeOnAReadOnlyFileSystemIsReadOnly) {
  ASSERT_EQ("", mounts.tmpfs("ram"));
  nameVolume("ram/data");
  ASSERT_EQ("", mounts.remount("ram", RealMounts::Access::ReadOnly));
  EXPECT_THAT(paths(), IsEmpty());
  EXPECT_THAT(paths(kAll, KOVA_VOL_ENUM_READ_ONLY), ElementsAre("/mnt/ram/data"));
}

TEST_F(SdkVolumes, SettingsOfANamedVolumeStandInItsRecord) {
  nameVolume("data", "fsType=2\nsize=18446744073709551615\n");
  const auto volumes = list();
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ(2, volumes[0].fsType);
  EXPECT_EQ(18446744073709551615U, volumes[0].size);
}

TEST_F(SdkVolumes, NamedVolumeThatIsNotThereIsListedAsNotMounted) {
  nameVolume("there");
  nameVolume("gone", "size=5\n");
  std::filesystem::remove("/mnt/gone");
  EXPECT_THAT(paths(), ElementsAre("/mnt/there"));
  const auto volumes = list(kAll, 0);
  ASSERT_EQ(2U, volumes.size());
  EXPECT_STREQ("/mnt/gone", volumes[1].mountPath);
  EXPECT_EQ(0U, volumes[1].status);
  EXPECT_EQ(0U, volumes[1].accessStatus);
  EXPECT_EQ(5U, volumes[1].size);
}

TEST_F(SdkVolumes, MaskChoosesByLocation) {
  nameVolume("in", "removable=false\n");
  nameVolume("out", "removable=true\n");
  EXPECT_THAT(paths(KOVA_VOL_LOC_INTERNAL), ElementsAre("/mnt/in"));
  EXPECT_THAT(paths(KOVA_VOL_LOC_REMOVABLE), ElementsAre("/mnt/out"));
  EXPECT_THAT(paths(kAll), ElementsAre("/mnt/in", "/mnt/out"));
  EXPECT_THAT(paths(-1), ElementsAre("/mnt/in", "/mnt/out"));
  EXPECT_THAT(paths(0), IsEmpty());
  EXPECT_THAT(paths(4), IsEmpty());
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(SdkVolumes, MaskOfTheMachineIsThatOfItsVolumes) {
  nameVolume("in", "removable=false\n");
  EXPECT_NE(0, KOVAVolumeSupportLocGet() & KOVA_VOL_LOC_INTERNAL);
  nameVolume("out", "removable=true\n");
  EXPECT_EQ(kAll, KOVAVolumeSupportLocGet() & kAll);
}

TEST_F(SdkVolumes, MaskOfTheMachineLeavesOutWhatIsNeverListed) {
  const int before = KOVAVolumeSupportLocGet();
  if ((before & KOVA_VOL_LOC_REMOVABLE) != 0) {
    GTEST_SKIP() << "skipped: this machine has a removable volume of its own";
  }
  nameVolume(std::string(31, 'y'), "removable=true\n"); // "/mnt/" and 31 more bytes: one too many
  EXPECT_EQ(before, KOVAVolumeSupportLocGet());
}

TEST_F(SdkVolumes, RemovableRealVolumeIsOneWhenSoNamed) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  EXPECT_THAT(paths(KOVA_VOL_LOC_INTERNAL), ElementsAre("/mnt/disk")); // a loop device
  nameVolume("disk", "removable=true\n");
  EXPECT_THAT(paths(KOVA_VOL_LOC_INTERNAL), IsEmpty());
  const auto volumes = list(KOVA_VOL_LOC_REMOVABLE);
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ(KOVA_VOL_FS_EXT4, volumes[0].fsType);
}

TEST_F(SdkVolumes, ExcludedMountIsLeftOut) {
  const std::string why = mounts.disk("ext4", "disk", 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  nameVolume("other");
  conf.write(named + "[mounts]\nexclude=[\"/mnt/disk/\"]\n");
  EXPECT_THAT(paths(), ElementsAre("/mnt/other"));
  EXPECT_EQ("none", holder("/mnt/disk"));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(SdkVolumes, MountPathOf36BytesIsLeftOutWithAWarning) {
  const std::string fits(30, 'x'); // "/mnt/" and 30 more bytes: 35
  const std::string tooLong(31, 'y');
  nameVolume(fits);
  nameVolume(tooLong);
  LogCapture log;
  EXPECT_THAT(paths(), ElementsAre("/mnt/" + fits));
  EXPECT_THAT(log.take(),
              ElementsAre(LogLine{LOG_WARNING, "kovasdk: mount path /mnt/" + tooLong +
                                                   " is longer than 35 bytes: left out"}));
  EXPECT_EQ("none", holder("/mnt/" + tooLong));
  EXPECT_EQ(KOVA_SDK_ERR_TOO_LONG, KLIBCErrGet());
  EXPECT_EQ("/mnt/" + fits, holder("/mnt/" + fits));
}

TEST_F(SdkVolumes, RealMountPathOf36BytesIsLeftOutToo) {
  const std::string tooLong(31, 'y');
  const std::string why = mounts.disk("ext4", tooLong, 16);
  if (!why.empty()) {
    GTEST_SKIP() << "skipped: " << why;
  }
  LogCapture log;
  EXPECT_THAT(paths(), IsEmpty());
  EXPECT_EQ(1U, log.take().size());
  ASSERT_EQ("", mounts.bind("/mnt/" + tooLong, "short"));
  EXPECT_THAT(paths(), ElementsAre("/mnt/short"));
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(SdkVolumes, HolderIsFoundThroughLinksAndDots) {
  nameVolume("data");
  std::filesystem::create_directories("/mnt/data/a/b");
  std::filesystem::create_directory("/mnt/other");
  std::filesystem::create_directory_symlink("/mnt/data/a", "/mnt/other/link");
  EXPECT_EQ("/mnt/data", holder("/mnt/data/a/b"));
  EXPECT_EQ("/mnt/data", holder("/mnt/other/link/b"));
  EXPECT_EQ("/mnt/data", holder("/mnt/other/../data//a/./b/"));
  EXPECT_EQ("none", holder("/mnt/data/../other"));
  EXPECT_EQ(KOVA_SDK_ERR_NO_VOLUME, KLIBCErrGet());
}

TEST_F(SdkVolumes, HolderOfAMissingPathIsAFailure) {
  nameVolume("data");
  EXPECT_EQ("none", holder("/mnt/data/missing"));
  EXPECT_EQ(KOVA_SDK_ERR_PATH, KLIBCErrGet());
  EXPECT_STREQ("sdk/volumes.cpp", KLIBCErrorGetFile());
  EXPECT_GT(KLIBCErrorGetLine(), 0);
  EXPECT_EQ("none", holder(""));
  EXPECT_EQ(KOVA_SDK_ERR_PATH, KLIBCErrGet());
}

TEST_F(SdkVolumes, RecordIsFilledUpToItsLink) {
  nameVolume("data", "fsType=2\nsize=7\n");
  // The caller's record ends where the filled part does; the heap is guarded by the sanitizers.
  const std::unique_ptr<unsigned char[]> record(new unsigned char[KOVA_VOL_INFO_FILLED_BYTES + 8]);
  std::memset(record.get(), 0x5a, KOVA_VOL_INFO_FILLED_BYTES + 8);
  ASSERT_GE(KOVAMountVolInfoGet("/mnt/data", reinterpret_cast<KOVAVOLInfo *>(record.get())), 0);
  std::int32_t fsType = 0;
  std::uint64_t size = 0;
  std::memcpy(&fsType, record.get() + 12, sizeof fsType);
  std::memcpy(&size, record.get() + 88, sizeof size);
  EXPECT_EQ(2, fsType);
  EXPECT_EQ(7U, size);
  EXPECT_STREQ("/mnt/data", reinterpret_cast<const char *>(record.get()) + 52);
  EXPECT_EQ(0, record[KOVA_VOL_INFO_FILLED_BYTES - 1]);
  for (int i = 0; i < 8; ++i) {
    EXPECT_EQ(0x5a, record[static_cast<std::size_t>(KOVA_VOL_INFO_FILLED_BYTES + i)]);
  }
}

TEST_F(SdkVolumes, RecordIsUntouchedOnFailure) {
  KOVAVOLInfo info;
  std::memset(&info, 0x5a, sizeof info);
  EXPECT_LT(KOVAMountVolInfoGet("/mnt/none", &info), 0);
  const unsigned char *bytes = reinterpret_cast<const unsigned char *>(&info);
  EXPECT_TRUE(std::all_of(bytes, bytes + sizeof info, [](unsigned char b) { return b == 0x5a; }));
}

TEST_F(SdkVolumes, BadArgumentsAreFailures) {
  nameVolume("data");
  KOVAVOLInfo info{};
  EXPECT_LT(KOVAMountVolInfoGet(nullptr, &info), 0);
  EXPECT_EQ(KOVA_SDK_ERR_ARGUMENT, KLIBCErrGet());
  KLIBCErrSetEx(0, nullptr, 0);
  EXPECT_LT(KOVAMountVolInfoGet("/mnt/data", nullptr), 0);
  EXPECT_EQ(KOVA_SDK_ERR_ARGUMENT, KLIBCErrGet());
  KLIBCErrSetEx(0, nullptr, 0);
  EXPECT_EQ(nullptr, KOVAMountVolAllEnum(1, kAll, 0));
  EXPECT_EQ(KOVA_SDK_ERR_ARGUMENT, KLIBCErrGet());
  KOVAMountVolInfoFree(nullptr);
}

TEST_F(SdkVolumes, ErrorInTheConfigurationFailsEveryService) {
  nameVolume("data");
  conf.write(named + "sise=5\n");
  const LogLine line = {LOG_ERR, "kovaplatform: /tmp/platform.conf:3: unknown key 'sise'"};
  const auto failed = [&](bool result) {
    const bool recorded = KLIBCErrGet() == KOVA_CONF_ERR_KEY && KLIBCErrorGetLine() == 3 &&
                          conf.path == KLIBCErrorGetFile();
    KLIBCErrSetEx(0, nullptr, 0);
    return result && recorded;
  };
  LogCapture log;
  KOVAVOLInfo info{};
  char buf[512];
  EXPECT_TRUE(failed(KOVAMountVolAllEnum(0, kAll, 0) == nullptr));
  EXPECT_TRUE(failed(KOVAVolumeSupportLocGet() == 0));
  EXPECT_TRUE(failed(KOVAMountVolInfoGet("/mnt/data", &info) < 0));
  EXPECT_TRUE(failed(KOVAShareTmpPathGet("/mnt/data", buf, sizeof buf) < 0));
  EXPECT_TRUE(failed(KOVAShareNamePathGet("/mnt/data", buf, sizeof buf, buf, sizeof buf) < 0));
  EXPECT_THAT(log.take(), ElementsAre(line, line, line, line, line));
  EXPECT_FALSE(std::filesystem::exists("/mnt/data/.kova_tmp"));
}

TEST_F(SdkVolumes, UnreadableMountTableIsAFailure) {
  nameVolume("data");
  for (const char *function : {"mnt_new_table", "mnt_new_iter", "mnt_table_parse_file"}) {
    const Fault fault(function, 1, ENOMEM);
    LogCapture log;
    EXPECT_EQ(nullptr, KOVAMountVolAllEnum(0, kAll, 0));
    EXPECT_TRUE(fault.fired()) << function;
    EXPECT_EQ(KOVA_SDK_ERR_MOUNTS, KLIBCErrGet());
    KLIBCErrSetEx(0, nullptr, 0);
    EXPECT_THAT(log.take(),
                ElementsAre(LogLine{LOG_ERR, "kovasdk: the mount table cannot be read"}));
  }
}

TEST_F(SdkVolumes, VolumeWhoseSizeCannotBeReadIsLeftOutAndTheOthersAreNot) {
  nameVolume("a");
  nameVolume("b");
  KOVAVOLInfo info{};
  {
    const Fault fault("statvfs", 1, EIO);
    EXPECT_LT(KOVAMountVolInfoGet("/mnt/a", &info), 0);
    EXPECT_EQ(KOVA_SDK_ERR_SIZE, KLIBCErrGet());
  }
  // The machine's own volumes count as well.
  const Fault fault("statvfs", static_cast<int>(paths().size()), EIO);
  LogCapture log;
  const auto all = paths();
  EXPECT_TRUE(fault.fired());
  EXPECT_THAT(log.take(), ElementsAre(testing::Field(&LogLine::priority, LOG_WARNING)));
  EXPECT_THAT(all, testing::AnyOf(ElementsAre("/mnt/a"), ElementsAre("/mnt/b"),
                                  ElementsAre("/mnt/a", "/mnt/b")));
}

namespace {

// Lets the first allocation fail, then the second and so on, until none of the service's
// allocations fails. The service may succeed where the standard library can do without the memory;
// otherwise it fails with the code.
template <typename Service>
void serveWithoutMemory(Service failed) {
  int failures = 0;
  countFailures("operator new", Failing::Once, [&](int nth, bool) {
    KLIBCErrSetEx(0, nullptr, 0);
    LogCapture log;
    bool isFailure = false;
    bool fired = false;
    {
      const AllocFailure failure(nth);
      isFailure = failed();
      fired = failure.fired();
    }
    if (isFailure) {
      ++failures;
      EXPECT_TRUE(fired) << "it fails although no allocation does";
      EXPECT_THAT(KLIBCErrGet(), testing::AnyOf(KOVA_SDK_ERR_NO_MEMORY, KOVA_CONF_ERR_NO_MEMORY));
    }
    return fired;
  });
  EXPECT_GT(failures, 3);
}

} // namespace

TEST_F(SdkVolumes, WantOfMemoryIsAFailureAndNeverThrown) {
  nameVolume("a", "fsType=2\n");
  nameVolume("b", "fsType=3\n");
  std::filesystem::create_directories("/mnt/a/share");
  char name[64];
  char path[64];
  serveWithoutMemory([&] { return KOVAShareNamePathGet("/mnt/a/share", name, 64, path, 64) < 0; });
  serveWithoutMemory([&] { return KOVAShareTmpPathGet("/mnt/a", path, 64) < 0; });
  serveWithoutMemory([] {
    KOVAVOLInfo info{};
    return KOVAMountVolInfoGet("/mnt/b", &info) < 0;
  });
  serveWithoutMemory([] { return KOVAVolumeSupportLocGet() == 0; });
  serveWithoutMemory([] {
    KOVAVOLInfo *head = KOVAMountVolAllEnum(0, kAll, 0);
    KOVAMountVolInfoFree(head);
    return head == nullptr;
  });
}

TEST_F(SdkVolumes, ThreadsMayAskAtOnce) {
  nameVolume("a");
  nameVolume("b");
  std::vector<std::thread> threads;
  threads.reserve(8);
  for (int i = 0; i < 8; ++i) {
    threads.emplace_back([] {
      for (int round = 0; round < 20; ++round) {
        EXPECT_THAT(paths(), ElementsAre("/mnt/a", "/mnt/b"));
        EXPECT_EQ("/mnt/b", holder("/mnt/b"));
        EXPECT_NE(0, KOVAVolumeSupportLocGet());
      }
    });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
}

TEST_F(SdkVolumes, MachineWithoutAnySaysSoOnceAProcess) {
  std::string text;
  ASSERT_EQ(0, runFor(KOVA_TEST_CHILD, text));
  if (text.find("volume /") != std::string::npos) {
    GTEST_SKIP() << "skipped: this machine has volumes of its own";
  }
  EXPECT_EQ(
      "log: 4 kovasdk: no file system but the system's own is mounted: there are no volumes until "
      "one is named in /tmp/platform.conf\n"
      "locations 0, error 0x0000\n",
      text);
}

TEST_F(SdkVolumes, MachineWithANamedOneIsSilent) {
  nameVolume("data");
  std::string text;
  ASSERT_EQ(0, runFor(KOVA_TEST_CHILD, text));
  EXPECT_THAT(text, testing::HasSubstr("volume /mnt/data\n"));
  EXPECT_THAT(text, testing::Not(testing::HasSubstr("kovasdk")));
}
