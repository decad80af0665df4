#include "kovabackup/signal.h"

#include "common/log.h"

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "proc/signal";

bool readAction(int sig, int number, struct sigaction &action) {
  if (::sigaction(sig, nullptr, &action) != 0) {
    Log::error(kModule, number, "sigaction get org failed: %m");
    return false;
  }
  return true;
}

bool writeFlags(int sig, int number, struct sigaction action, int flags) {
  action.sa_flags = flags;
  if (::sigaction(sig, &action, nullptr) != 0) {
    Log::error(kModule, number, "sigaction set flags failed: %m");
    return false;
  }
  return true;
}

struct sigaction actionOf(void (*handler)(int), int flags) {
  struct sigaction action = {}; // the mask is empty, too
  action.sa_handler = handler;
  action.sa_flags = flags;
  return action;
}

} // namespace

bool signalHandlerSet(int sig, void (*handler)(int)) {
  sigset_t set;
  if (::sigemptyset(&set) != 0) {
    Log::error(kModule, 17, "sigemptyset [%d]: %m", sig);
    return false;
  }
  if (::sigaddset(&set, sig) != 0) {
    Log::error(kModule, 21, "sigaddset [%d]: %m", sig);
    return false;
  }
  if (::sigprocmask(SIG_UNBLOCK, &set, nullptr) != 0) {
    Log::error(kModule, 26, "sigprocmask [%d]: %m", sig);
    return false;
  }
  const struct sigaction action = actionOf(handler, SA_RESTART);
  if (::sigaction(sig, &action, nullptr) != 0) {
    Log::error(kModule, 36, "sigaction [%d]: %m", sig);
    return false;
  }
  return true;
}

bool signalHandlerSetFlags(int sig, int flags) {
  struct sigaction action = {};
  return readAction(sig, 49, action) && writeFlags(sig, 56, action, flags);
}

bool signalHandlerAddFlags(int sig, int flags, int &oldFlags) {
  struct sigaction action = {};
  if (!readAction(sig, 68, action)) {
    return false;
  }
  oldFlags = action.sa_flags;
  return writeFlags(sig, 77, action, oldFlags | flags);
}

bool signalHandlerRemoveFlags(int sig, int flags, int &oldFlags) {
  struct sigaction action = {};
  if (!readAction(sig, 89, action)) {
    return false;
  }
  oldFlags = action.sa_flags;
  return writeFlags(sig, 98, action, oldFlags & ~flags);
}

ScopedTempSigHandler::ScopedTempSigHandler() : signum_(0), savedAction_() {}

ScopedTempSigHandler::~ScopedTempSigHandler() {
  if (signum_ >= 1) {
    // A destructor cannot report a failure.
    (void)::sigaction(signum_, &savedAction_, nullptr);
  }
}

bool ScopedTempSigHandler::setSignalHandler(int sig, int flags, void (*handler)(int)) {
  if (signum_ >= 1) {
    Log::error(kModule, 124, "failed to set signal handler: original signum [%d]", signum_);
    return false;
  }
  signum_ = sig;
  const struct sigaction action = actionOf(handler, flags);
  // Deliberately unchecked: false means only that the object is in use already.
  (void)::sigaction(sig, &action, &savedAction_);
  return true;
}

} // namespace KOVA::Backup
