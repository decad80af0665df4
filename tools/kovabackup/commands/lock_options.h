#ifndef KOVABACKUP_TOOLS_LOCK_OPTIONS_H
#define KOVABACKUP_TOOLS_LOCK_OPTIONS_H

/// @file The options --lock and --lock-timeout of the commands that change a section file.

#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/cli.h"

#include <optional>
#include <string>

namespace KOVA::Backup::Tool {

struct LockOptions {
  std::optional<std::string> token;
  std::optional<std::string> timeout; ///< as it was typed
};

void declareLock(Command &command, LockOptions &options);

/// Errors: throws a Failure (wrong usage) for a time limit that is not valid or has no lock.
LockRequest lockRequest(const LockOptions &options);

} // namespace KOVA::Backup::Tool

#endif
