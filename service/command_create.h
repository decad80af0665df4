#ifndef KOVA_SERVICE_COMMAND_CREATE_H
#define KOVA_SERVICE_COMMAND_CREATE_H

/// @file The creation of a child: the only place that lets a child run in the parent's memory.

#include "base/unique_fd.h"
#include "kovabackup/service/error.h"
#include "service/command_child.h"

#include <sys/types.h>

namespace KOVA::Backup::Service {

/// A child that was created; it may have ended already.
struct Child {
  pid_t pid = -1;
  Base::UniqueFd pidfd;
};

/// Creates a child that runs the plan. All signals must be blocked. When it returns and the plan's
/// sharesMemory is set, then the child has executed the program or ended.
/// Returns: false when there is no child; then error says why.
bool createChild(ChildPlan &plan, Child &child, Error &error);

} // namespace KOVA::Backup::Service

#endif
