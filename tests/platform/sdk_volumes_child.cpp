// Asks for the volumes twice, in a process that has never asked before, and reports what it logs.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <cstdarg>
#include <cstdio>

// Exported, so that the platform's libraries find it before libc's.
extern "C" __attribute__((visibility("default"), format(printf, 2, 3))) void
syslog(int priority, const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::printf("%d ", priority);
  std::vprintf(format, args);
  std::printf("\n");
  va_end(args);
}

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
