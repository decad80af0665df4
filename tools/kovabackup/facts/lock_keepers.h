#ifndef KOVABACKUP_TOOLS_LOCK_KEEPERS_H
#define KOVABACKUP_TOOLS_LOCK_KEEPERS_H

/// @file The processes that have a lock although they did not ask for it: those to which a
/// descriptor of the lock file was handed.

#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup::Tool {

struct LockKeeper {
  pid_t pid;
  std::string command;
};

/// Finds the processes that have a lock on that file through an open descriptor, those that took it
/// included, without this one, which may have inherited such a descriptor and ends soon. Looks at
/// every descriptor of every process, which only root can: for other users, processes of others are
/// missing.
std::vector<LockKeeper> lockKeepersOf(const std::string &file);

/// Whether /proc shows the processes of the complete machine. In a container it does not, and the
/// kernel does not list a lock there whose taker is outside or has ended.
bool seesAllProcesses();

} // namespace KOVA::Backup::Tool

#endif
