// Waiting for a child and passing SIGTERM on to it.
//
// waitpid(2) returns with EINTR when a SIGTERM arrives while it sleeps; the loop then sends the
// signal on. One that arrives a moment earlier, after the handler is set and before waitpid sleeps,
// runs the handler and leaves waitpid to sleep: the child would get it only when some other signal
// comes, if ever. waitpid takes no mask, so that moment cannot be shut out. Instead each signal is
// sent on by whoever can, once:
//
//     lastTerm     set by                                       sent on by
//     None         the loop, when it has dealt with a signal
//     Arrived      the handler                                  the loop, before or after waitpid
//     PassedOn     the handler, while awaited is set, that      the handler; when waitpid returns
//                  is in waitpid or on the way there            EINTR the loop does not repeat it
//
// awaited is set before lastTerm is looked at, and the handler looks at awaited after it has set
// lastTerm: one of the two always sees the other, also when another thread runs the handler.
//
// What callers and children see stays what it would be if the loop alone sent: the caller's handler
// runs first, then kill, sleep and the next wait follow, and every further interruption by whatever
// signal sends again. Only the signal of that one moment is no longer lost.
//
// Which handler the caller had is known a moment after ours is set. A SIGTERM in between is owed to
// that handler, which runs as soon as it is known, still before the signal is sent on.
//
// Dropped: SIGTERM blocked outside a ppoll(2) on a pidfd (changes the mask that the caller's other
// handlers see, and loses signals that another thread takes), a jump out of the handler (loses the
// status of a child just reaped), and letting handler and loop both send (the child sees two).

#include "base/errno_guard.h"
#include "common/log.h"
#include "proc/subprocess_private.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <sys/wait.h>
#include <ucontext.h>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "proc/subprocess";

using Handler = void (*)(int);
using InfoHandler = void (*)(int, siginfo_t *, void *);

enum class Term { None, Arrived, PassedOn };

// One wait at a time: all of this is the process's. Only atomics without locks, for the handler.
std::atomic<bool> termReceived{false};
std::atomic<Handler> chainedTermHandler{nullptr};
std::atomic<InfoHandler> chainedInfoHandler{nullptr}; // instead, when it was set with SA_SIGINFO
std::atomic<bool> chainIsKnown{false};
std::atomic<bool> owedToChain{false};
std::atomic<Term> lastTerm{Term::None};
std::atomic<pid_t> awaited{0};
static_assert(std::atomic<bool>::is_always_lock_free && std::atomic<Handler>::is_always_lock_free &&
              std::atomic<Term>::is_always_lock_free);

void runChainedHandler(int sig) {
  if (const Handler handler = chainedTermHandler) {
    handler(sig);
  }
  if (const InfoHandler handler = chainedInfoHandler) {
    // Our own handler takes no siginfo; what it was not told is zero, never a stray pointer.
    siginfo_t info = {};
    info.si_signo = sig;
    ucontext_t context = {};
    handler(sig, &info, &context);
  }
}

// Both sides call it after they have set their flag, so one of them finds both set, also when the
// signal's handler runs in another thread.
void runOwedHandler(int sig) {
  if (chainIsKnown && owedToChain.exchange(false)) {
    runChainedHandler(sig);
  }
}

// Ours, and not reaped yet: a signal to a service often reaches parent and child at once, and the
// pid of a child that waitpid has just collected, or the kernel because the host ignores SIGCHLD,
// may soon be a stranger's.
bool isUnreaped(pid_t child) {
  siginfo_t info = {};
  return ::waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOHANG | WNOWAIT) == 0;
}

void passOnFromHandler() {
  const pid_t child = awaited;
  Term arrived = Term::Arrived;
  if (child > 0 && isUnreaped(child) && lastTerm.compare_exchange_strong(arrived, Term::PassedOn)) {
    (void)::kill(child, SIGTERM);
  }
}

void forwardTermHandler(int sig) {
  const Base::ErrnoGuard
      guard; // the signal may have come between a call and the reading of its errno
  if (sig == SIGTERM) {
    termReceived = true;
    lastTerm = Term::Arrived;
  }
  if (chainIsKnown) {
    runChainedHandler(sig);
  } else {
    owedToChain = true;
    runOwedHandler(sig);
  }
  if (sig == SIGTERM) {
    passOnFromHandler();
  }
}

void rememberHandler(const struct sigaction &previous) {
  if ((previous.sa_flags & SA_SIGINFO) != 0) {
    chainedInfoHandler = previous.sa_sigaction;
  } else if (previous.sa_handler != SIG_IGN) { // SIG_DFL is null
    chainedTermHandler = previous.sa_handler;
  }
  chainIsKnown = true;
  runOwedHandler(SIGTERM);
}

void passOn(pid_t child) {
  (void)::kill(child, SIGTERM); // a child that is gone will be collected next
  (void)::sleep(0);
}

// Returns: what waitpid returned, never -1; the status is 0 unless the child was collected.
pid_t collect(pid_t child, int &status) {
  for (;;) {
    awaited = child;
    Term arrived = Term::Arrived;
    if (lastTerm.compare_exchange_strong(arrived, Term::None) && isUnreaped(child)) {
      passOn(child); // it came between two waits
    }
    status = 0;
    const pid_t ended = ::waitpid(child, &status, 0);
    const bool interrupted = ended == -1 && errno == EINTR;
    awaited = 0;
    if (ended != -1) {
      return ended;
    }
    if (!interrupted || !termReceived) {
      continue;
    }
    if (lastTerm.exchange(Term::None) == Term::PassedOn) {
      (void)::sleep(0);
    } else {
      passOn(child);
    }
  }
}

} // namespace

int waitForChild(pid_t child) {
  termReceived = false;
  lastTerm = Term::None;
  chainIsKnown = false;
  owedToChain = false;
  struct sigaction action = {}; // an empty mask and no flags: SA_RESTART would hide the signal
  action.sa_handler = forwardTermHandler;
  struct sigaction previous = {};
  if (::sigaction(SIGTERM, &action, &previous) != 0) {
    Log::error(kModule, 285, "sigaction failed, %m");
    return -1;
  }
  rememberHandler(previous);
  int status = 0;
  const pid_t ended = collect(child, status);
  if (::sigaction(SIGTERM, &previous, nullptr) != 0) {
    Log::error(kModule, 291, "sigaction failed, %m");
  }
  chainedTermHandler = nullptr;
  chainedInfoHandler = nullptr;
  return ended == child ? status : -1;
}

} // namespace KOVA::Backup
