// A traced process stops at the start and at the end of each system call. A call that must fail
// gets an invalid number at its start, so that the kernel does nothing, and its result at its end.
// close is carried out, since the kernel closes the descriptor whatever close reports.

#include "tests/faults/tracer.h"

#include "tests/faults/calls.h"
#include "tests/faults/marker.h"
#include "tests/faults/process_state.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <map>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

constexpr int kPatienceSec = 20;
constexpr int kMostStops = 100000;
constexpr int kInterruptions = 5;
constexpr int kSyscallStop = SIGTRAP | 0x80;
constexpr long kOptions = PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL | PTRACE_O_TRACEFORK |
                          PTRACE_O_TRACEVFORK | PTRACE_O_TRACECLONE | PTRACE_O_TRACEEXEC |
                          PTRACE_O_TRACEEXIT;
constexpr long kProgramOptions = PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL | PTRACE_O_TRACEEXEC;

struct Tracee {
  bool inCall = false;
  bool started = false;  // its first stop, by SIGSTOP, has been seen
  bool executed = false; // runs a program; what that does is its own affair
  int result = 0;        // the errno that the present call gets at its end
  bool altered = false;  // its arguments were changed, and are put back at its end
  struct user_regs_struct before = {};
};

class Tracer {
public:
  Tracer(pid_t pid, const Injection &injection) : main_(pid), injection_(injection) {
    tracees_[pid];
  }
  Trace run();

private:
  void serve(pid_t pid, int status);
  void serveEvent(pid_t pid, int event);
  void serveCall(pid_t pid, Tracee &tracee);
  void startCall(pid_t pid, Tracee &tracee, struct user_regs_struct &registers);
  void endCall(pid_t pid, Tracee &tracee, struct user_regs_struct &registers);
  void count(pid_t pid, Tracee &tracee, struct user_regs_struct &registers);
  void fail(pid_t pid, Tracee &tracee, struct user_regs_struct &registers, int error);
  void inject(pid_t pid, Tracee &tracee, struct user_regs_struct &registers, const Call &call);
  bool marks(pid_t pid, const struct user_regs_struct &registers);
  void noteCall(long number, const Call *call);
  bool watches(const Tracee &tracee) const;
  void resume(pid_t pid, int signal);
  void killAll();

  const pid_t main_;
  const Injection injection_;
  std::map<pid_t, Tracee> tracees_;
  std::set<std::string> openBefore_;
  bool counting_ = false;
  bool ended_ = false; // the end marker, or nothing left to inject
  int counted_ = 0;
  int interruptions_ = 0;
  int stops_ = 0;
  Trace trace_;
};

Arguments argumentsOf(const struct user_regs_struct &registers) {
  return {registers.rdi, registers.rsi, registers.rdx, registers.r10, registers.r8, registers.r9};
}

void Tracer::noteCall(long number, const Call *call) {
  trace_.calls.push_back(number);
  trace_.variants.push_back(call == nullptr ? 0 : static_cast<int>(call->errors.size()));
  trace_.partial.push_back(call != nullptr && call->partial);
  trace_.interrupts.push_back(call != nullptr && call->interrupts);
}

// Returns: whether the call is one of the markers.
bool Tracer::marks(pid_t pid, const struct user_regs_struct &registers) {
  if (pid != main_ || registers.orig_rax != SYS_prctl) {
    return false;
  }
  if (registers.rdi == kBeginMarker) {
    counting_ = true;
    openBefore_ = openDescriptors(pid);
    trace_.signalsBefore = signalState(pid);
    return true;
  }
  if (registers.rdi == kEndMarker) {
    ended_ = true;
    return true;
  }
  return false;
}

void Tracer::fail(pid_t pid, Tracee &tracee, struct user_regs_struct &registers, int error) {
  if (trace_.failedCall == -1) {
    trace_.failedCall = static_cast<long>(registers.orig_rax);
    trace_.failedErrno = error;
  }
  if (registers.orig_rax == SYS_brk) {
    tracee.altered = true;
    registers.rdi = 0; // brk reports a failure by leaving the break where it is
  } else {
    tracee.result = error;
    if (registers.orig_rax != SYS_close) {
      registers.orig_rax = static_cast<unsigned long long>(-1);
    }
  }
  (void)::ptrace(PTRACE_SETREGS, pid, nullptr, &registers);
}

void Tracer::inject(pid_t pid, Tracee &tracee, struct user_regs_struct &registers,
                    const Call &call) {
  const bool first = trace_.failedCall == -1;
  switch (injection_.manner) {
  case Manner::Once:
  case Manner::Lasting: {
    if (call.errors.empty()) {
      break; // another call than in the clean run
    }
    const std::size_t variant = static_cast<std::size_t>(injection_.variant) % call.errors.size();
    fail(pid, tracee, registers, first ? call.errors[variant] : trace_.failedErrno);
    break;
  }
  case Manner::Partial:
    if (call.partial && registers.rdx > 1) {
      tracee.altered = true;
      registers.rdx = 1;
      (void)::ptrace(PTRACE_SETREGS, pid, nullptr, &registers);
    }
    trace_.failedCall = static_cast<long>(registers.orig_rax);
    break;
  case Manner::Interrupted:
    if (call.interrupts) {
      fail(pid, tracee, registers, EINTR);
    }
    ++interruptions_;
    break;
  default:
    break;
  }
  const bool more = injection_.manner == Manner::Lasting ||
                    (injection_.manner == Manner::Interrupted && interruptions_ < kInterruptions);
  ended_ = ended_ || !more;
}

void Tracer::count(pid_t pid, Tracee &tracee, struct user_regs_struct &registers) {
  const long number = static_cast<long>(registers.orig_rax);
  const Call *const call = findCall(number, argumentsOf(registers));
  trace_.mainCalls += pid == main_ ? 1 : 0;
  if (injection_.manner == Manner::Killed) {
    if (pid == main_ && trace_.mainCalls == injection_.at) {
      trace_.killed = true;
      trace_.failedCall = number;
      (void)::kill(pid, SIGKILL);
    }
    return;
  }
  if (call == nullptr || isMemory(injection_.manner)) {
    return;
  }
  ++counted_;
  if (injection_.manner == Manner::None) {
    noteCall(number, call);
  } else if (counted_ == injection_.at ||
             (counted_ > injection_.at && number == trace_.failedCall)) {
    inject(pid, tracee, registers, *call);
  }
}

void Tracer::startCall(pid_t pid, Tracee &tracee, struct user_regs_struct &registers) {
  if (!marks(pid, registers) && counting_ && !ended_) {
    count(pid, tracee, registers);
  }
}

void Tracer::serveCall(pid_t pid, Tracee &tracee) {
  struct user_regs_struct registers = {};
  tracee.inCall = !tracee.inCall;
  const bool needed = tracee.inCall || tracee.result != 0 || tracee.altered;
  if (!needed || ::ptrace(PTRACE_GETREGS, pid, nullptr, &registers) != 0) {
    return;
  }
  if (tracee.inCall) {
    tracee.before = registers;
    startCall(pid, tracee, registers);
  } else {
    endCall(pid, tracee, registers);
  }
}

// The program relies on the arguments of a call being as they were.
void Tracer::endCall(pid_t pid, Tracee &tracee, struct user_regs_struct &registers) {
  if (tracee.result != 0) {
    registers.rax = static_cast<unsigned long long>(-static_cast<long long>(tracee.result));
  }
  registers.rdi = tracee.before.rdi;
  registers.rdx = tracee.before.rdx;
  tracee.result = 0;
  tracee.altered = false;
  (void)::ptrace(PTRACE_SETREGS, pid, nullptr, &registers);
}

void Tracer::serveEvent(pid_t pid, int event) {
  Tracee &tracee = tracees_[pid];
  if (event == PTRACE_EVENT_EXEC) {
    if (pid != main_ || counting_) {
      tracee.executed = true;
      trace_.executed = trace_.executed || pid == main_;
      // Its threads and children are its own affair, too.
      (void)::ptrace(PTRACE_SETOPTIONS, pid, nullptr, kProgramOptions);
    }
    tracee.inCall = true; // the stop at the end of execve follows
  } else if (event == PTRACE_EVENT_EXIT && pid == main_) {
    if (counting_ && !tracee.executed) {
      for (const std::string &open : openDescriptors(pid)) {
        if (openBefore_.count(open) == 0) {
          trace_.leaked.insert(open);
        }
      }
      trace_.signalsAfter = signalState(pid);
    }
    trace_.children = countChildren(pid);
  }
}

// Whether a process must stop at its system calls. Others run at full speed.
bool Tracer::watches(const Tracee &tracee) const {
  return !tracee.executed && (tracee.result != 0 || tracee.altered || !counting_ || !ended_);
}

void Tracer::resume(pid_t pid, int signal) {
  Tracee &tracee = tracees_[pid];
  const bool watched = watches(tracee);
  if (!watched) {
    tracee.inCall = false;
  }
  (void)::ptrace(watched ? PTRACE_SYSCALL : PTRACE_CONT, pid, nullptr, signal);
}

void Tracer::serve(pid_t pid, int status) {
  if (!WIFSTOPPED(status)) {
    if (pid == main_) {
      trace_.status = status;
    }
    tracees_.erase(pid);
    return;
  }
  Tracee &tracee = tracees_[pid];
  const int signal = WSTOPSIG(status);
  const int event = static_cast<int>(static_cast<unsigned>(status) >> 16U);
  int delivered = 0;
  if (signal == kSyscallStop) {
    serveCall(pid, tracee);
  } else if (event != 0) {
    serveEvent(pid, event);
  } else if (signal == SIGSTOP && !tracee.started) {
    tracee.started = true;
    if (pid == main_) {
      (void)::ptrace(PTRACE_SETOPTIONS, pid, nullptr, kOptions);
    }
  } else {
    delivered = signal;
  }
  resume(pid, delivered);
}

void Tracer::killAll() {
  for (const auto &tracee : tracees_) {
    (void)::kill(tracee.first, SIGKILL);
  }
}

Trace Tracer::run() {
  bool mainEnded = false;
  while (!tracees_.empty()) {
    int status = 0;
    const pid_t pid = ::waitpid(-1, &status, __WALL);
    if (pid < 0 && errno != EINTR) {
      break;
    }
    if (pid < 0 || ++stops_ == kMostStops) {
      trace_.endless = trace_.endless || !mainEnded;
      killAll();
    }
    if (pid > 0) {
      serve(pid, status); // also the last stop of a process that is being killed
    }
    if (!mainEnded && tracees_.count(main_) == 0) {
      mainEnded = true;
      killAll(); // children that it left are in trace_.children
    }
  }
  return trace_;
}

void onAlarm(int) {}

// Makes waitpid return when a process does not end.
class Alarm {
public:
  Alarm() {
    struct sigaction action = {};
    action.sa_handler = onAlarm; // without SA_RESTART
    ::sigaction(SIGALRM, &action, nullptr);
    const struct itimerval time = {{1, 0}, {kPatienceSec, 0}};
    ::setitimer(ITIMER_REAL, &time, nullptr);
  }
  ~Alarm() {
    const struct itimerval none = {};
    ::setitimer(ITIMER_REAL, &none, nullptr);
  }
  Alarm(const Alarm &) = delete;
  Alarm &operator=(const Alarm &) = delete;
};

pid_t start(const std::function<void()> &work) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    if (::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0) {
      ::_exit(EXIT_FAILURE);
    }
    (void)::raise(SIGSTOP);
    work();
    ::_exit(EXIT_SUCCESS);
  }
  return pid;
}

} // namespace

std::string whyNoTraces() {
  const Trace empty = trace([] { markBegin(); }, {});
  return WIFEXITED(empty.status) && WEXITSTATUS(empty.status) == 0 ? ""
                                                                   : "no process may be traced";
}

Trace trace(const std::function<void()> &work, const Injection &injection) {
  const Alarm alarm;
  return Tracer(start(work), injection).run();
}

} // namespace KovaTest::Faults
