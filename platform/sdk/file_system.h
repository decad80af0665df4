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

/// The kind that holds data under a name, or null: file systems of the kernel's own, network
/// file systems, images and layers are no volumes.
const FileSystem *findFileSystem(std::string_view name);

/// Code of a name; KOVA_VOL_FS_OTHER when findFileSystem knows none.
std::int32_t fileSystemCode(std::string_view name);

/// Whether directories of that code keep the modes that are set on them.
bool keepsModes(std::int32_t code);

} // namespace KovaPlatform

#endif
