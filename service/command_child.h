#ifndef KOVA_SERVICE_COMMAND_CHILD_H
#define KOVA_SERVICE_COMMAND_CHILD_H

/// @file The child's side of a launch, from its creation to execve(2).
///
/// The child shares the parent's memory, in a stack of its own, while the launching thread sleeps
/// and the parent's other threads run. So the steps may only make system calls and write to the
/// plan. They neither allocate memory nor take locks, log or throw. All signals
/// are blocked until their actions are reset, so that no handler of the parent runs in the child.

#include <array>
#include <csignal>
#include <sys/types.h>

namespace KOVA::Backup::Service {

/// Steps that can fail, in the order of kChildStepNames.
enum class ChildStep { SetPgid, Prctl, SigAction, SigMask, Fcntl, Dup2, Close, Execve };

constexpr std::array<const char *, 8> kChildStepNames = {
    "setpgid", "prctl", "sigaction", "sigprocmask", "fcntl", "dup2", "close_range", "execve"};

/// What a child sends when it cannot run the program.
struct ChildFailure {
  ChildStep step;
  int code; // errno
  int fd;   // of Fcntl and Dup2: the descriptor that was to be handed on
};

/// A descriptor of the caller and its number in the command.
struct PassedFd {
  int source;
  int target;
};

/// All that the child needs, prepared by the parent.
struct ChildPlan {
  const char *program = nullptr;
  char *const *argv = nullptr;
  char *const *envp = nullptr;
  std::array<int, 3> standard{}; // sources of descriptors 0 to 2; never negative
  PassedFd *passed = nullptr;    // in the order of the targets, all above 2
  std::size_t passedCount = 0;
  int report = -1; // the pipe for a ChildFailure, close-on-exec, above 2
  bool ownGroup = false;
  bool diesWithUs = true;
  pid_t parent = -1;
  volatile bool sharesMemory = false; // set by the child, and seen by the parent if it does
};

/// Runs the steps. Returns only if one failed, with the failure sent.
void runChild(ChildPlan &plan) noexcept;

} // namespace KOVA::Backup::Service

#endif
