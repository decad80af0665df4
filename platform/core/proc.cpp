#include "platform/support/failure.h"

#include <unistd.h>

// Nothing needs attention on either side: the stand-in holds no lock while other code runs, and the
// child inherits the error record of the forking thread.
pid_t KLIBCProcFork(void) {
  const pid_t pid = ::fork();
  return pid >= 0 ? pid : KovaPlatform::fail({KLIBC_ERR_FORK, "core/proc.cpp"});
}
