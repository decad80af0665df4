#ifndef KOVABACKUP_TOOLS_PROCESSES_H
#define KOVABACKUP_TOOLS_PROCESSES_H

/// @file Other processes, as /proc shows them. Of another user's processes an ordinary user sees no
/// more than the names.

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

/// What the processes of this moment have open or work in. Looks once, when it is made.
class OpenPaths {
public:
  OpenPaths();

  /// The processes, other than this one, that use a folder or what lies below it.
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
