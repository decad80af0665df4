#ifndef KOVAPLATFORM_CORE_RETRY_H
#define KOVAPLATFORM_CORE_RETRY_H

/// @file A system call that a signal interrupted is made again. Not for close(2), which has then
/// closed already.

#include <cerrno>

namespace KovaPlatform {

template <typename Call>
auto retrying(Call call) {
  auto result = call();
  while (result < 0 && errno == EINTR) {
    result = call();
  }
  return result;
}

} // namespace KovaPlatform

#endif
