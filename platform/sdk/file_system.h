#ifndef KOVAPLATFORM_SDK_FILE_SYSTEM_H
#define KOVAPLATFORM_SDK_FILE_SYSTEM_H

/// @file Kinds of file systems, by the names that the mount table gives them.

#include <cstdint>
#include <string_view>

namespace KovaPlatform {

/// A kind of file system. code is the number of the volume's record (KOVA_VOL_FS_*).
struct FileSystem {
  std::int32_t code;
  bool keepsModes; ///< false: the mount's options decide all modes, and changing one may fail
};

/// The kind of that name if it holds data, else null. The kernel's own file systems, network file
/// systems, images and layers hold no data of volumes.
const FileSystem *findFileSystem(std::string_view name);

/// Code of the kind of that name; KOVA_VOL_FS_OTHER when findFileSystem returns null.
std::int32_t fileSystemCode(std::string_view name);

/// Whether directories on file systems of that code keep the modes that are set on them.
bool keepsModes(std::int32_t code);

} // namespace KovaPlatform

#endif
