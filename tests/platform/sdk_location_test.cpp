// An invented sysfs: devices are folders, and the links in dev/block lead to them.

#include "platform/sdk/location.h"

#include "kovaplatform/kovasdk.h"

#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <string>
#include <sys/sysmacros.h>

using namespace KovaPlatform;
namespace fs = std::filesystem;

namespace {

class Location : public testing::Test {
protected:
  void TearDown() override { fs::remove_all(sysfs); }

  fs::path device(const std::string &path, const std::string &number,
                  const std::string &removable) {
    fs::path folder = sysfs / "devices" / path;
    fs::create_directories(folder);
    fs::create_directories(sysfs / "dev/block");
    fs::create_symlink(folder, sysfs / "dev/block" / number);
    if (!removable.empty()) {
      std::ofstream(folder / "removable") << removable;
    }
    return folder;
  }

  fs::path partition(const fs::path &disk, const std::string &name, const std::string &number) {
    fs::path folder = disk / name;
    fs::create_directories(folder);
    std::ofstream(folder / "partition") << "1\n";
    fs::create_symlink(folder, sysfs / "dev/block" / number);
    return folder;
  }

  static void stack(const fs::path &upper, const fs::path &lower) {
    fs::create_directories(upper / "slaves");
    fs::create_symlink(lower, upper / "slaves" / lower.filename());
  }

  int of(unsigned major, unsigned minor) const {
    return locationOf(sysfs.string(), makedev(major, minor));
  }

  const fs::path sysfs = "/tmp/sys";
};

constexpr int kInternal = KOVA_VOL_LOC_INTERNAL;
constexpr int kRemovable = KOVA_VOL_LOC_REMOVABLE;

} // namespace

TEST_F(Location, DiskWithFixedMediaIsInternal) {
  device("pci0000:00/0000:00:1f.2/ata1/host0/block/sda", "8:0", "0\n");
  EXPECT_EQ(kInternal, of(8, 0));
}

TEST_F(Location, DiskWithRemovableMediaIsRemovable) {
  device("pci0000:00/0000:00:1f.2/ata2/host1/block/sr0", "11:0", "1\n");
  EXPECT_EQ(kRemovable, of(11, 0));
}

TEST_F(Location, PartitionIsWhatItsDiskIs) {
  partition(device("pci0/block/sda", "8:0", "1\n"), "sda1", "8:1");
  partition(device("pci0/block/sdb", "8:16", "0\n"), "sdb1", "8:17");
  EXPECT_EQ(kRemovable, of(8, 1));
  EXPECT_EQ(kInternal, of(8, 17));
}

TEST_F(Location, DiskOnUsbIsRemovableWhateverItSaysOfItsMedia) {
  const fs::path disk =
      device("pci0/usb2/2-1/2-1:1.0/host6/target6:0:0/6:0:0:0/block/sdc", "8:32", "0\n");
  partition(disk, "sdc1", "8:33");
  EXPECT_EQ(kRemovable, of(8, 32));
  EXPECT_EQ(kRemovable, of(8, 33));
}

TEST_F(Location, OnlyAUsbControllerInThePathCounts) {
  device("pci0/usbstor/block/sdd", "8:48", "0\n");
  device("pci0/usb/block/sde", "8:64", "0\n");
  device("pci0/nousb1/block/sdf", "8:80", "0\n");
  EXPECT_EQ(kInternal, of(8, 48));
  EXPECT_EQ(kInternal, of(8, 64));
  EXPECT_EQ(kInternal, of(8, 80));
}

TEST_F(Location, StackIsRemovableWhenADiskUnderItIs) {
  const fs::path inside = device("pci0/block/sda", "8:0", "0\n");
  const fs::path outside = device("pci0/usb1/1-1/block/sdb", "8:16", "0\n");
  const fs::path array = device("virtual/block/md0", "9:0", "0\n");
  stack(array, inside);
  stack(array, partition(outside, "sdb1", "8:17"));
  const fs::path crypt = device("virtual/block/dm-0", "253:0", "0\n");
  stack(crypt, array);
  const fs::path safe = device("virtual/block/dm-1", "253:1", "0\n");
  stack(safe, inside);
  EXPECT_EQ(kRemovable, of(9, 0));
  EXPECT_EQ(kRemovable, of(253, 0));
  EXPECT_EQ(kInternal, of(253, 1));
}

TEST_F(Location, StackIsLookedAtDownToItsEighthLevel) {
  fs::path lower = device("pci0/usb1/1-1/block/sdb", "8:16", "0\n");
  for (unsigned level = 1; level <= 9; ++level) {
    const std::string number = std::to_string(level);
    const fs::path upper = device("virtual/block/dm-" + number, "253:" + number, "0\n");
    stack(upper, lower);
    lower = upper;
  }
  EXPECT_EQ(kRemovable, of(253, 8));
  EXPECT_EQ(kInternal, of(253, 9));
}

TEST_F(Location, StackThatLeadsBackToItselfEnds) {
  const fs::path device0 = device("virtual/block/dm-0", "253:0", "0\n");
  const fs::path device1 = device("virtual/block/dm-1", "253:1", "0\n");
  for (const fs::path &upper : {device0, device1}) { // two paths at each step, without end
    stack(upper, device0);
    stack(upper, device1);
  }
  EXPECT_EQ(kInternal, of(253, 0));
}

TEST_F(Location, UnknownDeviceIsInternal) {
  EXPECT_EQ(kInternal, of(8, 0)); // no sysfs at all
  fs::create_directories(sysfs / "dev/block");
  EXPECT_EQ(kInternal, of(8, 0));
  fs::create_symlink("/tmp/sys/devices/gone", sysfs / "dev/block/8:16");
  EXPECT_EQ(kInternal, of(8, 16));
}

TEST_F(Location, DiskThatSaysNothingIsInternal) {
  device("pci0/block/sda", "8:0", "");
  EXPECT_EQ(kInternal, of(8, 0));
}
