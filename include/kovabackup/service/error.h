#ifndef KOVABACKUP_SERVICE_ERROR_H
#define KOVABACKUP_SERVICE_ERROR_H

/// @file Why an operation of libkovabackup-service failed.
///
///     Error error;
///     if (!file.publish(error)) {
///       std::fprintf(stderr, "%s %s: %s\n", error.step.c_str(), error.path.c_str(),
///                    std::strerror(error.code));
///     }
///
/// Threads: as any value.

#include <ctime>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

// Every header of the library that declares a structure with a time includes this one.
static_assert(sizeof(std::time_t) == 8,
              "time_t must have 64 bits on 32-bit machines too: compile with -D_TIME_BITS=64 "
              "-D_FILE_OFFSET_BITS=64, which kovabackup::service and its pkg-config file add");

/// The system call that failed, on what, and why. A default-constructed Error means no failure.
struct Error {
  int code = 0;     ///< errno of the failed call, 0 for no failure
  std::string step; ///< the call: "openat", "fsync"
  std::string path; ///< the object of the call, "" when it has no path
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
