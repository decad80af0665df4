// The choice of volumes, on systems that consist of a mount table only.

#include "platform/sdk/volume_table.h"

#include "kovaplatform/kovasdk.h"
#include "platform/sdk/file_system.h"

#include <gmock/gmock.h>
#include <map>
#include <set>
#include <string>

using namespace KovaPlatform;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

// A path is on the mount with the longest target that holds it, and on the last of equal ones, as
// on a real system, unless the test says otherwise.
class FakeProbe : public SystemProbe {
public:
  int add(const std::string &target, const std::string &fsType, unsigned device,
          const std::string &root = "/") {
    Mount mount;
    mount.id = static_cast<int>(table.size()) + 100;
    mount.device = device;
    mount.root = root;
    mount.target = target;
    mount.fsType = fsType;
    mount.source = "/dev/" + std::to_string(device);
    table.push_back(mount);
    return mount.id;
  }

  bool mounts(std::vector<Mount> &out) const override {
    out = table;
    return readable;
  }
  std::optional<std::string> resolve(const std::string &path) const override {
    const auto link = links.find(path);
    const std::string real = link == links.end() ? path : link->second;
    return missing.count(real) != 0 ? std::nullopt : std::optional<std::string>(real);
  }
  std::optional<PathFacts> facts(const std::string &path) const override {
    if (missing.count(path) != 0) {
      return std::nullopt;
    }
    PathFacts facts;
    facts.isDirectory = files.count(path) == 0;
    if (tellsIds) {
      const auto told = ids.find(path);
      facts.mountId = static_cast<std::uint64_t>(told != ids.end() ? told->second : idOf(path));
    }
    return facts;
  }
  std::optional<Space> space(const std::string &) const override { return Space{1000, false}; }
  std::int32_t location(const Mount &mount) const override {
    return removable.count(static_cast<unsigned>(mount.device)) != 0 ? KOVA_VOL_LOC_REMOVABLE
                                                                     : KOVA_VOL_LOC_INTERNAL;
  }

  std::vector<Mount> table;
  std::map<std::string, std::string> links;
  std::map<std::string, int> ids;
  std::set<std::string> missing;
  std::set<std::string> files;
  std::set<unsigned> removable;
  bool readable = true;
  bool tellsIds = true;

private:
  int idOf(const std::string &path) const {
    const Mount *best = nullptr;
    for (const Mount &mount : table) {
      if (isWithin(mount.target, path) &&
          (best == nullptr || mount.target.size() >= best->target.size())) {
        best = &mount;
      }
    }
    return best == nullptr ? 0 : best->id;
  }
};

class Volumes : public testing::Test {
protected:
  Volumes() { probe.add("/", "ext4", 1); }

  const VolumeTable &read() {
    table = VolumeTable::read(probe, config);
    return *table;
  }
  std::vector<std::string> paths() {
    std::vector<std::string> found;
    for (const Volume &volume : read().volumes()) {
      found.push_back(volume.mountPath);
    }
    return found;
  }
  NamedVolume &name(const std::string &path) {
    NamedVolume &named = config.volumes.emplace_back();
    named.name = "v" + std::to_string(config.volumes.size());
    named.path = path;
    return named;
  }
  // "<mount path>:<path inside>", "<mount path>:?" or "none"
  std::string place(const std::string &path) {
    const PathOnVolume found = read().pathOnVolume(path, probe);
    return found.volume == nullptr ? "none"
                                   : found.volume->mountPath + ":" + found.inside.value_or("?");
  }

  FakeProbe probe;
  Config config;
  std::optional<VolumeTable> table;
};

} // namespace

TEST(FileSystems, ThoseThatHoldDataHaveTheirNumbers) {
  const std::map<std::string, int> codes = {
      {"ext2", 1},  {"ext3", 1}, {"ext4", 2},         {"btrfs", 3}, {"xfs", 4},
      {"f2fs", 5},  {"zfs", 6},  {"ntfs", 7},         {"ntfs3", 7}, {"fuseblk", 7},
      {"exfat", 8}, {"vfat", 9}, {"fuseblk.exfat", 8}};
  for (const auto &[name, code] : codes) {
    ASSERT_NE(nullptr, findFileSystem(name)) << name;
    EXPECT_EQ(code, findFileSystem(name)->code) << name;
    EXPECT_EQ(code, fileSystemCode(name)) << name;
  }
}

TEST(FileSystems, OthersHoldNone) {
  for (const char *name :
       {"proc",     "sysfs",    "tmpfs",      "devtmpfs", "ramfs",  "rootfs",  "overlay",
        "squashfs", "erofs",    "iso9660",    "udf",      "nfs",    "nfs4",    "cifs",
        "9p",       "fuse",     "fuse.sshfs", "fuseblk.", "autofs", "cgroup2", "bpf",
        "mqueue",   "ecryptfs", "",           "EXT4",     "ext",    "ext44"}) {
    EXPECT_EQ(nullptr, findFileSystem(name)) << name;
    EXPECT_EQ(0, fileSystemCode(name)) << name;
  }
}

TEST(FileSystems, OnlyForeignOnesKeepNoModes) {
  for (int code = 0; code <= 6; ++code) {
    EXPECT_TRUE(keepsModes(code)) << code;
  }
  for (int code = 7; code <= 9; ++code) {
    EXPECT_FALSE(keepsModes(code)) << code;
  }
}

TEST(SystemMounts, AreTheSystemsDirectoriesAndWhatLiesInItsStores) {
  for (const char *path : {"/",
                           "/boot",
                           "/boot/efi",
                           "/boot2",
                           "/efi",
                           "/usr",
                           "/var",
                           "/tmp",
                           "/snap",
                           "/snap/core/1",
                           "/var/lib/docker",
                           "/var/lib/docker/overlay2/x/merged",
                           "/var/log",
                           "/var/log/audit",
                           "/var/tmp",
                           "/var/lib/containers/storage/overlay",
                           "/run/containerd/io",
                           "/var/lib/kubelet/pods/x",
                           "/var/lib/lxd/storage",
                           "/var/lib/machines"}) {
    EXPECT_TRUE(isSystemMount(path)) << path;
  }
  for (const char *path : {"/home", "/srv", "/mnt", "/mnt/boot", "/media/stick", "/volume1",
                           "/data", "/usr2", "/var/lib/mysql", "/var/lib/dockerdata", "/tmp/x",
                           "/efi2", "/run/media/u/d", "/snapshots", "/opt"}) {
    EXPECT_FALSE(isSystemMount(path)) << path;
  }
}

TEST_F(Volumes, MountOfAChrootsRootThatTheTableLacksHoldsNamedDirectories) {
  probe.table.clear();
  const int disk = probe.add("/mnt/disk", "ext4", 2);
  probe.ids = {{"/", 7}, {"/srv/data", 7}, {"/srv/data/a", 7}, {"/etc", 7}};
  name("/srv/data");
  EXPECT_THAT(paths(), ElementsAre("/mnt/disk", "/srv/data"));
  EXPECT_EQ("/srv/data:a", place("/srv/data/a"));
  EXPECT_EQ("none", place("/etc"));
  EXPECT_EQ(7, read().volumes().back().mountId);
  EXPECT_EQ(disk, read().volumes().front().mountId);
}

TEST_F(Volumes, MountOfAChrootsRootLeavesOtherMountsOfItsDeviceVolumes) {
  probe.table.clear();
  probe.add("/data", "ext4", 0, "/host/data"); // the device of every path of this probe
  probe.ids = {{"/", 7}};
  EXPECT_THAT(paths(), ElementsAre("/data"));
}

TEST_F(Volumes, MachineWithItsRootOnlyHasNone) {
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, UnreadableTableIsAFailure) {
  probe.readable = false;
  EXPECT_FALSE(VolumeTable::read(probe, config).has_value());
}

TEST_F(Volumes, AreListedInTheOrderOfTheTable) {
  probe.add("/proc", "proc", 20);
  probe.add("/mnt/b", "btrfs", 2);
  probe.add("/boot", "ext2", 3);
  probe.add("/tmp", "tmpfs", 21);
  probe.add("/mnt/a", "ext4", 4);
  probe.add("/mnt/net", "nfs4", 22);
  EXPECT_THAT(paths(), ElementsAre("/mnt/b", "/mnt/a"));
}

TEST_F(Volumes, CarryWhatTheMountTells) {
  const int id = probe.add("/mnt/a", "btrfs", 2, "/sub");
  probe.removable = {2};
  const Volume volume = read().volumes().at(0);
  EXPECT_EQ("/mnt/a", volume.mountPath);
  EXPECT_EQ("/mnt/a", volume.realPath);
  EXPECT_EQ(id, volume.mountId);
  EXPECT_EQ("/sub", volume.root);
  EXPECT_EQ(KOVA_VOL_FS_BTRFS, volume.fsType);
  EXPECT_EQ(KOVA_VOL_LOC_REMOVABLE, volume.location);
  EXPECT_EQ(std::nullopt, volume.size);
  EXPECT_FALSE(volume.isNamed);
  EXPECT_TRUE(volume.isMounted());
}

TEST_F(Volumes, BindMountsCountOnce) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/b", "ext4", 2, "/sub");
  probe.add("/mnt/c", "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/mnt/a"));
}

TEST_F(Volumes, MountThatShowsTheRootStandsForItsDevice) {
  probe.add("/mnt/sub", "ext4", 2, "/sub");
  probe.add("/mnt/x", "ext4", 3);
  probe.add("/mnt/all", "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/mnt/all", "/mnt/x"));
}

TEST_F(Volumes, SubvolumesCountOnceAsTheFirst) {
  probe.add("/mnt/home", "btrfs", 2, "/@home");
  probe.add("/mnt/data", "btrfs", 2, "/@data");
  EXPECT_THAT(paths(), ElementsAre("/mnt/home"));
}

TEST_F(Volumes, SystemDiskIsNoneThroughABindMountEither) {
  probe.add("/srv/www", "ext4", 1, "/var/www");
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, SubvolumesOfTheSystemDiskAreNone) {
  probe.table.clear();
  probe.add("/", "btrfs", 1, "/@");
  probe.add("/home", "btrfs", 1, "/@home");
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, SystemDiskMountedWholeElsewhereIsOne) {
  probe.table.clear();
  probe.add("/", "btrfs", 1, "/@");
  probe.add("/pool", "btrfs", 1);
  EXPECT_THAT(paths(), ElementsAre("/pool"));
}

TEST_F(Volumes, DataDiskThatAlsoHoldsContainersStaysOne) {
  probe.add("/var/lib/docker", "ext4", 2, "/docker");
  probe.add("/data", "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/data"));
}

TEST_F(Volumes, CoveredMountDoesNotCount) {
  const int covered = probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/a", "xfs", 3);
  EXPECT_THAT(paths(), ElementsAre("/mnt/a"));
  EXPECT_NE(covered, read().volumes().at(0).mountId);
  EXPECT_EQ(KOVA_VOL_FS_XFS, read().volumes().at(0).fsType);
}

TEST_F(Volumes, MountCoveredFromAboveDoesNotCount) {
  probe.add("/mnt/a/b", "ext4", 2);
  probe.ids["/mnt/a/b"] = probe.add("/mnt/a", "xfs", 3);
  EXPECT_THAT(paths(), ElementsAre("/mnt/a"));
}

TEST_F(Volumes, CoveredMountLeavesItsPlaceToAnotherOfItsDevice) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/a", "tmpfs", 20);
  probe.add("/mnt/b", "ext4", 2, "/sub");
  EXPECT_THAT(paths(), ElementsAre("/mnt/b"));
}

TEST_F(Volumes, MountThatCannotBeReachedDoesNotCount) {
  probe.add("/mnt/a", "ext4", 2);
  probe.missing = {"/mnt/a"};
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, MountedFileDoesNotCount) {
  probe.add("/etc/hosts", "ext4", 2, "/containers/x/hosts");
  probe.files = {"/etc/hosts"};
  EXPECT_THAT(paths(), IsEmpty());
  probe.add("/data", "ext4", 2, "/srv/data");
  EXPECT_THAT(paths(), ElementsAre("/data"));
}

TEST_F(Volumes, AreFoundWithoutMountIdsToo) {
  probe.tellsIds = false;
  probe.add("/mnt/a", "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/mnt/a"));
  EXPECT_EQ("/mnt/a:x/y", place("/mnt/a/x/y"));
  EXPECT_EQ("none", place("/mnt/ab"));
}

TEST_F(Volumes, PathIsOnTheLastOfEqualMountsWithoutMountIds) {
  probe.tellsIds = false;
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/a", "ext4", 3);
  probe.add("/mnt", "ext4", 4);
  const PathOnVolume found = read().pathOnVolume("/mnt/a/x", probe);
  ASSERT_NE(nullptr, found.volume);
  EXPECT_EQ(3U, found.volume->device);
}

TEST_F(Volumes, ExcludedMountsAreLeftOut) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/b", "ext4", 3);
  config.mountExcludes = {"/mnt/a", "/mnt/not"};
  EXPECT_THAT(paths(), ElementsAre("/mnt/b"));
}

TEST_F(Volumes, ExclusionMeansTheMountPathItself) {
  probe.add("/mnt/a/b", "ext4", 2);
  config.mountExcludes = {"/mnt/a"};
  EXPECT_THAT(paths(), ElementsAre("/mnt/a/b"));
}

TEST_F(Volumes, ExclusionOfOneMountLeavesTheOthersOfItsDevice) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/b", "ext4", 2);
  config.mountExcludes = {"/mnt/a"};
  EXPECT_THAT(paths(), ElementsAre("/mnt/b"));
}

TEST_F(Volumes, ExclusionOfTheRootDoesNotBringInItsBindMounts) {
  probe.add("/srv/www", "ext4", 1, "/var/www");
  config.mountExcludes = {"/"};
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, ExclusionOfADataDiskDoesNotBringInTheSystemsMountsOfIt) {
  probe.add("/data", "ext4", 2);
  probe.add("/var/lib/docker", "ext4", 2, "/docker");
  config.mountExcludes = {"/data"};
  EXPECT_THAT(paths(), IsEmpty());
}

TEST_F(Volumes, MountPathOf35BytesFitsAndOf36DoesNot) {
  const std::string fits = "/" + std::string(34, 'x');
  probe.add(fits, "ext4", 2);
  probe.add(fits + "y", "ext4", 3);
  ASSERT_THAT(paths(), ElementsAre(fits, fits + "y"));
  EXPECT_TRUE(table->volumes()[0].fitsRecord());
  EXPECT_FALSE(table->volumes()[1].fitsRecord());
}

TEST_F(Volumes, MountThatFitsTakesThePlaceOfOneThatDoesNot) {
  probe.add("/" + std::string(40, 'x'), "ext4", 2);
  probe.add("/mnt/short", "ext4", 2, "/sub");
  EXPECT_THAT(paths(), ElementsAre("/mnt/short"));
}

TEST_F(Volumes, FirstMountStandsWhereNoneFits) {
  probe.add("/" + std::string(40, 'y'), "ext4", 2, "/sub");
  probe.add("/" + std::string(40, 'x'), "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/" + std::string(40, 'x')));
}

TEST_F(Volumes, NamedDirectoryTakesWhatItsFileSystemTells) {
  name("/srv/data");
  const Volume volume = read().volumes().at(0);
  EXPECT_EQ("/srv/data", volume.mountPath);
  EXPECT_EQ("/srv/data", volume.realPath);
  EXPECT_EQ("/srv/data", volume.root);
  EXPECT_EQ(KOVA_VOL_FS_EXT4, volume.fsType);
  EXPECT_EQ(KOVA_VOL_LOC_INTERNAL, volume.location);
  EXPECT_EQ(std::nullopt, volume.size);
  EXPECT_TRUE(volume.isNamed);
  EXPECT_TRUE(volume.isMounted());
}

TEST_F(Volumes, NamedDirectoryTakesTheRealLocationToo) {
  probe.add("/mnt/stick", "vfat", 2);
  probe.removable = {2};
  name("/mnt/stick/data");
  EXPECT_THAT(paths(), ElementsAre("/mnt/stick", "/mnt/stick/data"));
  EXPECT_EQ(KOVA_VOL_LOC_REMOVABLE, table->volumes()[1].location);
  EXPECT_EQ(KOVA_VOL_FS_VFAT, table->volumes()[1].fsType);
}

TEST_F(Volumes, SettingsOfANamedDirectoryCount) {
  NamedVolume &named = name("/srv/data");
  named.fsType = 3;
  named.size = 77;
  named.removable = true;
  const Volume volume = read().volumes().at(0);
  EXPECT_EQ(3, volume.fsType);
  EXPECT_EQ(77U, volume.size);
  EXPECT_EQ(KOVA_VOL_LOC_REMOVABLE, volume.location);
}

TEST_F(Volumes, NamedDirectoryOnAnotherFileSystemIsOfAnotherKind) {
  probe.add("/run", "tmpfs", 20);
  name("/run/data");
  EXPECT_EQ(KOVA_VOL_FS_OTHER, read().volumes().at(0).fsType);
}

TEST_F(Volumes, NamedDirectoriesFollowTheMountsInTheirOrder) {
  name("/srv/z");
  name("/srv/a");
  probe.add("/mnt/a", "ext4", 2);
  EXPECT_THAT(paths(), ElementsAre("/mnt/a", "/srv/z", "/srv/a"));
}

TEST_F(Volumes, NamedMountPathChangesThatVolumeOnly) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/b", "ext4", 3);
  NamedVolume &named = name("/mnt/a");
  named.size = 5;
  named.removable = true;
  EXPECT_THAT(paths(), ElementsAre("/mnt/a", "/mnt/b"));
  const Volume &volume = table->volumes()[0];
  EXPECT_EQ(5U, volume.size);
  EXPECT_EQ(KOVA_VOL_FS_EXT4, volume.fsType);
  EXPECT_EQ(KOVA_VOL_LOC_REMOVABLE, volume.location);
}

TEST_F(Volumes, SystemMountIsOneWhenNamed) {
  probe.add("/var", "xfs", 2);
  name("/var");
  name("/");
  EXPECT_THAT(paths(), ElementsAre("/var", "/"));
  EXPECT_EQ("/:home/x", place("/home/x"));
  EXPECT_EQ("/var:x", place("/var/x"));
}

TEST_F(Volumes, DirectoryNamedTwiceIsOneAsTheFirst) {
  probe.links["/link"] = "/srv/data";
  name("/srv/data").size = 1;
  name("/link").size = 2;
  EXPECT_THAT(paths(), ElementsAre("/srv/data"));
  EXPECT_EQ(1U, table->volumes()[0].size);
}

TEST_F(Volumes, NamedLinkKeepsItsNameAndHoldsWhatItLeadsTo) {
  probe.links["/vol"] = "/srv/a/very/long/path/that/does/not/fit/any/record";
  name("/vol");
  EXPECT_THAT(paths(), ElementsAre("/vol"));
  EXPECT_TRUE(table->volumes()[0].fitsRecord());
  EXPECT_EQ("/vol:x", place("/srv/a/very/long/path/that/does/not/fit/any/record/x"));
}

TEST_F(Volumes, NamedDirectoryThatIsNotThereIsNotMounted) {
  probe.missing = {"/srv/gone"};
  probe.files = {"/srv/file"};
  name("/srv/gone").removable = true;
  name("/srv/file");
  EXPECT_THAT(paths(), ElementsAre("/srv/gone", "/srv/file"));
  EXPECT_FALSE(table->volumes()[0].isMounted());
  EXPECT_EQ(KOVA_VOL_LOC_REMOVABLE, table->volumes()[0].location);
  EXPECT_FALSE(table->volumes()[1].isMounted());
  EXPECT_EQ(KOVA_VOL_LOC_INTERNAL, table->volumes()[1].location);
  EXPECT_EQ(nullptr, table->findMountPath("/srv/gone"));
}

TEST_F(Volumes, PathIsPlacedOnTheVolumeThatHoldsIt) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/a/inner", "xfs", 3);
  EXPECT_EQ("/mnt/a:", place("/mnt/a"));
  EXPECT_EQ("/mnt/a:x/y", place("/mnt/a/x/y"));
  EXPECT_EQ("/mnt/a/inner:", place("/mnt/a/inner"));
  EXPECT_EQ("/mnt/a/inner:x", place("/mnt/a/inner/x"));
  EXPECT_EQ("/mnt/a:inner2", place("/mnt/a/inner2"));
  EXPECT_EQ("none", place("/mnt/b"));
  EXPECT_EQ("none", place("/"));
}

TEST_F(Volumes, PathOnABindMountIsPlacedByItsFileSystem) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/bind", "ext4", 2, "/share/deep");
  probe.add("/mnt/twin", "ext4", 2);
  EXPECT_EQ("/mnt/a:share/deep/x", place("/mnt/bind/x"));
  EXPECT_EQ("/mnt/a:share/deep", place("/mnt/bind"));
  EXPECT_EQ("/mnt/a:x", place("/mnt/twin/x"));
}

TEST_F(Volumes, PathOnAnotherSubvolumeHasNoPlaceInside) {
  probe.add("/mnt/home", "btrfs", 2, "/@home");
  probe.add("/mnt/data", "btrfs", 2, "/@data");
  EXPECT_EQ("/mnt/home:x", place("/mnt/home/x"));
  EXPECT_EQ("/mnt/home:?", place("/mnt/data/x"));
}

TEST_F(Volumes, PathOnAFileSystemInsideAVolumeIsNotTheVolumes) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/a/ram", "tmpfs", 20);
  EXPECT_EQ("none", place("/mnt/a/ram/x"));
}

TEST_F(Volumes, PathIsPlacedOnTheInnermostNamedDirectory) {
  probe.add("/mnt/a", "ext4", 2);
  name("/mnt/a/data");
  name("/mnt/a/data/inner");
  name("/mnt/a/other/inner"); // the order in which they are named does not matter
  name("/mnt/a/other");
  name("/srv");
  probe.add("/srv/ram", "tmpfs", 20);
  EXPECT_EQ("/mnt/a:x", place("/mnt/a/x"));
  EXPECT_EQ("/mnt/a/data:x", place("/mnt/a/data/x"));
  EXPECT_EQ("/mnt/a/data/inner:", place("/mnt/a/data/inner"));
  EXPECT_EQ("/mnt/a/other/inner:x", place("/mnt/a/other/inner/x"));
  EXPECT_EQ("/mnt/a/other:x", place("/mnt/a/other/x"));
  EXPECT_EQ("/srv:x", place("/srv/x"));
  EXPECT_EQ("none", place("/srv/ram/x"));
  EXPECT_EQ("none", place("/etc"));
}

TEST_F(Volumes, PathIsPlacedOnTheFirstOfVolumesThatShowTheSame) {
  probe.add("/mnt/a", "ext4", 2);
  probe.add("/mnt/twin", "ext4", 2);
  name("/mnt/twin");
  ASSERT_THAT(paths(), ElementsAre("/mnt/a", "/mnt/twin"));
  EXPECT_EQ("/mnt/a:x", place("/mnt/twin/x"));
}

TEST_F(Volumes, BindMountOfANamedDirectoryIsPlacedThere) {
  name("/srv/data");
  probe.add("/mnt/bind", "ext4", 1, "/srv/data/share");
  EXPECT_EQ("/srv/data:share/x", place("/mnt/bind/x"));
}

TEST_F(Volumes, MountThatTheKernelTellsAndTheTableLacksHoldsNothing) {
  probe.add("/mnt/a", "ext4", 2);
  probe.ids["/mnt/a/x"] = 999; // mounted since
  EXPECT_EQ("none", place("/mnt/a/x"));
}

TEST_F(Volumes, MountPathIsFoundWithSlashesAtItsEnd) {
  probe.add("/mnt/a", "ext4", 2);
  name("/");
  read();
  ASSERT_NE(nullptr, table->findMountPath("/mnt/a"));
  EXPECT_EQ("/mnt/a", table->findMountPath("/mnt/a//")->mountPath);
  EXPECT_EQ("/", table->findMountPath("//")->mountPath);
  EXPECT_EQ(nullptr, table->findMountPath("/mnt/a/x"));
  EXPECT_EQ(nullptr, table->findMountPath("/mnt"));
  EXPECT_EQ(nullptr, table->findMountPath(""));
}
