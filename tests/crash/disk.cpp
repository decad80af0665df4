#include "tests/crash/disk.h"

#include "base/unique_fd.h"

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <linux/loop.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <thread>

namespace KovaTest::Crash {
namespace {

using KOVA::Base::UniqueFd;

// From fs/ext4/ext4.h of the kernel; the headers of Debian 12 lack them.
constexpr unsigned long kShutdown = _IOR('X', 125, __u32); // EXT4_IOC_SHUTDOWN
constexpr __u32 kWithoutFlushingTheLog = 2;                // EXT4_GOING_FLAGS_NOLOGFLUSH

std::string failure(const std::string &what) {
  return what + ": " + std::strerror(errno);
}

// Without this option ext4 itself writes the data of a file that replaces another one, which hides
// a missing fsync.
constexpr const char *kOptions = "noauto_da_alloc";

// A loop device of the image, which is released once the last descriptor and the mount are gone.
UniqueFd attach(const std::string &imagePath, std::string &device) {
  const UniqueFd control(::open("/dev/loop-control", O_RDWR | O_CLOEXEC));
  const UniqueFd image(::open(imagePath.c_str(), O_RDWR | O_CLOEXEC));
  constexpr int kTries = 100; // others may take the free device first
  for (int tries = 0; control && image && tries < kTries; ++tries) {
    const int number = ::ioctl(control.get(), LOOP_CTL_GET_FREE);
    device = "/dev/loop" + std::to_string(number);
    UniqueFd loop(::open(device.c_str(), O_RDWR | O_CLOEXEC));
    struct loop_config configuration = {};
    configuration.fd = static_cast<__u32>(image.get());
    configuration.info.lo_flags = LO_FLAGS_AUTOCLEAR;
    if (number >= 0 && loop && ::ioctl(loop.get(), LOOP_CONFIGURE, &configuration) == 0) {
      return loop;
    }
    if (number < 0 || errno != EBUSY) {
      return UniqueFd();
    }
  }
  return UniqueFd();
}

} // namespace

std::string Disk::make() const {
  const std::string command =
      "PATH=$PATH:/sbin:/usr/sbin; rm -f " + image_ + " && truncate -s " +
      std::to_string(mebibytes_) + "M " + image_ +
      " && mkfs.ext4 -q -F -b 4096 -m 0 -E lazy_itable_init=0,lazy_journal_init=0 " + image_;
  return std::system(command.c_str()) == 0 ? "" : "mkfs.ext4 fails";
}

std::string Disk::mount() const {
  std::string device;
  const UniqueFd loop = attach(image_, device);
  if (!loop) {
    return failure("there is no loop device");
  }
  if (::mount(device.c_str(), mountPoint_.c_str(), "ext4", 0, kOptions) != 0) {
    return failure("mounting the disk");
  }
  return "";
}

std::string Disk::cut() const {
  const UniqueFd folder(::open(mountPoint_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  __u32 flags = kWithoutFlushingTheLog;
  return folder && ::ioctl(folder.get(), kShutdown, &flags) == 0 ? ""
                                                                 : failure("cutting the power");
}

std::string Disk::unmount() const {
  const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (::umount2(mountPoint_.c_str(), 0) != 0) {
    if (errno != EBUSY || std::chrono::steady_clock::now() > limit) {
      return failure("unmounting the disk");
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  return "";
}

} // namespace KovaTest::Crash
