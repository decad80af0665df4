#ifndef KOVABACKUP_TOOLS_PROCESSES_H
#define KOVABACKUP_TOOLS_PROCESSES_H

/// @file Other processes, as /proc shows them.

#include <string>
#include <sys/types.h>

namespace KOVA::Backup::Tool {

/// The name of a process; "" when it has ended.
std::string commandOf(pid_t pid);

} // namespace KOVA::Backup::Tool

#endif
