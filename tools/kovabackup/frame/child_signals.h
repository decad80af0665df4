#ifndef KOVABACKUP_TOOLS_CHILD_SIGNALS_H
#define KOVABACKUP_TOOLS_CHILD_SIGNALS_H

/// @file What a command that waits for a program in the foreground does with signals.

#include "kovabackup/signal.h"

#include <array>

namespace KOVA::Backup::Tool {

/// While it exists, keys that end programs do not end this one. The terminal sends SIGINT and
/// SIGQUIT to the child as well, which decides what they mean, and we wait for it.
class LeaveKeysToTheChild {
public:
  LeaveKeysToTheChild();

private:
  std::array<ScopedTempSigHandler, 2> handlers_;
};

/// Makes children waitable. Our parent may have left SIGCHLD ignored; the kernel then reaps
/// children itself, and waiting for one fails.
void makeChildrenWaitable();

} // namespace KOVA::Backup::Tool

#endif
