#ifndef KOVAPLATFORM_CORE_FILE_REPLACE_H
#define KOVAPLATFORM_CORE_FILE_REPLACE_H

/// @file Replaces a file's content atomically: a reader sees the complete old file or the complete
/// new one, and so does the next boot after a power cut.

#include "platform/core/regular_file.h"

#include <array>
#include <string_view>

namespace KovaPlatform {

/// The new content, in up to three parts that are written one after the other.
using Content = std::array<std::string_view, 3>;

/// Replaces the file that was opened by this path; symbolic links on the way stay links.
/// Located::Elsewhere: nothing was done, because the path leads to another file by now.
/// Located::Failed: the error is recorded. Nothing has changed unless it is KLIBC_ERR_DIR_SYNC,
/// with which the new content is in place.
Located replaceContent(const char *path, const RegularFile &old, const Content &content);

} // namespace KovaPlatform

#endif
