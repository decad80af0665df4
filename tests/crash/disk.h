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
  explicit Disk(std::string mountPoint) : mountPoint_(std::move(mountPoint)) {}

  /// Makes an empty file system. Each function returns "" on success, otherwise why it failed.
  static std::string make();
  /// A new loop device each time, since the kernel forgets what it remembers of a disk with its
  /// device. After a cut this replays the journal, as after a power cut.
  std::string mount() const;
  /// From now on nothing reaches the disk, neither data nor journal, and all calls fail.
  std::string cut() const;
  /// Waits for the last descriptor to be closed.
  std::string unmount() const;

private:
  const std::string mountPoint_;
};

} // namespace KovaTest::Crash

#endif
