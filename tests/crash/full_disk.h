#ifndef KOVABACKUP_TESTS_CRASH_FULL_DISK_H
#define KOVABACKUP_TESTS_CRASH_FULL_DISK_H

/// @file A small real file system at /mnt/disk that can be filled, as a volume of the platform with
/// the key file of its secrets.

#include "tests/platform/real_mounts.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace KovaTest {

/// What the file system has none of when it is full.
enum class Lack { Blocks, Inodes };

struct FullDiskKind {
  const char *name; ///< of the test
  const char *fileSystem;
  int mebibytes; ///< 0 for a tmpfs
  Lack lack;
};

inline void PrintTo(const FullDiskKind &kind, std::ostream *out) {
  *out << kind.name;
}

class FullDisk : public testing::TestWithParam<FullDiskKind> {
protected:
  static constexpr const char *kDisk = "/mnt/disk";
  static constexpr const char *kKeys = "/mnt/disk/keys";

  void SetUp() override {
    const FullDiskKind &kind = GetParam();
    const std::string why =
        kind.mebibytes > 0
            ? mounts.disk(kind.fileSystem, "disk", kind.mebibytes)
            : mounts.mount("mount -n -t tmpfs -o size=4m,nr_inodes=64,mode=0755 tmpfs", "disk");
    if (!why.empty()) {
      GTEST_SKIP() << "skipped: " << why;
    }
    writeConfiguration(std::string("[volume disk]\npath=\"") + kDisk +
                       "\"\nfsType=2\n[secret]\nkeyFile=\"" + kKeys + "/secret.key\"\n");
  }

  void TearDown() override {
    std::filesystem::remove(kConfiguration);
    if (before_.empty()) {
      ::unsetenv("KOVA_PLATFORM_CONF");
    } else {
      ::setenv("KOVA_PLATFORM_CONF", before_.c_str(), 1);
    }
  }

  static bool lacksBlocks() { return GetParam().lack == Lack::Blocks; }

  /// Takes everything that is free.
  static void fill() {
    std::filesystem::create_directory(kFiller);
    if (lacksBlocks()) {
      fillBlocks();
    } else {
      fillInodes();
    }
  }

  static void makeRoom() { std::filesystem::remove_all(kFiller); }

  /// The names on the disk, without what mkfs and fill make.
  static std::vector<std::string> names() {
    std::vector<std::string> found;
    for (const std::string &name : namesIn(kDisk)) {
      if (name != "lost+found" && name != "filler") {
        found.push_back(name);
      }
    }
    return found;
  }

  RealMounts mounts;

private:
  static constexpr const char *kConfiguration = "/tmp/full_disk.conf";
  static constexpr const char *kFiller = "/mnt/disk/filler";

  static void writeConfiguration(const std::string &text) {
    writeFile(kConfiguration, text);
    ::chmod(kConfiguration, 0644); // regardless of the umask
    ::setenv("KOVA_PLATFORM_CONF", kConfiguration, 1);
  }

  // The blocks first by extents, then one by one, until not a single one is left.
  static void fillBlocks() {
    const int fd =
        ::open("/mnt/disk/filler/blocks", O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    ASSERT_GE(fd, 0);
    off_t size = 0;
    for (off_t part = off_t(1) << 26; part >= 512; part /= 2) {
      while (::posix_fallocate(fd, size, part) == 0) {
        size += part;
      }
    }
    const std::string block(512, 'x');
    ssize_t wrote = 0;
    do {
      ::fsync(fd); // gives back what was reserved and is not needed
      wrote = ::write(fd, block.data(), block.size());
    } while (wrote > 0);
    EXPECT_EQ(ENOSPC, errno);
    ::close(fd);
  }

  static void fillInodes() {
    for (int number = 0;; ++number) {
      const std::string path = "/mnt/disk/filler/" + std::to_string(number);
      const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
      if (fd < 0) {
        EXPECT_EQ(ENOSPC, errno);
        return;
      }
      ::close(fd);
    }
  }

  static std::string configurationBefore() {
    const char *const value = ::getenv("KOVA_PLATFORM_CONF");
    return value == nullptr ? "" : value;
  }

  const std::string before_ = configurationBefore();
};

inline std::string nameOfDisk(const testing::TestParamInfo<FullDiskKind> &info) {
  return info.param.name;
}

/// The instances of a suite.
inline auto allFullDisks() {
  return testing::Values(FullDiskKind{"Ext4WithoutBlocks", "ext4", 16, Lack::Blocks},
                         FullDiskKind{"Ext4WithoutInodes", "ext4", 16, Lack::Inodes},
                         FullDiskKind{"XfsWithoutBlocks", "xfs", 320, Lack::Blocks},
                         FullDiskKind{"TmpfsWithoutBlocks", "tmpfs", 0, Lack::Blocks},
                         FullDiskKind{"TmpfsWithoutInodes", "tmpfs", 0, Lack::Inodes});
}

} // namespace KovaTest

#endif
