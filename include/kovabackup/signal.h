#ifndef KOVABACKUP_SIGNAL_H
#define KOVABACKUP_SIGNAL_H

/// @file Signal handlers: setting one, changing the flags of an action, and a handler that applies
/// for the lifetime of an object.
///
///     int oldFlags = 0;
///     if (!signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, oldFlags)) return false;
///     ...start a child and wait for it...
///     signalHandlerSetFlags(SIGCHLD, oldFlags);
///
///     ScopedTempSigHandler onHangup;
///     onHangup.setSignalHandler(SIGHUP, SA_RESTART, reload);   // for the lifetime of onHangup
///
/// Failure:   by return value; nothing is thrown.
/// Process:   a signal's action belongs to the process: every function here changes it for all
///            threads. A signal mask belongs to its thread.
/// Threads:   nothing is locked. Reading an action and writing it back are two steps; a change that
///            another thread makes between them is lost.
/// Signals:   no function here is async-signal-safe, because failures are logged with syslog(3).
///
/// This header has the same name as the system's <signal.h>. Include it as "kovabackup/signal.h",
/// and never add the folder kovabackup itself to the include path.

#include <signal.h>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Unblocks a signal in the calling thread, then sets its handler with an empty mask and SA_RESTART
/// as the only flag (sigaction(2)). handler may be SIG_IGN or SIG_DFL.
/// Returns: true when the handler is set.
/// Errors:  sig is not a valid signal, or cannot be caught. In the second case it may already have
///          been unblocked.
/// errno:   on false, as the failing step left it.
/// Log:     one LOG_ERR line with the signal's number: 17, 21, 26 or 36.
/// Signals: sig is removed from the mask of the calling thread and stays removed. A pending sig is
///          delivered as soon as it is unblocked, while the previous action still applies.
bool signalHandlerSet(int sig, void (*handler)(int));

/// Replaces the flags of a signal's action. The handler and the mask are kept.
/// Returns: true when the flags are set.
/// Errors:  sig is not a valid signal, or its action cannot be changed.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line: 49 when reading the action fails, 56 when writing it fails.
bool signalHandlerSetFlags(int sig, int flags);

/// Adds flags to a signal's action, and reports the previous flags so that signalHandlerSetFlags
/// can restore them. The kernel reports flags of its own as well (SA_RESTORER): test single bits of
/// oldFlags.
/// Returns: true when the flags are set, with the previous flags in oldFlags. On false, oldFlags
///          holds the previous flags if they could be read, and is unchanged otherwise.
/// Errors:  as signalHandlerSetFlags.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line: 68 when reading the action fails, 77 when writing it fails.
bool signalHandlerAddFlags(int sig, int flags, int &oldFlags);

/// Removes flags from a signal's action, and reports the previous flags. Removing a flag that is
/// not set succeeds.
/// Returns: true when the flags are cleared; oldFlags as in signalHandlerAddFlags.
/// Errors:  as signalHandlerSetFlags.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line: 89 when reading the action fails, 98 when writing it fails.
bool signalHandlerRemoveFlags(int sig, int flags, int &oldFlags);

/// Replaces the action of one signal for the lifetime of the object.
///
/// Ownership: the object keeps the action that it replaced. Objects for the same signal must be
///            destroyed in the reverse order of their setSignalHandler calls, as objects on one
///            stack are.
class ScopedTempSigHandler {
public:
  /// Creates an object that has not replaced any action.
  ScopedTempSigHandler();

  /// Restores the replaced action, whatever action applies at that time. An object that replaced
  /// nothing changes nothing.
  ~ScopedTempSigHandler();

  ScopedTempSigHandler(const ScopedTempSigHandler &) = delete;
  ScopedTempSigHandler &operator=(const ScopedTempSigHandler &) = delete;

  /// Sets the handler with an empty mask and exactly the given flags. An object serves a single
  /// replacement: every later call fails, even for the same signal, and changes nothing. A sig
  /// below 1 is not a valid signal; the object then still counts as unused.
  /// Returns: true on the first call, deliberately even when the system rejects the signal.
  /// errno:   not meaningful.
  /// Log:     on false, one LOG_ERR line, 124, with the signal whose action the object replaced.
  bool setSignalHandler(int sig, int flags, void (*handler)(int));

private:
  int signum_;
  struct sigaction savedAction_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
