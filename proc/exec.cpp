#include "kovabackup/exec.h"

#include "base/errno_guard.h"
#include "base/unique_fd.h"
#include "common/log.h"
#include "kovaplatform/kovacore.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <type_traits>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "proc/exec";
constexpr int kNone = -1;

// The state of the handler, which may touch lock-free atomics only.
std::atomic<pid_t> execChildPid{kNone};
std::atomic<int> lastForwardedSignal{kNone};
static_assert(std::atomic<pid_t>::is_always_lock_free);
static_assert(std::is_same_v<pid_t, int>);

// Blocks both signals during its lifetime. Otherwise the handler of one could interrupt that of the
// other inside syslog, and wait forever for the lock that the interrupted one holds.
class BothSignalsBlocked {
public:
  BothSignalsBlocked() {
    sigset_t both;
    (void)::sigemptyset(&both);
    (void)::sigaddset(&both, SIGINT);
    (void)::sigaddset(&both, SIGTERM);
    (void)::pthread_sigmask(SIG_BLOCK, &both, &before_);
  }
  ~BothSignalsBlocked() { (void)::pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
  BothSignalsBlocked(const BothSignalsBlocked &) = delete;
  BothSignalsBlocked &operator=(const BothSignalsBlocked &) = delete;

private:
  sigset_t before_{};
};

bool sendOn(pid_t child, int sig) {
  if (child < 1) {
    // The handler is set, but no child runs. To kill(2), -1 would mean every process.
    errno = ESRCH;
    return false;
  }
  return ::kill(child, sig) == 0;
}

void execForwardHandler(int sig) {
  // The interrupted code may have made a call and not read its errno yet.
  const Base::ErrnoGuard guard;
  lastForwardedSignal = sig;
  if (sig != SIGINT && sig != SIGTERM) {
    return;
  }
  const pid_t child = execChildPid;
  if (!sendOn(child, sig)) {
    const BothSignalsBlocked blocked;
    Log::error(kModule, 22, "failed to signal [%u], errno=%m", static_cast<unsigned>(child));
  }
}

// Removes SA_NOCLDWAIT from SIGCHLD, so that the child can be waited for. The functions of
// proc/signal would log failures, for which there are no messages here.
// Returns: whether the flag was set.
bool clearNoChildWait() {
  struct sigaction action = {};
  if (::sigaction(SIGCHLD, nullptr, &action) != 0) {
    return false; // there is no action to write back either
  }
  const bool wasSet = (action.sa_flags & SA_NOCLDWAIT) != 0;
  action.sa_flags &= ~SA_NOCLDWAIT;
  (void)::sigaction(SIGCHLD, &action, nullptr); // a child that cannot be awaited fails the wait
  return wasSet;
}

void setNoChildWait() {
  struct sigaction action = {};
  if (::sigaction(SIGCHLD, nullptr, &action) == 0) {
    action.sa_flags |= SA_NOCLDWAIT;
    (void)::sigaction(SIGCHLD, &action, nullptr); // no message exists for this
  }
}

int waitForExitCode(pid_t child) {
  for (;;) {
    int status = 0;
    const pid_t result = ::waitpid(child, &status, 0);
    if (result > 0) {
      return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    if (result == 0) {
      Log::bare(LOG_ERR, kModule, 94, "BUG: return value of waitpid is not possible to be 0");
      return -1;
    }
    if (result == -1 && errno != EINTR) {
      return -1;
    }
  }
}

} // namespace

UtilExec::UtilExec() : savedIntHandler_(nullptr), savedTermHandler_(nullptr) {}

// The order of the steps determines what a signal does between any two of them: the child's pid is
// known before a handler can need it, and the handlers stay set until wait and callback are over.
int UtilExec::Execv(const char *path, char *const *argv, void (*callback)(int, int)) {
  execChildPid = kNone;
  lastForwardedSignal = kNone;
  const pid_t child = KLIBCProcFork();
  if (child < 0) {
    return -1;
  }
  if (child == 0) {
    // Only these two calls: a lock that another thread of the caller held at the fork stays held
    // forever in the child.
    (void)::execv(path, argv);
    std::abort();
  }
  execChildPid = child;
  SetSigHandler();
  const bool noChildWait = clearNoChildWait();
  const int result = waitForExitCode(child);
  const int forwarded = lastForwardedSignal;
  if (callback != nullptr && forwarded >= 0) {
    callback(forwarded, result);
  }
  if (noChildWait) {
    setNoChildWait();
  }
  RestoreSigHandler();
  execChildPid = kNone; // not earlier: a signal during the callback is still for the child
  return result;
}

void UtilExec::SetSigHandler() {
  savedIntHandler_ = ::signal(SIGINT, execForwardHandler);
  savedTermHandler_ = ::signal(SIGTERM, execForwardHandler);
}

void UtilExec::RestoreSigHandler() {
  (void)::signal(SIGINT, savedIntHandler_);
  (void)::signal(SIGTERM, savedTermHandler_);
  savedIntHandler_ = nullptr;
  savedTermHandler_ = nullptr;
}

bool Process::isAlive(int pid) {
  const Base::ErrnoGuard guard;
  return ::kill(pid, 0) == 0 || errno != ESRCH;
}

int Process::getStatus(int pid) {
  if (pid < 1) {
    return 0;
  }
  char text[4096] = ""; // first the path, then the contents of the file
  (void)std::snprintf(text, sizeof text, "/proc/%d/stat", pid);
  const Base::UniqueFd file(::open(text, O_RDONLY | O_CLOEXEC));
  if (!file) {
    return 0;
  }
  const ssize_t length = ::read(file.get(), text, sizeof text - 1);
  if (length < 0) {
    return 0;
  }
  text[length] = '\0';
  // "<pid> (<name>) <state> ...": the process chooses its name, which may contain parentheses.
  const char *nameEnd = std::strrchr(text, ')');
  if (nameEnd == nullptr || nameEnd + 2 >= text + length) {
    return 0;
  }
  return static_cast<unsigned char>(nameEnd[2]);
}

bool Process::isZombie(int pid) {
  return getStatus(pid) == 'Z';
}

} // namespace KOVA::Backup
