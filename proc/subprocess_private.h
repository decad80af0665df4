#ifndef KOVABACKUP_PROC_SUBPROCESS_PRIVATE_H
#define KOVABACKUP_PROC_SUBPROCESS_PRIVATE_H

/// @file What a SubProcess knows of its command, and the two halves of running it.

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
  int mode = 0; ///< permission bits for fchmod; 0 leaves the file's
};

struct SubProcessPrivate {
  std::vector<std::string> args;
  std::map<std::string, std::string> envs;
  StdRedirect stdOut;
  StdRedirect stdErr;
  bool clearEnv = true; ///< keep PATH only; no operation changes it
};

/// Makes the calling process ready for the command and becomes it.
/// Returns: only on failure, then false; the step that failed is logged.
bool launchInChild(const SubProcessPrivate &command);

/// Waits for our child and passes SIGTERM on to it meanwhile.
/// Returns: the wait status; -1 when SIGTERM's handler could not be set or the wait gave another
///          pid.
int waitForChild(pid_t child);

} // namespace KOVA::Backup

#endif
