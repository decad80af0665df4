#ifndef KOVABACKUP_TOOLS_PLATFORM_ERROR_H
#define KOVABACKUP_TOOLS_PLATFORM_ERROR_H

/// @file The platform's record of its last error, for messages.

#include <string>

namespace KOVA::Backup::Tool {

/// Empties the record, so that a later look tells whether anything has failed since.
void clearPlatformError();
bool hasPlatformError();

/// "the key file may be another's (platform error 0xf404 at core/secret_key.cpp:52)"; without the
/// words where the code is not known.
std::string platformError();

} // namespace KOVA::Backup::Tool

#endif
