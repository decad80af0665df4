#include "tools/kovabackup/frame/child_signals.h"

#include <csignal>

namespace KOVA::Backup::Tool {
namespace {

void carryOn(int) {}

} // namespace

// Empty handlers rather than SIG_IGN, which the child would inherit.
LeaveKeysToTheChild::LeaveKeysToTheChild() {
  (void)handlers_[0].setSignalHandler(SIGINT, 0, carryOn); // true on every first call
  (void)handlers_[1].setSignalHandler(SIGQUIT, 0, carryOn);
}

void makeChildrenWaitable() {
  struct sigaction action = {};
  if (::sigaction(SIGCHLD, nullptr, &action) == 0 && action.sa_handler == SIG_IGN) {
    action.sa_handler = SIG_DFL;
    (void)::sigaction(SIGCHLD, &action, nullptr); // cannot fail for a signal that was just read
  }
}

} // namespace KOVA::Backup::Tool
