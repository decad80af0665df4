#ifndef KOVABACKUP_SERVICE_ABSENCE_H
#define KOVABACKUP_SERVICE_ABSENCE_H

/// @file Which errno says that something is not there, in contrast to something that may be there
/// and could not be examined.

#include <cerrno>

namespace KOVA::Backup::Service {

/// Nothing has that path.
inline bool isAbsence(int code) {
  return code == ENOENT || code == ENOTDIR;
}

/// The process of a file in /proc has ended, or has closed the descriptor that the file stands for.
/// ESRCH comes from files that were opened before.
inline bool isEndOfProcess(int code) {
  return code == ENOENT || code == ESRCH;
}

} // namespace KOVA::Backup::Service

#endif
