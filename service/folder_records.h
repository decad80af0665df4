#ifndef KOVABACKUP_SERVICE_FOLDER_RECORDS_H
#define KOVABACKUP_SERVICE_FOLDER_RECORDS_H

/// @file Reads the names in an open folder, in the order of the file system, with one buffer for
/// any number of folders.
///
/// The names are those of the kernel: never "." or ".." here, and none contains a "/".

#include "base/retry_on_eintr.h"

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <dirent.h>
#include <memory>
#include <string_view>
#include <sys/types.h>

namespace KOVA::Backup::Service {

class FolderRecords {
public:
  FolderRecords() : buffer_(new char[kSize]) {}

  /// Calls visit(const char *name, unsigned char type) for each name, with type as in dirent(3).
  /// visit may remove the name.
  /// Returns: 0, or the errno of getdents64; names that were read before the failure are visited.
  template <typename Visit>
  int read(int folder, Visit visit) {
    for (;;) {
      const ssize_t size =
          Base::retryOnEintr([&] { return ::getdents64(folder, buffer_.get(), kSize); });
      if (size <= 0) {
        return size == 0 ? 0 : errno;
      }
      visitAll(buffer_.get(), buffer_.get() + size, visit);
    }
  }

private:
  static constexpr std::size_t kSize = 32768;

  template <typename Visit>
  static void visitAll(const char *record, const char *end, Visit &visit) {
    while (record != end) {
      decltype(dirent64::d_reclen) size = 0;
      std::memcpy(&size, record + offsetof(dirent64, d_reclen), sizeof size);
      const char *const name = record + offsetof(dirent64, d_name);
      if (!isDots(name)) {
        visit(name, static_cast<unsigned char>(record[offsetof(dirent64, d_type)]));
      }
      record += size;
    }
  }

  static bool isDots(const char *name) {
    return name[0] == '.' && (name[1] == '\0' || (name[1] == '.' && name[2] == '\0'));
  }

  std::unique_ptr<char[]> buffer_;
};

} // namespace KOVA::Backup::Service

#endif
