#ifndef KOVABACKUP_SERVICE_CACHE_FOLDER_H
#define KOVABACKUP_SERVICE_CACHE_FOLDER_H

/// @file Folders that programs mark as caches, whose contents can be made again.

namespace KOVA::Backup::Service {

/// Returns: whether an open folder holds a regular file CACHEDIR.TAG that begins with the signature
///          of cache folders. A file that cannot be read does not count.
bool isCacheFolder(int folder);

} // namespace KOVA::Backup::Service

#endif
