#ifndef BACKUP_SERVICE_INTERRUPT_H
#define BACKUP_SERVICE_INTERRUPT_H

/// @file SIGTERM and SIGINT, as a question that a run asks between its steps.

#include <kovabackup/signal.h>

/// Thrown to leave a run that a signal has interrupted.
struct Interrupted {};

/// While it lives, SIGTERM and SIGINT are noted, and stop the child that SubProcess::call awaits.
class InterruptWatch {
public:
  InterruptWatch();

  /// The first signal that came, 0 for none.
  static int received();

  /// Throws Interrupted when a signal came.
  static void check();

private:
  KOVA::Backup::ScopedTempSigHandler onTerm_;
  KOVA::Backup::ScopedTempSigHandler onInterrupt_;
  KOVA::Backup::ScopedTempSigHandler onAlarm_;
};

/// While it lives, these signals are ignored: what is begun is brought to its end.
class Undisturbed {
public:
  Undisturbed();

private:
  KOVA::Backup::ScopedTempSigHandler onTerm_;
  KOVA::Backup::ScopedTempSigHandler onInterrupt_;
  KOVA::Backup::ScopedTempSigHandler onAlarm_;
};

#endif
