#ifndef KOVABACKUP_SERVICE_FAILED_H
#define KOVABACKUP_SERVICE_FAILED_H

/// @file Sets an Error where a system call has failed.

#include "kovabackup/service/error.h"

#include <cerrno>
#include <string>

namespace KOVA::Backup::Service {

/// Sets all three members; code is errno unless it is given. Returns: false, for the caller to
/// return.
inline bool failed(Error &error, const char *step, const std::string &path = "", int code = errno) {
  error = {code, step, path};
  return false;
}

} // namespace KOVA::Backup::Service

#endif
