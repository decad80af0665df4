#include "interrupt.h"

#include <csignal>
#include <unistd.h>

namespace {

volatile std::sig_atomic_t firstSignal = 0;

void recordFirst(int signal) {
  if (firstSignal == 0) {
    firstSignal = signal;
  }
}

// A signal that arrives just before a child is started, or before the child has set its handler,
// would be lost. The alarm therefore repeats the signal every second until the run has ended.
void onTermSignal(int signal) {
  recordFirst(signal);
  ::alarm(1);
}

// SubProcess::call forwards SIGTERM to its child, and no other signal.
void raiseTerm(int signal) {
  if (signal == SIGINT) {
    recordFirst(signal);
  }
  (void)std::raise(SIGTERM);
}

} // namespace

InterruptWatch::InterruptWatch() {
  onTerm_.setSignalHandler(SIGTERM, SA_RESTART, &onTermSignal);
  // Without SA_RESTART, so that these signals interrupt the wait for a child and the SIGTERM that
  // they raise is forwarded.
  onInterrupt_.setSignalHandler(SIGINT, 0, &raiseTerm);
  onAlarm_.setSignalHandler(SIGALRM, 0, &raiseTerm);
}

int InterruptWatch::received() {
  return firstSignal;
}

void InterruptWatch::check() {
  if (firstSignal != 0) {
    throw Interrupted();
  }
}

SignalsIgnored::SignalsIgnored() {
  onTerm_.setSignalHandler(SIGTERM, 0, SIG_IGN);
  onInterrupt_.setSignalHandler(SIGINT, 0, SIG_IGN);
  onAlarm_.setSignalHandler(SIGALRM, 0, SIG_IGN);
  ::alarm(0);
}
