#include "service/folder_id.h"

#include "base/retry_on_eintr.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/sysmacros.h>

namespace KOVA::Backup::Service {

Failed statEntry(int folder, const char *name, struct statx &out) {
  constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_EMPTY_PATH;
  constexpr unsigned kFields = STATX_BASIC_STATS | STATX_MNT_ID;
  const int result =
      Base::retryOnEintr([&] { return ::statx(folder, name, kFlags, kFields, &out); });
  return {"statx", result == 0 ? 0 : errno};
}

FolderId idOf(const struct statx &entry) {
  return {makedev(entry.stx_dev_major, entry.stx_dev_minor), entry.stx_ino};
}

} // namespace KOVA::Backup::Service
