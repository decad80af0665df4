#ifndef KOVABACKUP_TESTS_CRASH_DISK_H
#define KOVABACKUP_TESTS_CRASH_DISK_H

/// @file An ext4 file system on a loop device whose power can be cut.
///
/// The image is in the private /tmp, and the mount and the loop device end with the mount
/// namespace, so nothing of it stays on the machine.

#include <string>

namespace KovaTest::Crash {

class Disk {
public:
  /// The mount point is a folder that exists; the image is a file that make replaces.
  Disk(std::string mountPoint, std::string image, int mebibytes = 64)
      : mountPoint_(std::move(mountPoint)), image_(std::move(image)), mebibytes_(mebibytes) {}

  const std::string &mountPoint() const { return mountPoint_; }

  /// Makes an empty file system. Each function returns "" on success, otherwise why it failed.
  std::string make() const;
  /// A new loop device each time, since the kernel forgets what it remembers of a disk with its
  /// device. After a cut this replays the journal, as after a power cut.
  std::string mount() const;
  /// From now on nothing reaches the disk, neither data nor journal, and all calls fail.
  std::string cut() const;
  /// Waits for the last descriptor to be closed.
  std::string unmount() const;

private:
  const std::string mountPoint_;
  const std::string image_;
  const int mebibytes_;
};

} // namespace KovaTest::Crash

#endif
