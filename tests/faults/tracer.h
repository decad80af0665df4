#ifndef KOVABACKUP_TESTS_FAULTS_TRACER_H
#define KOVABACKUP_TESTS_FAULTS_TRACER_H

/// @file A process whose nth system call fails, or that is killed there.
///
/// The process is traced from outside, with ptrace(2), so what runs in it needs no preparation
/// except the marker that begins the counting (marker.h): the work of the dynamic loader does not
/// count. Children that it forks count with it, until they execute a program.

#include <functional>
#include <set>
#include <string>
#include <vector>

namespace KovaTest::Faults {

enum class Manner {
  None,
  Once,        ///< one call fails
  Lasting,     ///< all calls of the same kind after it, too
  Partial,     ///< one byte is transferred
  Interrupted, ///< five calls of that kind fail with EINTR
  Killed,      ///< SIGKILL before the call; calls that cannot fail are counted, too
  NoMemory,    ///< an allocation fails
  OutOfMemory  ///< all allocations after it, too
};

struct Injection {
  Manner manner = Manner::None;
  int at = 0;      ///< the call or allocation, counted from 1
  int variant = 0; ///< which of the errno values of the call
};

/// Whether it is an allocation that fails, rather than a system call.
inline bool isMemory(Manner manner) {
  return manner == Manner::NoMemory || manner == Manner::OutOfMemory;
}

struct Trace {
  std::vector<long> calls;      ///< those that were counted
  std::vector<int> variants;    ///< the number of variants of each of them
  std::vector<bool> partial;    ///< whether it can be partial
  std::vector<bool> interrupts; ///< whether a signal can end it
  int mainCalls = 0;            ///< all calls of the process itself, which can be killed at each
  long failedCall = -1;         ///< the one that failed first; -1 when none did
  int failedErrno = 0;
  bool killed = false;          ///< by the tracer, as the injection says
  bool endless = false;         ///< it did not end and was killed
  int status = 0;               ///< of waitpid(2)
  std::set<std::string> leaked; ///< descriptors that were not open at the marker
  std::string signalsBefore;    ///< masks and handlers at the marker
  std::string signalsAfter;     ///< and when it ended
  bool executed = false;        ///< it has become a program itself
  int children = 0;             ///< that it left, zombies among them
};

/// "" when processes can be traced here, else the reason.
std::string whyNoTraces();

/// Forks a child that does the work, and waits until it and all its children have ended.
Trace trace(const std::function<void()> &work, const Injection &injection);

} // namespace KovaTest::Faults

#endif
