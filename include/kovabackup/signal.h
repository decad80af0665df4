#ifndef KOVABACKUP_SIGNAL_H
#define KOVABACKUP_SIGNAL_H

/// @file Signal handlers: setting one, changing the flags of an action, and a handler that stands
/// as long as an object does.
///
///     int oldFlags = 0;
///     if (!signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, oldFlags)) return false;
///     ...start a child and wait for it...
///     signalHandlerSetFlags(SIGCHLD, oldFlags);
///
///     ScopedTempSigHandler onHangup;
///     onHangup.setSignalHandler(SIGHUP, SA_RESTART, reload);   // until onHangup goes
///
/// Failure:   by return value; nothing is thrown.
/// Process:   actions belong to the whole process: every function here changes them for all
///            threads. Masks belong to the thread.
/// Threads:   nothing is locked. Reading and writing back an action are two steps; a change that
///            another thread makes between them is lost.
///
/// This header shares its name with the system's; include it as "kovabackup/signal.h" and never
/// put the folder kovabackup itself on the include path.

#include <signal.h>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Unblocks a signal in the calling thread and sets its handler, with an empty mask and SA_RESTART
/// as the only flag.
/// Returns: true when the handler is set.
/// Errors:  no such signal; a signal that cannot be caught. It may be unblocked even so.
/// errno:   on false, as the failing step left it.
/// Log:     one LOG_ERR line with the signal's number.
/// Signals: the calling thread's mask loses sig, and nothing puts it back. A signal that was
///          waiting for that is delivered at once, still to the old action.
bool signalHandlerSet(int sig, void (*handler)(int));

/// Replaces the flags of a signal's action; handler and mask stay.
/// Returns: true when they are set.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line.
bool signalHandlerSetFlags(int sig, int flags);

/// Adds flags to a signal's action and tells which it had, for signalHandlerSetFlags to put back.
/// The kernel tells flags of its own too (SA_RESTORER): look at single bits of oldFlags.
/// Returns: true when they are set. oldFlags holds the flags read; after a failure it does so only
///          when the reading was not what failed.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line.
bool signalHandlerAddFlags(int sig, int flags, int &oldFlags);

/// Takes flags away from a signal's action and tells which it had. Taking away what is not set
/// succeeds.
/// Returns: true when they are cleared. oldFlags as in signalHandlerAddFlags.
/// errno:   on false, as sigaction(2) left it.
/// Log:     one LOG_ERR line.
bool signalHandlerRemoveFlags(int sig, int flags, int &oldFlags);

/// Replaces the action of one signal until the object goes.
///
/// Ownership: the object keeps the action that it replaced. Objects for the same signal must go in
///            the reverse order of their setting, as those on one stack do.
class ScopedTempSigHandler {
public:
  /// Replaces nothing yet.
  ScopedTempSigHandler();

  /// Puts the replaced action back, whatever is in force by then; without one, does nothing.
  ~ScopedTempSigHandler();

  ScopedTempSigHandler(const ScopedTempSigHandler &) = delete;
  ScopedTempSigHandler &operator=(const ScopedTempSigHandler &) = delete;

  /// Sets the handler with an empty mask and exactly these flags. One object serves one
  /// replacement: every later call fails, for the same signal too, and changes nothing. A sig below
  /// 1 is no signal and leaves the object as it was.
  /// Returns: true on the first call, deliberately also when the system refuses the signal.
  /// errno:   not meaningful.
  /// Log:     one LOG_ERR line on false, with the number of the signal that the object holds.
  bool setSignalHandler(int sig, int flags, void (*handler)(int));

private:
  int signum_;
  struct sigaction savedAction_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
