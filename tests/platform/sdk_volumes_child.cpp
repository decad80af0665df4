// Lists and prints the volumes twice, in a process that has never listed them before.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cstdio>

int main() {
  for (int i = 0; i < 2; ++i) {
    KOVAVOLInfo *list = KOVAMountVolAllEnum(0, -1, 0);
    for (const KOVAVOLInfo *volume = list; volume != nullptr; volume = volume->next) {
      std::printf("volume %s\n", volume->mountPath);
    }
    KOVAMountVolInfoFree(list);
  }
  std::printf("locations %d, error 0x%04X\n", KOVAVolumeSupportLocGet(),
              static_cast<unsigned>(KLIBCErrGet()));
}
