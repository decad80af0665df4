#ifndef KOVABACKUP_COMMON_LOG_H
#define KOVABACKUP_COMMON_LOG_H

/// @file What a module of the library writes to the system log: lines as base/log_line.h describes
/// them, and in some of them the platform's last error.

#include "base/log_line.h"
#include "kovaplatform/kovacore.h"

namespace KOVA::Backup {

namespace Log = Base::Log;

/// The platform's last error, read before anything else can replace it. A line prints it as
/// "[0x%04X %s:%d]" with code, file and line.
struct PlatformError {
  unsigned int code;
  const char *file;
  int line;

  static PlatformError last() {
    return {static_cast<unsigned int>(KLIBCErrGet()), KLIBCErrorGetFile(), KLIBCErrorGetLine()};
  }
};

} // namespace KOVA::Backup

#endif
