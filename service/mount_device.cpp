#include "service/mount_device.h"

#include "service/file_text.h"
#include "service/words.h"

#include <cstdint>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace KOVA::Backup::Service {
namespace {

// "0:42", in decimal.
bool parseDevice(std::string_view word, dev_t &out) {
  const std::size_t colon = word.find(':');
  unsigned int high = 0;
  unsigned int low = 0;
  if (colon == std::string_view::npos || !parseInteger(word.substr(0, colon), high) ||
      !parseInteger(word.substr(colon + 1), low)) {
    return false;
  }
  out = makedev(high, low);
  return true;
}

} // namespace

// A line reads "68 63 0:42 / /mnt rw,relatime - btrfs /dev/sda1 rw": the mount, its parent, the
// device.
bool findMountDevice(const std::string &path, dev_t &out) {
  struct statx file = {};
  std::string text;
  Error ignored;
  if (::statx(AT_FDCWD, path.c_str(), 0, STATX_MNT_ID, &file) != 0 ||
      (file.stx_mask & STATX_MNT_ID) == 0) {
    return false;
  }
  if (!readFileText("/proc/self/mountinfo", text, ignored)) {
    return false;
  }
  std::string_view rest = text;
  while (!rest.empty()) {
    std::string_view line = takeLine(rest);
    std::uint64_t mount = 0;
    if (parseInteger(takeWord(line), mount) && mount == file.stx_mnt_id) {
      (void)takeWord(line);
      return parseDevice(takeWord(line), out);
    }
  }
  return false;
}

} // namespace KOVA::Backup::Service
