#ifndef KOVABACKUP_TESTS_FAULTS_PROCESS_STATE_H
#define KOVABACKUP_TESTS_FAULTS_PROCESS_STATE_H

/// @file What /proc shows of another process.

#include <set>
#include <string>
#include <sys/types.h>

namespace KovaTest::Faults {

/// The open descriptors, each as "NUMBER -> TARGET".
std::set<std::string> openDescriptors(pid_t pid);

/// Signals that it blocks, ignores and catches, as lines of /proc/PID/status.
std::string signalState(pid_t pid);

/// Its children, zombies included; 0 where the kernel does not list them.
int countChildren(pid_t pid);

} // namespace KovaTest::Faults

#endif
