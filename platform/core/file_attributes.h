#ifndef KOVAPLATFORM_CORE_FILE_ATTRIBUTES_H
#define KOVAPLATFORM_CORE_FILE_ATTRIBUTES_H

/// @file Owner, group, mode and extended attributes of a file that replaces another. Access control
/// lists are extended attributes.

#include "platform/core/regular_file.h"

namespace KovaPlatform {

/// Gives the new file what the old one has. The kernel's own measurements of a file's content
/// (security.ima, security.evm) are left out: they would be wrong for the new content.
/// Returns: false when something could not be kept; errno is that of the failing call.
bool copyAttributes(const RegularFile &from, int to);

} // namespace KovaPlatform

#endif
