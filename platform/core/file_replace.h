#ifndef KOVAPLATFORM_CORE_FILE_REPLACE_H
#define KOVAPLATFORM_CORE_FILE_REPLACE_H

/// @file Replaces a file's content atomically: every reader, even after a power cut, finds either
/// the complete old content or the complete new content.

#include "platform/core/regular_file.h"

#include <array>
#include <string_view>

namespace KovaPlatform {

/// The new content: up to three parts that are written one after the other. Unused parts are empty.
using Content = std::array<std::string_view, 3>;

/// Replaces the content of old, the file that was opened through path. Symbolic links remain links.
/// Returns: Located::Yes when the new content is in place and durable.
///          Located::Elsewhere when path now leads to another file, or to none; nothing was done.
///          Located::Failed with the error recorded. With KLIBC_ERR_DIR_SYNC the new content is in
///          place but may not survive a power cut; with any other code nothing has changed.
Located replaceContent(const char *path, const RegularFile &old, const Content &content);

} // namespace KovaPlatform

#endif
