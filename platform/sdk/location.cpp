#include "platform/sdk/location.h"

#include "kovaplatform/kovasdk.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <sys/sysmacros.h>
#include <system_error>

namespace KovaPlatform {
namespace {

namespace fs = std::filesystem;

// Disks made of disks: an encrypted volume on an array on partitions is three levels deep.
constexpr int kMaxStackDepth = 8;

// Root hubs are called usb1, usb2 and so on, whatever the controller.
bool isUsbController(const std::string &name) {
  return name.size() > 3 && name.compare(0, 3, "usb") == 0 &&
         std::all_of(name.begin() + 3, name.end(),
                     [](unsigned char digit) { return std::isdigit(digit) != 0; });
}

// Says that the medium can be taken out of the drive, as in a card reader, not that the drive can
// be unplugged.
bool hasRemovableMedia(const fs::path &disk) {
  std::ifstream flag(disk / "removable");
  return flag.get() == '1';
}

// Disks on USB can be unplugged although most of them report fixed media. The path of a device
// below /sys/devices has every bus on the way to it, so the root hub is one of its components.
bool isOnUsb(const fs::path &disk) {
  return std::any_of(disk.begin(), disk.end(),
                     [](const fs::path &part) { return isUsbController(part.string()); });
}

// One removable disk makes everything above it removable. The entries below dev/block and slaves
// are links, which lead to the path below /sys/devices. The flag and the slaves are those of a
// disk; the disk of a partition is the directory above it.
bool isRemovable(const fs::path &entry, int depth) {
  std::error_code error;
  const fs::path device = fs::canonical(entry, error);
  if (error) {
    return false;
  }
  const fs::path disk = fs::exists(device / "partition", error) ? device.parent_path() : device;
  if (isOnUsb(disk) || hasRemovableMedia(disk)) {
    return true;
  }
  if (depth == kMaxStackDepth) { // the kernel builds no loops, but a faulty sysfs must not hang us
    return false;
  }
  fs::directory_iterator slave(disk / "slaves", error);
  for (; !error && slave != fs::directory_iterator(); slave.increment(error)) {
    if (isRemovable(slave->path(), depth + 1)) {
      return true;
    }
  }
  return false;
}

} // namespace

std::int32_t locationOf(const std::string &sysfs, dev_t device) {
  const std::string number =
      std::to_string(::major(device)) + ":" + std::to_string(::minor(device));
  const fs::path entry = fs::path(sysfs) / "dev" / "block" / number;
  return isRemovable(entry, 0) ? KOVA_VOL_LOC_REMOVABLE : KOVA_VOL_LOC_INTERNAL;
}

} // namespace KovaPlatform
