#ifndef KOVABACKUP_TESTS_VOLUME_MOUNT_H
#define KOVABACKUP_TESTS_VOLUME_MOUNT_H

/// @file A volume outside /tmp that does not affect the machine: a tmpfs in the mount namespace of
/// the test program, on a folder that every system has.

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string>
#include <sys/mount.h>

namespace KovaTest {

/// An empty file system at path for its lifetime; failure is set if it cannot be mounted.
class VolumeMount {
public:
  VolumeMount() : path(emptiedFolder()) {
    if (::mount("tmpfs", path.c_str(), "tmpfs", 0, "mode=1777") != 0) {
      failure = "skipped: a tmpfs cannot be mounted on " + path + ": " + std::strerror(errno);
    }
  }
  ~VolumeMount() {
    if (failure.empty()) {
      ::umount2(path.c_str(), MNT_DETACH);
    }
  }
  VolumeMount(const VolumeMount &) = delete;
  VolumeMount &operator=(const VolumeMount &) = delete;

  const std::string path;
  std::string failure;

private:
  // The first of the usual mount points that does not contain the working directory.
  static std::string emptiedFolder() {
    const std::string current = std::filesystem::current_path().string() + "/";
    for (const char *place : {"/mnt", "/media", "/srv"}) {
      if (std::filesystem::is_directory(place) && current.rfind(std::string(place) + "/", 0) != 0) {
        return place;
      }
    }
    return "/opt";
  }
};

} // namespace KovaTest

#endif
