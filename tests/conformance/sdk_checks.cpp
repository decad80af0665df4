// libkovasdk: volumes and shares, on what volumes this machine has.

#include "tests/conformance/check.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/vfs.h>
#include <unistd.h>

namespace KovaConformance {
namespace {

namespace fs = std::filesystem;

constexpr int kMostVolumes = 10000; // a list that goes on is a ring
constexpr int kPathBytes = 4095;    // the library's buffer for a path
constexpr int kNameBytes = 492;     // and for a share's name
constexpr std::size_t kGuardBytes = 64;
constexpr char kGuard = '\x5A';

struct Volume {
  int fsType;
  std::string mountPath;
  bool writable;
};

std::vector<Volume> volumes() {
  KOVAVOLInfo *list = KOVAMountVolAllEnum(0, KOVAVolumeSupportLocGet(), KOVA_VOL_ENUM_MOUNTED);
  std::vector<Volume> found;
  for (const KOVAVOLInfo *entry = list; entry != nullptr; entry = entry->next) {
    expect(found.size() < kMostVolumes, "the list of volumes does not end");
    const std::size_t length = ::strnlen(entry->mountPath, sizeof entry->mountPath);
    expect(length < sizeof entry->mountPath, "a mount path (byte 52) has no NUL within 36 bytes");
    found.push_back({entry->fsType, std::string(entry->mountPath, length),
                     entry->status != 0 && entry->accessStatus != 0});
  }
  KOVAMountVolInfoFree(list);
  if (found.empty()) {
    skip("this machine has no data volume");
  }
  return found;
}

Volume writableVolume() {
  for (const Volume &volume : volumes()) {
    if (volume.writable) {
      return volume;
    }
  }
  skip("this machine has no writable data volume");
}

bool guardHolds(const char *guard) {
  return std::string(guard, kGuardBytes) == std::string(kGuardBytes, kGuard);
}

// Returns: whether the platform named a folder.
bool shareTmpPath(const std::string &mountPath, std::string &dir) {
  std::string buffer(kPathBytes, '\0');
  buffer.append(kGuardBytes, kGuard);
  const int result = KOVAShareTmpPathGet(mountPath.c_str(), buffer.data(), kPathBytes);
  expect(guardHolds(buffer.data() + kPathBytes), "KOVAShareTmpPathGet wrote past its buffer");
  dir = textIn(buffer);
  return result >= 0;
}

void locationsAgreeWithTheList() {
  expect(KOVAVolumeSupportLocGet() >= 0, "KOVAVolumeSupportLocGet gave a negative mask");
  KOVAMountVolInfoFree(nullptr);
  KOVAMountVolInfoFree(KOVAMountVolAllEnum(0, 0, 0)); // as a filter without a location asks
  (void)volumes();
  expect(KOVAVolumeSupportLocGet() != 0, "there are volumes, but no location");
}

void recordsAreFilled() {
  for (const Volume &volume : volumes()) {
    const std::string at = "the volume at " + inQuotes(volume.mountPath);
    expect(!volume.mountPath.empty() && volume.mountPath[0] == '/', at + " has no absolute path");
    expect(fs::is_directory(volume.mountPath), at + ": no such folder");
  }
  KOVAVOLInfo *list = KOVAMountVolAllEnum(0, KOVAVolumeSupportLocGet(), KOVA_VOL_ENUM_MOUNTED);
  for (const KOVAVOLInfo *entry = list; entry != nullptr; entry = entry->next) {
    expect(entry->size != 0, inQuotes(entry->mountPath) + " has size 0 (byte 88)");
    expect(entry->status != 0, inQuotes(entry->mountPath) + " is listed as mounted with status 0");
  }
  KOVAMountVolInfoFree(list);
  for (const Volume &volume : volumes()) {
    struct statvfs info {};
    if (!volume.writable && ::statvfs(volume.mountPath.c_str(), &info) == 0 &&
        (info.f_flag & ST_RDONLY) == 0) {
      note("the volume at " + inQuotes(volume.mountPath) +
           " is mounted for writing, but byte 104 is 0: it is never chosen");
    }
  }
}

// The codes by which the library chooses: 1 and 2 ext, 3 btrfs.
void typesAreThoseOfTheFileSystems() {
  constexpr std::uint32_t kExtMagic = 0xEF53;
  constexpr std::uint32_t kBtrfsMagic = 0x9123683E;
  for (const Volume &volume : volumes()) {
    struct statfs info {};
    if (::statfs(volume.mountPath.c_str(), &info) != 0) {
      fail("statfs of " + inQuotes(volume.mountPath) + " fails");
    }
    const auto magic = static_cast<std::uint32_t>(info.f_type); // signed on some machines
    const bool ext = volume.fsType == 1 || volume.fsType == 2;
    expect(ext == (magic == kExtMagic), inQuotes(volume.mountPath) + " has type code " +
                                            std::to_string(volume.fsType) +
                                            ", which does not fit its file system");
    expect((volume.fsType == 3) == (magic == kBtrfsMagic),
           inQuotes(volume.mountPath) + " has type code " + std::to_string(volume.fsType) +
               ", which does not fit its file system");
  }
}

void expectOnVolume(const std::string &path, const Volume &volume) {
  struct {
    KOVAVOLInfo info;
    char guard[kGuardBytes];
  } record{};
  std::memset(&record, kGuard, sizeof record);
  std::memset(&record, 0, KOVA_VOL_INFO_FILLED_BYTES);
  expect(KOVAMountVolInfoGet(path.c_str(), &record.info) >= 0,
         "KOVAMountVolInfoGet(" + inQuotes(path) + ") failed");
  expect(record.info.mountPath == volume.mountPath,
         inQuotes(path) + " is said to lie on " + inQuotes(record.info.mountPath));
  const char *end = reinterpret_cast<const char *>(&record) + KOVA_VOL_INFO_FILLED_BYTES;
  expect(guardHolds(end), "KOVAMountVolInfoGet wrote past byte 112");
}

void volumeOfAPath() {
  for (const Volume &volume : volumes()) {
    expectOnVolume(volume.mountPath, volume);
    std::string below; // the one folder that a volume is sure to have
    if (volume.writable && shareTmpPath(volume.mountPath, below)) {
      expectOnVolume(below, volume);
    }
  }
}

void noVolumeOfAPath() {
  KOVAVOLInfo info{};
  expect(KOVAMountVolInfoGet("/no/such/path", &info) < 0,
         "KOVAMountVolInfoGet of a missing path gave no negative result");
  expectErrorRecorded("KOVAMountVolInfoGet of a missing path");
}

void temporaryFolders() {
  const Volume volume = writableVolume();
  std::string dir;
  expect(shareTmpPath(volume.mountPath, dir),
         "KOVAShareTmpPathGet(" + inQuotes(volume.mountPath) + ") failed");
  expect(fs::is_directory(dir), inQuotes(dir) + " is no folder");
  expect(dir.rfind("/tmp", 0) != 0,
         inQuotes(dir) + " begins with /tmp: sessions there would count as local ones");
  expect(::access(dir.c_str(), W_OK) == 0, inQuotes(dir) + " cannot be written by this user");
  struct stat mount {};
  struct stat folder {};
  expect(::stat(volume.mountPath.c_str(), &mount) == 0 && ::stat(dir.c_str(), &folder) == 0 &&
             mount.st_dev == folder.st_dev,
         inQuotes(dir) + " is not on the file system of " + inQuotes(volume.mountPath));
  std::string again;
  expect(shareTmpPath(volume.mountPath, again) && again == dir, "a second call gives another");
}

void noTemporaryFolder() {
  std::string dir;
  expect(!shareTmpPath("/no/such/volume", dir),
         "KOVAShareTmpPathGet of no volume gave no negative result");
  expectErrorRecorded("KOVAShareTmpPathGet of no volume");
}

bool shareOf(const std::string &path, std::string &name, std::string &sharePath) {
  std::string nameBuffer(kNameBytes, '\0');
  std::string pathBuffer(kPathBytes, '\0');
  nameBuffer.append(kGuardBytes, kGuard);
  pathBuffer.append(kGuardBytes, kGuard);
  const int result = KOVAShareNamePathGet(path.c_str(), nameBuffer.data(), kNameBytes,
                                          pathBuffer.data(), kPathBytes);
  expect(guardHolds(nameBuffer.data() + kNameBytes) && guardHolds(pathBuffer.data() + kPathBytes),
         "KOVAShareNamePathGet wrote past a buffer");
  name = textIn(nameBuffer);
  sharePath = textIn(pathBuffer);
  return result >= 0;
}

// Everything in a share is in that share.
void expectShareBelow(const std::string &sharePath, const std::string &name) {
  std::error_code ignored;
  std::vector<std::string> paths = {sharePath};
  for (const fs::directory_entry &entry : fs::directory_iterator(sharePath, ignored)) {
    if (entry.is_directory(ignored) && !entry.is_symlink(ignored)) {
      paths.push_back(entry.path().string());
    }
  }
  for (const std::string &path : paths) {
    std::string found;
    std::string foundPath;
    expect(shareOf(path, found, foundPath) && found == name && foundPath == sharePath,
           inQuotes(path) + " lies in the share " + inQuotes(name) + ", but " + inQuotes(found) +
               " is named");
  }
}

void sharesOfPaths() {
  for (const Volume &volume : volumes()) {
    std::error_code ignored;
    for (const fs::directory_entry &entry : fs::directory_iterator(volume.mountPath, ignored)) {
      std::string name;
      std::string sharePath;
      if (!entry.is_directory(ignored) || !shareOf(entry.path().string(), name, sharePath)) {
        continue;
      }
      expect(!name.empty(), "the share of " + inQuotes(entry.path().string()) + " has no name");
      expect(fs::is_directory(sharePath), "its path " + inQuotes(sharePath) + " is no folder");
      expectShareBelow(sharePath, name);
      return;
    }
  }
  skip("no folder on a volume of this machine is a share");
}

void noShareOfAPath() {
  std::string name;
  std::string sharePath;
  expect(!shareOf("/", name, sharePath), "KOVAShareNamePathGet(\"/\") gave no negative result");
  expectErrorRecorded("KOVAShareNamePathGet(\"/\")");
}

} // namespace

std::vector<Check> sdkChecks() {
  return {
      {"sdk.volume.locations", "there is a location where there are volumes",
       locationsAgreeWithTheList},
      {"sdk.volume.records",
       "listed volumes have path, size and status where the library reads them", recordsAreFilled},
      {"sdk.volume.types", "type codes 1 and 2 are ext, 3 is btrfs, no other file system has them",
       typesAreThoseOfTheFileSystems},
      {"sdk.volume.of-path", "the volume of a path is found, in 112 bytes, also of one below it",
       volumeOfAPath},
      {"sdk.volume.of-no-path", "a missing path is on no volume", noVolumeOfAPath},
      {"sdk.tmp.folder", "a volume has one writable temporary folder on its own file system",
       temporaryFolders},
      {"sdk.tmp.no-volume", "what is no volume has no temporary folder", noTemporaryFolder},
      {"sdk.share.of-path", "the share of a path has a name, which is that of all below it",
       sharesOfPaths},
      {"sdk.share.of-no-path", "the root of the system lies in no share", noShareOfAPath},
  };
}

} // namespace KovaConformance
