#ifndef KOVABACKUP_TOOLS_PLATFORM_ERROR_H
#define KOVABACKUP_TOOLS_PLATFORM_ERROR_H

/// @file The platform's record of its last error, for messages.
///
///     clearPlatformError();
///     if (!map.optSectionExport(...)) throw Failure(kFailed, "...: " + platformError());

#include <string>

namespace KOVA::Backup::Tool {

/// Empties the record. Call it before the platform function whose error is to be reported: the
/// platform itself never empties the record, so an older error could be reported instead.
void clearPlatformError();
bool hasPlatformError();

/// The recorded error in words, followed by its code and place: "the file cannot be read (platform
/// error 0xf303 at core/regular_file.cpp:85)". A mistake in the platform's configuration begins
/// with its place: "/etc/kovaplatform/platform.conf:2: unknown key 'sise' (platform error 0x3105)".
/// A code that has no words gives "platform error 0x... at ..." alone. Call it only after a
/// failure: an empty record gives code 0.
std::string platformError();

/// The same with words of the caller's, who knows more.
std::string platformError(const std::string &words);

/// What a code means; "" for a code that has no words.
std::string platformErrorWords(int code);

} // namespace KOVA::Backup::Tool

#endif
