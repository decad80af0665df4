#include "platform/support/failure.h"

#include <unistd.h>

pid_t KLIBCProcFork(void) {
  const pid_t pid = ::fork();
  return pid >= 0 ? pid : KovaPlatform::fail({KLIBC_ERR_FORK, "core/proc.cpp"});
}
