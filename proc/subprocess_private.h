#ifndef KOVABACKUP_PROC_SUBPROCESS_PRIVATE_H
#define KOVABACKUP_PROC_SUBPROCESS_PRIVATE_H

/// @file The description of a command, and the two halves of running it: child and parent.

#include <map>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup {

/// Where one standard stream goes: to a descriptor (fd >= 0), else to a file (path not empty), else
/// to /dev/null.
struct StdRedirect {
  int fd = -1;
  std::string path;
  int mode = 0; ///< permission bits for fchmod; 0 leaves the file's mode
};

struct SubProcessPrivate {
  std::vector<std::string> args;
  std::map<std::string, std::string> envs;
  StdRedirect stdOut;
  StdRedirect stdErr;
  bool clearEnv = true; ///< keep PATH only; no operation changes it
};

/// Prepares the calling process for the command and replaces it by the command.
/// Returns: only on failure, and then false; the step that failed is logged.
bool launchInChild(const SubProcessPrivate &command);

/// Waits for a child of this process, and passes on to it each SIGTERM that arrives meanwhile.
/// Returns: the wait status; -1 when the handler of SIGTERM could not be set, or when waitpid(2)
///          returned another pid.
int waitForChild(pid_t child);

} // namespace KOVA::Backup

#endif
