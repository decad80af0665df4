#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cstdlib>

namespace {

// Every service that asks for the mount table fails with this code while there is no reader for it.
constexpr int kCodeUnsupported = 0x3001;

int unsupported(int line) {
  KLIBCErrSetEx(kCodeUnsupported, "sdk/volumes.cpp", line);
  return -1;
}

} // namespace

int KOVAVolumeSupportLocGet(void) {
  unsupported(__LINE__);
  return 0;
}

KOVAVOLInfo *KOVAMountVolAllEnum(int /*reserved*/, int /*location*/, int /*enumFlags*/) {
  unsupported(__LINE__);
  return nullptr;
}

int KOVAMountVolInfoGet(const char * /*path*/, KOVAVOLInfo * /*info*/) {
  return unsupported(__LINE__);
}

void KOVAMountVolInfoFree(KOVAVOLInfo *list) {
  while (list != nullptr) {
    KOVAVOLInfo *const next = list->next;
    std::free(list);
    list = next;
  }
}

int KOVAShareTmpPathGet(const char * /*mountPath*/, char * /*buf*/, int /*size*/) {
  return unsupported(__LINE__);
}

int KOVAShareNamePathGet(const char * /*path*/, char * /*name*/, int /*nameSize*/,
                         char * /*sharePath*/, int /*sharePathSize*/) {
  return unsupported(__LINE__);
}
