#include "service/command_create.h"

#include "base/retry_on_eintr.h"
#include "service/failed.h"

#include <csignal>
#include <cstddef>
#include <fcntl.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

// Sanitizers keep state per thread that a child in the same memory would spoil.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KOVA_COMMAND_BY_FORK 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer) ||                         \
    __has_feature(memory_sanitizer)
#define KOVA_COMMAND_BY_FORK 1
#endif
#endif
#ifndef KOVA_COMMAND_BY_FORK
#define KOVA_COMMAND_BY_FORK 0
#endif

namespace KOVA::Backup::Service {
namespace {

#if KOVA_COMMAND_BY_FORK

void killAndReap(pid_t pid) {
  const Base::ErrnoGuard guard;
  (void)::kill(pid, SIGKILL);
  (void)Base::retryOnEintr([&] { return ::waitpid(pid, nullptr, 0); });
}

#else

// The child's stack. It grows down, towards a page that cannot be accessed.
class ChildStack {
public:
  ChildStack()
      : memory_(::mmap(nullptr, kSize, PROT_READ | PROT_WRITE,
                       MAP_PRIVATE | MAP_ANONYMOUS | MAP_STACK | MAP_NORESERVE, -1, 0)) {}
  ~ChildStack() {
    if (memory_ != MAP_FAILED) {
      const Base::ErrnoGuard guard;
      (void)::munmap(memory_, kSize);
    }
  }
  ChildStack(const ChildStack &) = delete;
  ChildStack &operator=(const ChildStack &) = delete;

  explicit operator bool() const { return memory_ != MAP_FAILED; }
  bool guarded() const { return ::mprotect(memory_, kGuardSize, PROT_NONE) == 0; }
  void *top() const { return static_cast<std::byte *>(memory_) + kSize; }

private:
  // A multiple of every page size, of which only the pages that are touched take up memory.
  static constexpr std::size_t kGuardSize = 65536;
  static constexpr std::size_t kSize = 3 * kGuardSize;

  void *memory_;
};

int childMain(void *plan) {
  runChild(*static_cast<ChildPlan *>(plan));
  ::_exit(127);
}

#endif

} // namespace

#if KOVA_COMMAND_BY_FORK

// The child waits until its pidfd is open: if the host ignores SIGCHLD, it could otherwise be gone.
// It waits for a byte and not for the end of the pipe, which another thread's child may hold open.
bool createChild(ChildPlan &plan, Child &child, Error &error) {
  int gate[2];
  if (::pipe2(gate, O_CLOEXEC) != 0) {
    return failed(error, "pipe2");
  }
  const Base::UniqueFd waits(gate[0]);
  const Base::UniqueFd opens(gate[1]);
  char byte = 0;
  const pid_t pid = ::fork();
  if (pid < 0) {
    return failed(error, "fork");
  }
  if (pid == 0) {
    (void)::close(opens.get()); // or the child would wait for ever when the parent is killed
    (void)Base::retryOnEintr([&] { return ::read(waits.get(), &byte, 1); });
    runChild(plan);
    ::_exit(127);
  }
  child.pidfd.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  if (!child.pidfd || Base::retryOnEintr([&] { return ::write(opens.get(), &byte, 1); }) != 1) {
    killAndReap(pid);
    return failed(error, child.pidfd ? "write" : "pidfd_open");
  }
  child.pid = pid;
  return true;
}

#else

// The pidfd comes with the child, so it cannot be that of another process, and if there is no
// descriptor left for it, no child is created. valgrind ignores CLONE_VM and CLONE_VFORK.
bool createChild(ChildPlan &plan, Child &child, Error &error) {
  const ChildStack stack;
  if (!stack) {
    return failed(error, "mmap");
  }
  if (!stack.guarded()) {
    return failed(error, "mprotect");
  }
  int pidfd = -1;
  const pid_t pid = ::clone(childMain, stack.top(), CLONE_VM | CLONE_VFORK | CLONE_PIDFD | SIGCHLD,
                            &plan, &pidfd);
  if (pid < 0) {
    return failed(error, "clone");
  }
  child.pid = pid;
  child.pidfd.reset(pidfd);
  return true;
}

#endif

} // namespace KOVA::Backup::Service
