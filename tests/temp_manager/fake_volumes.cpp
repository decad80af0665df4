#include "tests/temp_manager/fake_volumes.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cstdlib>
#include <cstring>
#include <gtest/gtest.h>

namespace KovaTest {
namespace {

FakeVolumes *standing = nullptr;

void copyText(char *to, std::size_t bytes, const std::string &text) {
  ASSERT_LT(text.size(), bytes);
  std::memcpy(to, text.c_str(), text.size() + 1);
}

// Only the requested bytes of a record are valid and all others are set, so the library must have
// requested what it reads.
KOVAVOLInfo *makeRecord(const FakeVolume &volume) {
  auto *info = static_cast<KOVAVOLInfo *>(std::malloc(sizeof(KOVAVOLInfo)));
  std::memset(info, 0xa5, sizeof *info);
  info->fsType = volume.fsType;
  info->status = volume.status;
  copyText(info->mountPath, sizeof info->mountPath, volume.mountPath);
  info->size = volume.size;
  info->accessStatus = volume.accessStatus;
  info->next = nullptr;
  return info;
}

} // namespace

FakeVolumes::FakeVolumes() {
  standing = this;
}

FakeVolumes::FakeVolumes(const std::string &dir) : FakeVolumes() {
  volumes = {{"/volume1", 100}};
  tmpPaths["/volume1"] = dir;
}

FakeVolumes::~FakeVolumes() {
  EXPECT_EQ(lists, freed) << "lists of volumes given out and freed";
  standing = nullptr;
  KLIBCErrSetEx(0, nullptr, 0);
}

int freshLocation() {
  static int last = 1000;
  return ++last;
}

} // namespace KovaTest

extern "C" {

int KOVAVolumeSupportLocGet(void) {
  const KovaTest::FakeVolumes &platform = *KovaTest::standing;
  if (platform.locationError != 0) {
    KLIBCErrSetEx(platform.locationError, "sdk/volume.c", 55);
  }
  return platform.supportedLocation;
}

KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags) {
  KovaTest::FakeVolumes &platform = *KovaTest::standing;
  ++platform.enumerations;
  platform.reserved = reserved;
  platform.location = location;
  platform.enumFlags = enumFlags;
  if (platform.enumerationError != 0) {
    KLIBCErrSetEx(platform.enumerationError, "sdk/volume.c", 99);
    return nullptr;
  }
  KOVAVOLInfo *head = nullptr;
  for (auto volume = platform.volumes.rbegin(); volume != platform.volumes.rend(); ++volume) {
    KOVAVOLInfo *info = KovaTest::makeRecord(*volume);
    info->next = head;
    head = info;
  }
  platform.lists += head != nullptr ? 1 : 0;
  return head;
}

void KOVAMountVolInfoFree(KOVAVOLInfo *list) {
  ++KovaTest::standing->freed;
  while (list != nullptr) {
    KOVAVOLInfo *next = list->next;
    std::free(list);
    list = next;
  }
}

// Fills the given part completely and leaves the bytes after it unchanged.
int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info) {
  const auto found = KovaTest::standing->mountOf.find(path);
  if (found == KovaTest::standing->mountOf.end()) {
    KLIBCErrSetEx(0x2a00, "sdk/volume.c", 77);
    return KovaTest::standing->failure;
  }
  static const unsigned char zeros[KOVA_VOL_INFO_FILLED_BYTES] = {};
  if (std::memcmp(info, zeros, sizeof zeros) != 0) {
    ADD_FAILURE() << "the record was not zeroed";
  }
  KovaTest::copyText(info->mountPath, sizeof info->mountPath, found->second);
  return KovaTest::standing->success;
}

int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size) {
  KovaTest::FakeVolumes &platform = *KovaTest::standing;
  platform.tmpPathsAsked.emplace_back(mountPath);
  EXPECT_EQ(4095, size);
  const auto found = platform.tmpPaths.find(mountPath);
  if (found == platform.tmpPaths.end()) {
    KLIBCErrSetEx(0xd, "sdk/share.c", 1234);
    return platform.failure;
  }
  // It must fit without its NUL: the buffer of the caller is zeroed and one byte longer.
  std::memcpy(buf, found->second.data(), found->second.size());
  return platform.success;
}
}
