#ifndef KOVABACKUP_TESTS_REAL_MOUNTS_H
#define KOVABACKUP_TESTS_REAL_MOUNTS_H

/// @file Real file systems for one test, mounted below /mnt in the test program's own namespace.
///
///     RealMounts mounts;
///     const std::string why = mounts.disk("ext4", "a", 32);   // /mnt/a, on a loop device
///     if (!why.empty()) GTEST_SKIP() << "skipped: " << why;
///
/// /mnt itself is a tmpfs; /mnt/.images has the images of the disks. The destructor unmounts
/// everything and so releases every loop device.

#include <string>
#include <vector>

namespace KovaTest {

class RealMounts {
public:
  RealMounts();
  ~RealMounts();
  RealMounts(const RealMounts &) = delete;
  RealMounts &operator=(const RealMounts &) = delete;

  /// Each returns "" on success, otherwise the reason why it failed.
  std::string tmpfs(const std::string &name);
  std::string disk(const std::string &kind, const std::string &name, int mebibytes);
  std::string bind(const std::string &fromPath, const std::string &name);
  std::string mount(const std::string &command, const std::string &name);
  enum class Access { ReadOnly, ReadWrite };
  std::string remount(const std::string &name, Access access);

  /// Image file of a disk.
  static std::string image(const std::string &name);
  /// Unmounts the last mount at a name.
  void unmount(const std::string &name);

private:
  std::vector<std::string> paths_;
};

/// Runs a shell command without output. Returns "" when it exits with 0, otherwise what it wrote.
std::string run(const std::string &command);

/// Runs a shell command and stores what it writes in output. Returns its exit status.
int runFor(const std::string &command, std::string &output);

} // namespace KovaTest

#endif
