#ifndef KOVABACKUP_PATH_PATH_UTIL_MODULE_H
#define KOVABACKUP_PATH_PATH_UTIL_MODULE_H

/// @file The name under which all sources of path_util.h log. Support finds a message by this name
/// and its number, so it stays one name although the sources are several.

namespace KOVA::Backup {

inline constexpr char kPathUtilModule[] = "path/path_util";

} // namespace KOVA::Backup

#endif
