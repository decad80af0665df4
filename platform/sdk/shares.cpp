#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"
#include "kovaplatform/kovasdk.h"
#include "platform/sdk/file_system.h"
#include "platform/sdk/volumes.h"
#include "platform/support/failure.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>

namespace KovaPlatform {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::UniqueFd;

constexpr const char *kFile = "sdk/shares.cpp";
constexpr const char *kTmpName = ".kova_tmp";
constexpr mode_t kTmpMode = 01777; // for all users, each of whom removes only what is theirs

bool fits(const std::string &text, int size) {
  return size > 0 && text.size() < static_cast<std::size_t>(size);
}

void write(const std::string &text, char *buf) {
  std::memcpy(buf, text.c_str(), text.size() + 1);
}

// The volume may have been unmounted since the table was read. What its path then leads to is a
// directory on the system's disk, which must not be filled.
bool isStillMounted(const UniqueFd &mount, const Volume &volume) {
  const std::optional<PathFacts> facts = factsOf(mount.get());
  return facts &&
         (!facts->mountId || *facts->mountId == static_cast<std::uint64_t>(volume.mountId));
}

// All steps go through descriptors, so that each of them sees the same directory. The root of a
// volume may be writable by other users: O_NOFOLLOW refuses a link that was planted under the name,
// O_DIRECTORY anything else. EEXIST is the usual case.
//
// The mode is set separately, because the umask takes bits from the mode that mkdirat is given, and
// only where it differs, because only the owner may change it. A file system that keeps no modes
// refuses, or ignores, the change; its mount options decide.
bool makeTmpDirectory(const Volume &volume) {
  const UniqueFd mount(retryOnEintr(
      [&] { return ::open(volume.realPath.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC); }));
  if (!mount || !isStillMounted(mount, volume)) {
    return false;
  }
  if (::mkdirat(mount.get(), kTmpName, kTmpMode) != 0 && errno != EEXIST) {
    return false;
  }
  const UniqueFd tmp(retryOnEintr([&] {
    return ::openat(mount.get(), kTmpName, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  }));
  struct stat status {};
  if (!tmp || ::fstat(tmp.get(), &status) != 0) {
    return false;
  }
  return (status.st_mode & 07777) == kTmpMode || ::fchmod(tmp.get(), kTmpMode) == 0 ||
         !keepsModes(volume.fsType);
}

// The directory is made last, so that a buffer that is too small leaves nothing behind.
int tmpPath(const char *mountPath, char *buf, int size) {
  if (mountPath == nullptr || *mountPath == '\0' || buf == nullptr) {
    return fail({KOVA_SDK_ERR_ARGUMENT, kFile});
  }
  const SystemProbe probe;
  const std::optional<VolumeTable> table = currentVolumes(probe);
  if (!table) {
    return -1;
  }
  const Volume *volume = table->findMountPath(mountPath);
  if (volume == nullptr) {
    return fail({KOVA_SDK_ERR_NO_VOLUME, kFile});
  }
  const std::string path = joined(volume->mountPath, kTmpName);
  if (!fits(path, size)) {
    return fail({KOVA_SDK_ERR_TOO_SMALL, kFile});
  }
  if (!makeTmpDirectory(*volume)) {
    return fail({KOVA_SDK_ERR_TMP_DIR, kFile});
  }
  write(path, buf);
  return 0;
}

// A link is not a share: it could lead out of the volume.
bool isDirectory(const std::string &path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

// Names that begin with '@' or '.' are the system's own directories beside the shares.
int shareOf(const PathOnVolume &found, char *name, int nameSize, char *sharePath,
            int sharePathSize) {
  if (found.volume == nullptr) {
    return fail({KOVA_SDK_ERR_NO_VOLUME, kFile});
  }
  const std::string inside = found.inside.value_or("");
  const std::string share = inside.substr(0, inside.find('/'));
  if (share.empty() || share.front() == '.' || share.front() == '@') {
    return fail({KOVA_SDK_ERR_NO_SHARE, kFile});
  }
  const std::string path = joined(found.volume->mountPath, share);
  if (!isDirectory(path)) {
    return fail({KOVA_SDK_ERR_NO_SHARE, kFile});
  }
  if (!fits(share, nameSize) || !fits(path, sharePathSize)) {
    return fail({KOVA_SDK_ERR_TOO_SMALL, kFile});
  }
  write(share, name);
  write(path, sharePath);
  return 0;
}

} // namespace
} // namespace KovaPlatform

using namespace KovaPlatform;

int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size) {
  return guarded({KOVA_SDK_ERR_NO_MEMORY, kFile}, -1,
                 [&] { return tmpPath(mountPath, buf, size); });
}

int KOVAShareNamePathGet(const char *path, char *name, int nameSize, char *sharePath,
                         int sharePathSize) {
  return guarded({KOVA_SDK_ERR_NO_MEMORY, kFile}, -1, [&] {
    if (path == nullptr || name == nullptr || sharePath == nullptr) {
      return fail({KOVA_SDK_ERR_ARGUMENT, kFile});
    }
    const std::optional<LocatedPath> located =
        locatePath(path, SystemProbe(), {KOVA_SDK_ERR_PATH, kFile});
    return located ? shareOf(located->position, name, nameSize, sharePath, sharePathSize) : -1;
  });
}
