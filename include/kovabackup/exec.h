#ifndef KOVABACKUP_EXEC_H
#define KOVABACKUP_EXEC_H

/// @file Running a program in the caller's own environment, and the state of any process.
///
///     char *const argv[] = {program, option, nullptr};
///     UtilExec exec;
///     const int code = exec.Execv("/usr/bin/rsync", argv, onForwarded);   // 0 to 255, or -1
///
///     if (Process::isAlive(pid) && !Process::isZombie(pid)) ...
///
/// Execv starts the child exactly as fork(2) creates it. The environment, the working directory,
/// the signal mask and the ignored signals are the caller's, and so are all descriptors that are
/// not close-on-exec. To start a child with a clean environment and without stray descriptors, use
/// SubProcess (kovabackup/subprocess.h).
///
/// Failure:   by return value; nothing is thrown.
/// errno:     not meaningful, unless said otherwise.
/// Log:       Execv and its signal handler, under the module path "proc/exec".
/// Threads:   one Execv at a time in a process, and no SubProcess::call at the same time: the
///            actions of SIGINT, SIGTERM and SIGCHLD and the pid of the child belong to the
///            process. Any thread may call the functions of Process. In a multithreaded caller, the
///            child makes no call between fork and execv(2).
/// Signals:   Process::isAlive is async-signal-safe; nothing else here is.
/// Process:   Execv restores what it changes, except for what signal(2) cannot restore (see
///            RestoreSigHandler).

#include "kovabackup/nodiscard.h"

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Runs a program in the foreground and forwards SIGINT and SIGTERM to it.
///
/// Ownership: an object holds two saved handlers and nothing else. Execv uses them: do not call
///            Execv between SetSigHandler and RestoreSigHandler of the same object.
class UtilExec {
public:
  /// Creates an object without saved handlers.
  UtilExec();

  UtilExec(const UtilExec &) = delete;
  UtilExec &operator=(const UtilExec &) = delete;

  /// Runs a program and waits until it ends. path is used as given, without a search along PATH.
  /// argv starts with the program's name and ends with a null pointer.
  /// SIGINT and SIGTERM that arrive during the wait are forwarded to the program; the caller's own
  /// handlers for them do not run. If at least one arrived and callback is not null, Execv calls
  /// callback before it returns, with the number of the last signal and the result. Both signals
  /// are still caught at that time.
  /// Returns: the exit code, 0 to 255; -1 when the program could not be started, was ended by a
  ///          signal or could not be waited for. A program that cannot be executed counts as ended
  ///          by a signal (SIGABRT).
  /// Errors:  fork fails. Another part of the process reaps the child, or the caller ignores
  ///          SIGCHLD (SIG_IGN): the result is then -1, after the program has ended. The same can
  ///          happen when the caller has set SA_NOCLDWAIT for SIGCHLD and the program ends at once,
  ///          because Execv clears that flag only after it has started the child.
  /// Log:     LOG_ERR lines: 22 for each signal that could not be forwarded; 94, without process id
  ///          and tag, if waitpid(2) ever returns 0.
  /// Blocks:  until the program ends, without limit. Processes that the program leaves behind are
  ///          not waited for.
  /// Signals: during the wait SIGINT and SIGTERM are caught, and SIGCHLD is without SA_NOCLDWAIT. A
  ///          signal that arrives after the fork and before its handler is set triggers the
  ///          caller's own action. Between fork and execv the child has the caller's handlers. A
  ///          signal that cannot be forwarded is logged from the signal handler. That handler would
  ///          wait for ever for a lock that callback holds inside syslog(3), so a callback that
  ///          logs blocks both signals meanwhile.
  KOVA_NODISCARD int Execv(const char *path, char *const *argv, void (*callback)(int, int));

  /// Sets the forwarding handler for SIGINT and then SIGTERM with signal(2), and saves the previous
  /// handlers. A second call saves the forwarding handler itself. While no Execv is waiting, there
  /// is no child to forward to: a signal is then caught, and logged as not forwarded.
  /// Log:     LOG_ERR, 22, from the handler, for each signal that could not be forwarded.
  /// Process: changes the actions of both signals for all threads.
  void SetSigHandler();

  /// Sets the saved handlers for SIGINT and then SIGTERM with signal(2), and forgets them. Without
  /// saved handlers, for example on a second call, both signals get their default action.
  /// Deliberate: signal(2) handles neither masks nor flags. A handler that was set by sigaction(2)
  /// is restored with an empty mask and SA_RESTART; a handler with SA_SIGINFO no longer receives
  /// its siginfo_t. Callers with such handlers set them again.
  /// Process: changes the actions of both signals for all threads.
  void RestoreSigHandler();

private:
  void (*savedIntHandler_)(int);
  void (*savedTermHandler_)(int);
};

/// Queries about any process, by its pid. None of them logs.
namespace Process {

/// Checks whether a process exists, by kill(2) with signal 0. Zombies and processes of other users
/// count. As for kill(2), 0 and numbers below -1 denote process groups, and -1 denotes every
/// process.
/// Returns: false only when kill(2) fails with ESRCH.
/// errno:   unchanged.
bool isAlive(int pid);

/// The state of a process as the kernel reports it in /proc/<pid>/stat (proc(5)): 'R', 'S', 'D',
/// 'T', 'Z' and others.
/// Returns: the character code of the letter; 0 when the state is unknown, which includes every pid
///          below 1.
int getStatus(int pid);

/// Checks whether a process has ended and has not been reaped yet.
/// Returns: true when getStatus returns 'Z'.
bool isZombie(int pid);

} // namespace Process

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
