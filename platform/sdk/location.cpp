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

// Disks made of disks: an encrypted volume on an array on partitions is three deep.
constexpr int kMaxStackDepth = 8;

bool isUsbController(const std::string &name) {
  return name.size() > 3 && name.compare(0, 3, "usb") == 0 &&
         std::all_of(name.begin() + 3, name.end(),
                     [](unsigned char digit) { return std::isdigit(digit) != 0; });
}

bool hasRemovableMedia(const fs::path &disk) {
  std::ifstream flag(disk / "removable");
  return flag.get() == '1';
}

// Devices reached over USB are hot-plugged although most say that their media stay in.
bool isOnUsb(const fs::path &disk) {
  return std::any_of(disk.begin(), disk.end(),
                     [](const fs::path &part) { return isUsbController(part.string()); });
}

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
  if (depth == kMaxStackDepth) {
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
