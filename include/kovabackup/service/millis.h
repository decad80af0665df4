#ifndef KOVABACKUP_SERVICE_MILLIS_H
#define KOVABACKUP_SERVICE_MILLIS_H

/// @file The unit of time limits.
///
/// Threads: as any value.

#include <chrono>

namespace KOVA::Backup::Service {

/// A time span. Where it limits a wait, a negative one means: no limit.
using Millis = std::chrono::milliseconds;

} // namespace KOVA::Backup::Service

#endif
