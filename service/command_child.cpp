#include "service/command_child.h"

#include "base/retry_on_eintr.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

constexpr int kFirstFree = 3; // the first number that is not a standard descriptor

bool fail(ChildFailure &failure, ChildStep step, int fd = -1) {
  failure = {step, errno, fd};
  return false;
}

// SIGKILL comes only for a parent that ends after prctl(2). An earlier end shows by another parent,
// and 0 is a parent in another PID namespace, which cannot be compared.
bool dieWithParent(const ChildPlan &plan, ChildFailure &failure) {
  if (!plan.diesWithUs) {
    return true;
  }
  if (::prctl(PR_SET_PDEATHSIG, SIGKILL) != 0) {
    return fail(failure, ChildStep::Prctl);
  }
  const pid_t parent = ::getppid();
  if (parent != plan.parent && parent != 0) {
    ::_exit(127);
  }
  return true;
}

// Ignored signals would stay ignored in the program, and handlers could run here once signals are
// unblocked.
bool resetSignals(ChildFailure &failure) {
  struct sigaction action = {};
  action.sa_handler = SIG_DFL;
  for (int sig = 1; sig < NSIG; ++sig) {
    const bool fixed = sig == SIGKILL || sig == SIGSTOP;
    const bool ofLibc = sig > SIGSYS && sig < SIGRTMIN; // libc uses these itself
    if (!fixed && !ofLibc && ::sigaction(sig, &action, nullptr) != 0) {
      return fail(failure, ChildStep::SigAction);
    }
  }
  sigset_t none;
  ::sigemptyset(&none);
  if (::sigprocmask(SIG_SETMASK, &none, nullptr) != 0) {
    return fail(failure, ChildStep::SigMask);
  }
  return true;
}

// Gives a descriptor a number from lowest on, unless it has one.
bool moveUp(int &fd, int lowest, ChildFailure &failure) {
  if (fd >= lowest) {
    return true;
  }
  const int moved = ::fcntl(fd, F_DUPFD_CLOEXEC, lowest);
  if (moved < 0) {
    return fail(failure, ChildStep::Fcntl, fd);
  }
  fd = moved;
  return true;
}

// A descriptor that is its own target only loses its close-on-exec flag.
bool connect(int source, int target, ChildFailure &failure) {
  const bool same = source == target;
  if (same && ::fcntl(source, F_SETFD, 0) != 0) {
    return fail(failure, ChildStep::Fcntl, source);
  }
  if (!same && Base::retryOnEintr([&] { return ::dup2(source, target); }) != target) {
    return fail(failure, ChildStep::Dup2, source);
  }
  return true;
}

// Sources that a target would overwrite are moved out of the way first: numbers may be exchanged,
// and a caller may hand on its own standard descriptors.
bool connectAll(ChildPlan &plan, ChildFailure &failure) {
  const int lowest =
      plan.passedCount == 0 ? kFirstFree : plan.passed[plan.passedCount - 1].target + 1;
  if (!moveUp(plan.report, lowest, failure)) {
    return false;
  }
  for (std::size_t i = 0; i < plan.passedCount; ++i) {
    if (!moveUp(plan.passed[i].source, lowest, failure)) {
      return false;
    }
  }
  for (int target = 0; target < kFirstFree; ++target) {
    if (!connect(plan.standard[static_cast<std::size_t>(target)], target, failure)) {
      return false;
    }
  }
  for (std::size_t i = 0; i < plan.passedCount; ++i) {
    if (!connect(plan.passed[i].source, plan.passed[i].target, failure)) {
      return false;
    }
  }
  return true;
}

bool closeRange(int first, unsigned last) {
  return first > 0 && static_cast<unsigned>(first) > last
             ? true
             : ::syscall(SYS_close_range, static_cast<unsigned>(first), last, 0U) == 0;
}

// Everything between the descriptors that are kept. The pipe's number is above all targets.
bool closeByRanges(const ChildPlan &plan) {
  int first = kFirstFree;
  for (std::size_t i = 0; i < plan.passedCount; ++i) {
    const int kept = plan.passed[i].target;
    if (!closeRange(first, static_cast<unsigned>(kept) - 1)) {
      return false;
    }
    first = kept + 1;
  }
  return closeRange(first, static_cast<unsigned>(plan.report) - 1) &&
         closeRange(plan.report + 1, ~0U);
}

bool isKept(const ChildPlan &plan, int fd) {
  bool kept = fd < kFirstFree || fd == plan.report;
  for (std::size_t i = 0; i < plan.passedCount; ++i) {
    kept = kept || plan.passed[i].target == fd;
  }
  return kept;
}

// The number that a file name says; -1 for "." and "..".
int numberOf(const char *name) {
  int number = 0;
  for (; *name != '\0'; ++name) {
    if (*name < '0' || *name > '9') {
      return -1;
    }
    number = number * 10 + (*name - '0');
  }
  return number;
}

// As the kernel writes them (getdents64(2)); readdir(3) would allocate memory.
struct DirectoryEntry {
  std::uint64_t inode;
  std::int64_t offset;
  std::uint16_t length;
  std::uint8_t type;
  char name[1];
};

void closeEntries(const ChildPlan &plan, int dir, const char *buffer, std::size_t size) {
  for (std::size_t at = 0; at < size;) {
    std::uint16_t length = 0;
    std::memcpy(&length, buffer + at + offsetof(DirectoryEntry, length), sizeof length);
    const int fd = numberOf(buffer + at + offsetof(DirectoryEntry, name));
    if (fd != dir && !isKept(plan, fd)) {
      (void)::close(fd); // -1 of "." and ".." is kept
    }
    at += length;
  }
}

// For kernels before 5.9, and for filters that do not let close_range(2) pass. The kernel goes
// through the descriptors by number, so those that are closed meanwhile do not confuse it.
bool closeByList(const ChildPlan &plan) {
  const int dir = ::open("/proc/self/fd", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (dir < 0) {
    return false;
  }
  alignas(8) char buffer[4096];
  long size = 0;
  do {
    size = ::syscall(SYS_getdents64, dir, buffer, sizeof buffer);
    if (size > 0) {
      closeEntries(plan, dir, buffer, static_cast<std::size_t>(size));
    }
  } while (size > 0);
  const int error = errno;
  (void)::close(dir);
  errno = error;
  return size == 0;
}

bool runSteps(ChildPlan &plan, ChildFailure &failure) {
  if (plan.ownGroup && ::setpgid(0, 0) != 0) {
    return fail(failure, ChildStep::SetPgid);
  }
  if (!dieWithParent(plan, failure) || !resetSignals(failure)) {
    return false;
  }
  (void)!::chdir(
      "/"); // cannot be denied except to a process in a root folder that it may not enter
  if (!connectAll(plan, failure)) {
    return false;
  }
  if (!closeByRanges(plan) && !closeByList(plan)) {
    return fail(failure, ChildStep::Close);
  }
  (void)::execve(plan.program, plan.argv, plan.envp);
  return fail(failure, ChildStep::Execve);
}

} // namespace

void runChild(ChildPlan &plan) noexcept {
  plan.sharesMemory = true;
  ChildFailure failure = {};
  if (!runSteps(plan, failure)) {
    // The pipe is empty and its reader waits, so this neither blocks nor ends the child by SIGPIPE.
    (void)Base::retryOnEintr([&] { return ::write(plan.report, &failure, sizeof failure); });
  }
}

} // namespace KOVA::Backup::Service
