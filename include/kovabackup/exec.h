#ifndef KOVABACKUP_EXEC_H
#define KOVABACKUP_EXEC_H

/// @file Running one program as it stands, and the state of any process.
///
///     char *const argv[] = {program, option, nullptr};
///     UtilExec exec;
///     const int code = exec.Execv("/usr/bin/rsync", argv, onForwarded);   // 0 to 255, or -1
///
///     if (Process::isAlive(pid) && !Process::isZombie(pid)) ...
///
/// Execv leaves the child as fork(2) makes it: environment, descriptors (but for those marked
/// close-on-exec), working directory, signal mask and ignored signals are the caller's. A child
/// with a clean environment and no stray descriptors is what SubProcess (kovabackup/subprocess.h)
/// starts.
///
/// Failure:   by return value; nothing is thrown.
/// errno:     not meaningful, unless said otherwise.
/// Log:       Execv and its handler, under the module path "proc/exec".
/// Threads:   one Execv at a time in a process, and no SubProcess::call meanwhile: the actions of
///            SIGINT, SIGTERM and SIGCHLD and the pid to forward to belong to the whole process.
///            Process may be asked by any thread. The child of a threaded caller makes no call
///            before execv(2).
/// Process:   nothing stays changed after Execv, but see RestoreSigHandler for what signal(2)
///            cannot put back.

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Runs a program in the foreground and passes SIGINT and SIGTERM on to it.
///
/// Ownership: an object holds two saved handlers and nothing else. Execv uses them: SetSigHandler
///            and RestoreSigHandler of the same object must not enclose an Execv.
class UtilExec {
public:
  /// Has saved no handlers.
  UtilExec();

  UtilExec(const UtilExec &) = delete;
  UtilExec &operator=(const UtilExec &) = delete;

  /// Runs a program and waits until it ends. path is taken as it stands, without a search along
  /// PATH; argv ends with a null pointer and begins with the program's name.
  /// SIGINT and SIGTERM that arrive meanwhile are sent on to the program; the handlers that the
  /// caller had for them do not run. When one arrived, callback, unless it is null, is called
  /// before Execv returns, with the number of the last one and with the result, while both signals
  /// are still caught.
  /// Returns: the exit code, 0 to 255; -1 when the program could not be started, was ended by a
  ///          signal or could not be waited for. A program that cannot be executed counts as ended
  ///          by a signal (SIGABRT).
  /// Errors:  fork fails; somebody else reaped the child, or SIGCHLD is ignored (SIG_IGN): the
  ///          result is -1 then, after the program has ended. The same comes of a program that
  ///          ends at once while SIGCHLD carries SA_NOCLDWAIT, which is taken off for the wait
  ///          only when the child is already there.
  /// Log:     LOG_ERR, 22, for each signal that could not be sent on; 94, without pid and tag,
  ///          should waitpid(2) ever give 0.
  /// Blocks:  until the program ends, without limit; what it started and left behind is not
  ///          waited for.
  /// Signals: during the wait SIGINT and SIGTERM are caught and SIGCHLD is without SA_NOCLDWAIT.
  ///          A signal that arrives after the fork and before its handler is set meets the
  ///          caller's own action. Between fork and execv the child has the caller's handlers.
  ///          One that cannot be sent on is logged from the signal handler: a callback that itself
  ///          calls syslog(3), whose lock the handler would wait for, blocks both signals
  ///          meanwhile.
  int Execv(const char *path, char *const *argv, void (*callback)(int, int));

  /// Sets the forwarding handler for SIGINT and then SIGTERM with signal(2) and keeps the handlers
  /// that were set. A second call keeps the forwarding handler itself. While no Execv waits there
  /// is nobody to forward to: a signal is then caught, and logged as not sent.
  /// Log:     LOG_ERR, 22, for each signal that could not be sent on, from the handler.
  void SetSigHandler();

  /// Sets the kept handlers again, SIGINT's and then SIGTERM's, with signal(2), and forgets them.
  /// Without handlers kept, also when called twice, both signals get their default action.
  /// Deliberate: signal(2) knows no masks and flags, so a handler that had been set by sigaction(2)
  /// returns with an empty mask and SA_RESTART; one with SA_SIGINFO is no longer given its
  /// siginfo_t. Callers with such handlers set them again.
  void RestoreSigHandler();

private:
  void (*savedIntHandler_)(int);
  void (*savedTermHandler_)(int);
};

/// Questions about any process, by its pid. None of them logs.
namespace Process {

/// Whether a process exists: kill(2) with signal 0. Zombies and processes of other users count;
/// 0 and negative numbers name process groups, and -1 every process, as they do for kill(2).
/// errno:   unchanged.
bool isAlive(int pid);

/// The state of a process, as the kernel shows it in /proc: 'R', 'S', 'D', 'T', 'Z' and others.
/// Returns: the letter's code; 0 when it is not known, for a pid below 1 always.
int getStatus(int pid);

/// Whether a process has ended and waits to be reaped: getStatus gives 'Z'.
bool isZombie(int pid);

} // namespace Process

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
