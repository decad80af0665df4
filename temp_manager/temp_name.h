#ifndef KOVABACKUP_TEMP_MANAGER_TEMP_NAME_H
#define KOVABACKUP_TEMP_MANAGER_TEMP_NAME_H

/// @file The names of temporary files and folders, and the hash by which an owner of one checks
/// that its path is unchanged.
///
/// Failure: nothing is thrown but std::bad_alloc.
/// Threads: any; there is no state.

#include <cstdint>
#include <string>

namespace KOVA::Backup::TempName {

/// Whether a name ends in "XXXXXX" and therefore is a template already.
bool isTemplate(const std::string &name);

/// The template for a caller's name: the default for an empty name, the name itself when it is a
/// template, else the name followed by ".XXXXXX".
std::string templateFor(const std::string &name, const char *defaultTemplate);

/// Cuts a name so that, followed by ".XXXXXX", its last component has at most 255 bytes and its
/// path at most 4095. No UTF-8 character is split: the cut moves back to the first byte of the
/// character. The directory is never cut, and a name that ends in "/" is returned unchanged.
///     shortened("/d/" + 300 times "e") == "/d/" + 248 times "e"
/// Returns: a name, which may still be too long. When nothing of the last component remains, only
///          the path of the directory is left, so the file is made beside the directory; when that
///          path is ".", the name is empty.
std::string shortened(const std::string &name);

/// djb2 in its additive form, modulo 2^32: starting from 5381, h * 33 + byte for each byte.
///     hashOf("") == 5381   hashOf("a") == 177670
std::uint32_t hashOf(const std::string &path);

} // namespace KOVA::Backup::TempName

#endif
