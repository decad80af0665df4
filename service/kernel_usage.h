#ifndef KOVABACKUP_SERVICE_KERNEL_USAGE_H
#define KOVABACKUP_SERVICE_KERNEL_USAGE_H

/// @file What the system call waitid(2) reports of the resources that a process used. libc has no
/// function that passes it on.

#include <asm/posix_types.h>
#include <sys/resource.h>

namespace KOVA::Backup::Service {

struct KernelTime {
  __kernel_long_t seconds;
  __kernel_long_t microseconds;
};

/// The kernel's struct rusage. On 32-bit machines libc's is longer, since its times have 64 bits.
struct KernelUsage {
  KernelTime userTime;
  KernelTime systemTime;
  __kernel_long_t maxResident;
  __kernel_long_t sharedText;
  __kernel_long_t unsharedData;
  __kernel_long_t unsharedStack;
  __kernel_long_t minorFaults;
  __kernel_long_t majorFaults;
  __kernel_long_t swaps;
  __kernel_long_t blocksIn;
  __kernel_long_t blocksOut;
  __kernel_long_t messagesSent;
  __kernel_long_t messagesReceived;
  __kernel_long_t signals;
  __kernel_long_t voluntarySwitches;
  __kernel_long_t involuntarySwitches;
};

inline struct rusage usageOf(const KernelUsage &kernel) {
  struct rusage usage = {};
  usage.ru_utime.tv_sec = kernel.userTime.seconds;
  usage.ru_utime.tv_usec = kernel.userTime.microseconds;
  usage.ru_stime.tv_sec = kernel.systemTime.seconds;
  usage.ru_stime.tv_usec = kernel.systemTime.microseconds;
  usage.ru_maxrss = kernel.maxResident;
  usage.ru_ixrss = kernel.sharedText;
  usage.ru_idrss = kernel.unsharedData;
  usage.ru_isrss = kernel.unsharedStack;
  usage.ru_minflt = kernel.minorFaults;
  usage.ru_majflt = kernel.majorFaults;
  usage.ru_nswap = kernel.swaps;
  usage.ru_inblock = kernel.blocksIn;
  usage.ru_oublock = kernel.blocksOut;
  usage.ru_msgsnd = kernel.messagesSent;
  usage.ru_msgrcv = kernel.messagesReceived;
  usage.ru_nsignals = kernel.signals;
  usage.ru_nvcsw = kernel.voluntarySwitches;
  usage.ru_nivcsw = kernel.involuntarySwitches;
  return usage;
}

} // namespace KOVA::Backup::Service

#endif
