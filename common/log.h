#ifndef KOVABACKUP_COMMON_LOG_H
#define KOVABACKUP_COMMON_LOG_H

/// @file The log lines of the library's modules: those of base/log_line.h, and the platform's last
/// error, which some of them contain.

#include "base/log_line.h"
#include "kovaplatform/kovacore.h"

namespace KOVA::Backup {

namespace Log = Base::Log;

/// The platform's last error, to be read before another call can replace it. Log lines print it as
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
