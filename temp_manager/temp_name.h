#ifndef KOVABACKUP_TEMP_MANAGER_TEMP_NAME_H
#define KOVABACKUP_TEMP_MANAGER_TEMP_NAME_H

/// @file How names of temporary files and folders are made up, and the hash that guards a path.
///
/// Failure: nothing is thrown but std::bad_alloc.
/// Threads: any; nothing is kept.

#include <cstdint>
#include <string>

namespace KOVA::Backup::TempName {

/// Whether a name ends in "XXXXXX" and so is a template already.
bool isTemplate(const std::string &name);

/// The template for a caller's name: the default for an empty one, the name itself when it is a
/// template, else the name with ".XXXXXX".
std::string templateFor(const std::string &name, const char *defaultTemplate);

/// A name cut so that with ".XXXXXX" its last component has at most 255 bytes and its path at most
/// 4095. No UTF-8 character is split: the cut steps back to the first byte of one. The directory is
/// never cut, and a name that ends in "/" comes back as it is.
///     shortened("/d/" + 300 times "e") == "/d/" + 248 times "e"
/// Returns: a name, which may still be too long. Of a last component that must go whole only the
///          directory's path is left, so that the file stands beside the directory; of "." nothing.
std::string shortened(const std::string &name);

/// djb2 in its additive form, modulo 2^32: from 5381 on, h * 33 + byte.
///     hashOf("") == 5381   hashOf("a") == 177670
std::uint32_t hashOf(const std::string &path);

} // namespace KOVA::Backup::TempName

#endif
