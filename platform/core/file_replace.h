#ifndef KOVAPLATFORM_CORE_FILE_REPLACE_H
#define KOVAPLATFORM_CORE_FILE_REPLACE_H

/// @file A file's new content, all at once: a reader sees the old file or the new one, whole, and
/// after a power cut one of the two is there.

#include "platform/core/regular_file.h"

#include <array>
#include <string_view>

namespace KovaPlatform {

using Content = std::array<std::string_view, 3>;

/// Puts the content in place of the file that was opened by this path, at the end of all links.
/// Located::Elsewhere: nothing was done, since the path leads to another file by now.
/// Located::Failed: the error is recorded; but for KLIBC_ERR_DIR_SYNC nothing has changed.
Located replaceContent(const char *path, const RegularFile &old, const Content &content);

} // namespace KovaPlatform

#endif
