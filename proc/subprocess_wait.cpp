// Waiting for a child and passing SIGTERM on to it.
//
// waitpid(2) returns with EINTR when a SIGTERM arrives while it sleeps, and the loop then sends the
// signal on. A SIGTERM that arrives a moment earlier, after the handler is set and before waitpid
// sleeps, runs the handler and lets waitpid sleep: the child would get it only when some other
// signal interrupts the wait, if ever. waitpid takes no mask, so that moment cannot be excluded.
// Instead, each signal is sent on once, by the side that is able to:
//
//     lastTerm     set by                                       sent on by
//     None         the loop, after it has handled a signal
//     Arrived      the handler                                  the loop, before or after waitpid
//     PassedOn     the handler, while awaited is set, that      the handler; when waitpid returns
//                  is in waitpid or just before it              EINTR, the loop does not repeat it
//
// The loop sets awaited before it looks at lastTerm, and the handler sets lastTerm before it looks
// at awaited. So at least one of them always sees what the other has set, even when the handler
// runs in another thread.
//
// Callers and children see what they would see if the loop alone sent signals on: the caller's
// handler runs first, then kill, sleep and the next wait follow, and every further interruption, by
// any signal, sends SIGTERM again. The only difference is that a signal of that moment is not lost.
//
// The caller's handler is known only when sigaction(2) has returned, a moment after ours is set. A
// SIGTERM in between is owed to the caller's handler: it runs as soon as it is known, and still
// before the signal is sent on.
//
// Rejected alternatives:
// - Reading the caller's action by a further sigaction(2) first, so that no handler is ever owed.
//   The system calls of a wait are fixed: one sigaction sets our handler and one restores the
//   caller's, and each has a message for its failure. A third would fail without one. Nor would it
//   close the gap: when another thread sets an action between reading and setting, a SIGTERM that
//   arrives before the second call returns would go to the wrong handler.
// - Blocking SIGTERM outside a ppoll(2) on a pidfd. It changes the mask that the caller's other
//   handlers see, and loses signals that another thread takes.
// - A jump out of the handler. It loses the status of a child that has just been reaped.
// - Sending from the handler and from the loop. The child gets two signals.

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

// What is known of the handler that the caller had. Owed: a SIGTERM came before it was known.
enum class Chain { Unknown, Owed, Known };

// The state of a wait. It belongs to the process, because the handler gets no context; so only one
// wait may run at a time. The handler may touch lock-free atomics only.
struct TermForwarding {
  std::atomic<bool> termReceived{false};
  std::atomic<Term> lastTerm{Term::None};
  std::atomic<pid_t> awaited{0};
  std::atomic<Chain> chain{Chain::Unknown};
  std::atomic<Handler> chainedTermHandler{nullptr};
  std::atomic<InfoHandler> chainedInfoHandler{nullptr}; // instead, for an action with SA_SIGINFO

  void begin() {
    termReceived = false;
    lastTerm = Term::None;
    chain = Chain::Unknown;
  }

  void end() {
    chainedTermHandler = nullptr;
    chainedInfoHandler = nullptr;
  }
};
static_assert(std::atomic<bool>::is_always_lock_free && std::atomic<Term>::is_always_lock_free &&
              std::atomic<pid_t>::is_always_lock_free && std::atomic<Chain>::is_always_lock_free &&
              std::atomic<Handler>::is_always_lock_free &&
              std::atomic<InfoHandler>::is_always_lock_free);

TermForwarding forwarding;

void runChainedHandler(int sig) {
  if (const Handler handler = forwarding.chainedTermHandler) {
    handler(sig);
  }
  if (const InfoHandler handler = forwarding.chainedInfoHandler) {
    // Our own handler gets no siginfo. What it does not know is zero, never a stray pointer.
    siginfo_t info = {};
    info.si_signo = sig;
    ucontext_t context = {};
    handler(sig, &info, &context);
  }
}

// Runs the caller's handler, or notes that it is owed. The exchange decides between this function
// and rememberHandler, also when the signal's handler runs in another thread.
void runOrOweChainedHandler(int sig) {
  Chain state = Chain::Unknown;
  if (!forwarding.chain.compare_exchange_strong(state, Chain::Owed) && state == Chain::Known) {
    runChainedHandler(sig);
  }
}

// Whether the process is our child and not reaped yet. A signal to a service often reaches parent
// and child at once, so the child may have ended. Once it was reaped, by waitpid or, when the host
// ignores SIGCHLD, by the kernel, its pid may be reused.
bool isUnreaped(pid_t child) {
  siginfo_t info = {};
  return ::waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOHANG | WNOWAIT) == 0;
}

void passOnFromHandler() {
  const pid_t child = forwarding.awaited;
  Term arrived = Term::Arrived;
  if (child > 0 && isUnreaped(child) &&
      forwarding.lastTerm.compare_exchange_strong(arrived, Term::PassedOn)) {
    (void)::kill(child, SIGTERM);
  }
}

void forwardTermHandler(int sig) {
  // The interrupted code may have made a call and not read its errno yet.
  const Base::ErrnoGuard guard;
  if (sig == SIGTERM) {
    forwarding.termReceived = true;
    forwarding.lastTerm = Term::Arrived;
  }
  runOrOweChainedHandler(sig);
  if (sig == SIGTERM) {
    passOnFromHandler();
  }
}

void rememberHandler(const struct sigaction &previous) {
  if ((previous.sa_flags & SA_SIGINFO) != 0) {
    forwarding.chainedInfoHandler = previous.sa_sigaction;
  } else if (previous.sa_handler != SIG_IGN) { // SIG_DFL is null
    forwarding.chainedTermHandler = previous.sa_handler;
  }
  if (forwarding.chain.exchange(Chain::Known) == Chain::Owed) {
    runChainedHandler(SIGTERM);
  }
}

void passOn(pid_t child) {
  (void)::kill(child, SIGTERM); // harmless when it has ended: it is collected next
  (void)::sleep(0);
}

// Returns: what waitpid returned, never -1. status is 0 unless waitpid wrote it.
pid_t collect(pid_t child, int &status) {
  for (;;) {
    forwarding.awaited = child;
    Term arrived = Term::Arrived;
    if (forwarding.lastTerm.compare_exchange_strong(arrived, Term::None) && isUnreaped(child)) {
      passOn(child); // the signal came between two waits
    }
    status = 0;
    const pid_t ended = ::waitpid(child, &status, 0);
    const bool interrupted = ended == -1 && errno == EINTR;
    forwarding.awaited = 0;
    if (ended != -1) {
      return ended;
    }
    if (!interrupted || !forwarding.termReceived) {
      continue;
    }
    if (forwarding.lastTerm.exchange(Term::None) == Term::PassedOn) {
      (void)::sleep(0);
    } else {
      passOn(child);
    }
  }
}

} // namespace

int waitForChild(pid_t child) {
  forwarding.begin();
  struct sigaction action = {}; // no mask, and no flags: with SA_RESTART waitpid would sleep on
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
  forwarding.end();
  return ended == child ? status : -1;
}

} // namespace KOVA::Backup
