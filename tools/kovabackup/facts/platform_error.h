#ifndef KOVABACKUP_TOOLS_PLATFORM_ERROR_H
#define KOVABACKUP_TOOLS_PLATFORM_ERROR_H

/// @file The platform's record of its last error, for messages.
///
///     clearPlatformError();
///     if (!map.optSectionExport(...)) throw Failure(kFailed, "...: " + platformError());

#include <string>

namespace KOVA::Backup::Tool {

/// Empties the record. The platform never does, so without this an old error could be reported.
void clearPlatformError();
bool hasPlatformError();

/// "the file cannot be read (platform error 0xf104 at core/section_file.cpp:52)"; for an unknown
/// code only the part in parentheses, without them.
std::string platformError();

} // namespace KOVA::Backup::Tool

#endif
