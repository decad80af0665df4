#ifndef KOVABACKUP_TOOLS_PROCESSES_H
#define KOVABACKUP_TOOLS_PROCESSES_H

/// @file Other processes, as /proc shows them. An ordinary user sees only the names of other users'
/// processes, not what they have open.

#include <string>
#include <sys/types.h>
#include <vector>

namespace KOVA::Backup::Tool {

struct Process {
  pid_t pid;
  std::string command;
};

/// The name of a process; "" when it has ended.
std::string commandOf(pid_t pid);

/// What all processes have open or use as a working or root directory. The constructor looks once;
/// to ask about many directories costs no further walk through /proc.
class OpenPaths {
public:
  OpenPaths();

  /// The processes, other than this one, that use a directory or anything below it.
  std::vector<Process> usersOf(const std::string &folder) const;

private:
  struct Use {
    std::string path;
    pid_t pid;
  };

  void look(pid_t pid);
  void add(pid_t pid, const std::string &link);

  std::vector<Use> uses_;
};

} // namespace KOVA::Backup::Tool

#endif
