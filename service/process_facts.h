#ifndef KOVABACKUP_SERVICE_PROCESS_FACTS_H
#define KOVABACKUP_SERVICE_PROCESS_FACTS_H

/// @file Other processes, as /proc shows them.

#include <cstdint>
#include <string>
#include <string_view>
#include <sys/stat.h>
#include <sys/types.h>

namespace KOVA::Backup::Service {

struct ProcessFacts {
  std::string command;     ///< its name, at most 15 bytes
  std::uint64_t start = 0; ///< when it started; a later process with the same PID has another
};

/// Reads what /proc/PID/stat contains.
/// Returns: true with out set; false, with out untouched, for any other text and for a process that
///          has ended.
bool readProcessFacts(std::string_view line, ProcessFacts &out);

/// Looks at a process.
/// Returns: true with out set; false when it has ended, even if it is not reaped yet, or when /proc
///          does not show it.
bool findProcess(pid_t pid, ProcessFacts &out);

enum class Opens { Yes, No, Unknown };

/// Whether a process has a file open. Unknown when not all of its descriptors can be examined. That
/// requires root, or the user of the process with every capability that the process has.
Opens hasOpen(pid_t pid, const struct stat &file);

} // namespace KOVA::Backup::Service

#endif
