#ifndef KOVAPLATFORM_CORE_FILE_ATTRIBUTES_H
#define KOVAPLATFORM_CORE_FILE_ATTRIBUTES_H

/// @file Owner, group, mode and extended attributes (access control lists are such) of a file that
/// takes another's place.

#include "platform/core/regular_file.h"

namespace KovaPlatform {

/// Gives the new file what the old one has. Left out are the kernel's own measurements of a file's
/// content (security.ima, security.evm), which would be false.
/// Returns: false when something could not be kept; errno is the failing call's.
bool copyAttributes(const RegularFile &from, int to);

} // namespace KovaPlatform

#endif
