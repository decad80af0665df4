#include "interrupt.h"

#include <csignal>
#include <unistd.h>

namespace {

volatile std::sig_atomic_t firstSignal = 0;

void note(int signal) {
  if (firstSignal == 0) {
    firstSignal = signal;
  }
}

// A signal that comes just before a child is started or can listen would not reach it. So the
// signal is repeated every second until the run has ended.
void noteTerm(int signal) {
  note(signal);
  ::alarm(1);
}

// The library passes SIGTERM on to the child that it waits for, and no other signal.
void turnIntoTerm(int signal) {
  if (signal == SIGINT) {
    note(signal);
  }
  (void)std::raise(SIGTERM);
}

} // namespace

InterruptWatch::InterruptWatch() {
  onTerm_.setSignalHandler(SIGTERM, SA_RESTART, &noteTerm);
  // Without SA_RESTART: the wait for a child must notice the SIGTERM that these become.
  onInterrupt_.setSignalHandler(SIGINT, 0, &turnIntoTerm);
  onAlarm_.setSignalHandler(SIGALRM, 0, &turnIntoTerm);
}

int InterruptWatch::received() {
  return firstSignal;
}

void InterruptWatch::check() {
  if (firstSignal != 0) {
    throw Interrupted();
  }
}

Undisturbed::Undisturbed() {
  onTerm_.setSignalHandler(SIGTERM, 0, SIG_IGN);
  onInterrupt_.setSignalHandler(SIGINT, 0, SIG_IGN);
  onAlarm_.setSignalHandler(SIGALRM, 0, SIG_IGN);
  ::alarm(0);
}
