#ifndef BACKUP_SERVICE_INTERRUPT_H
#define BACKUP_SERVICE_INTERRUPT_H

/// @file SIGTERM and SIGINT, recorded so that a run can check for them between its steps.

#include <kovabackup/signal.h>

/// Thrown to abandon a run that a signal has interrupted.
struct Interrupted {};

/// While the object exists, SIGTERM and SIGINT are recorded and forwarded as SIGTERM to the child
/// that SubProcess::call waits for.
class InterruptWatch {
public:
  InterruptWatch();

  /// The first signal that arrived; 0 if none did.
  static int received();

  /// Throws Interrupted if a signal has arrived.
  static void check();

private:
  KOVA::Backup::ScopedTempSigHandler onTerm_;
  KOVA::Backup::ScopedTempSigHandler onInterrupt_;
  KOVA::Backup::ScopedTempSigHandler onAlarm_;
};

/// While the object exists, these signals are ignored, so that the work in progress is finished.
class SignalsIgnored {
public:
  SignalsIgnored();

private:
  KOVA::Backup::ScopedTempSigHandler onTerm_;
  KOVA::Backup::ScopedTempSigHandler onInterrupt_;
  KOVA::Backup::ScopedTempSigHandler onAlarm_;
};

#endif
