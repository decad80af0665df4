#ifndef KOVABACKUP_COMMON_RETRY_H
#define KOVABACKUP_COMMON_RETRY_H

/// @file A system call that a signal interrupted is made again. Not for close(2), which has then
/// closed already.

#include <cerrno>

namespace KOVA::Backup {

template <typename Call>
auto retrying(Call call) {
  auto result = call();
  while (result < 0 && errno == EINTR) {
    result = call();
  }
  return result;
}

} // namespace KOVA::Backup

#endif
