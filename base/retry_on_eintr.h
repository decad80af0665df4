#ifndef KOVA_BASE_RETRY_ON_EINTR_H
#define KOVA_BASE_RETRY_ON_EINTR_H

/// @file A system call that a signal interrupted is made again. Not for close(2), which has then
/// closed already.

#include <cerrno>

namespace KOVA::Base {

template <typename Call>
auto retryOnEintr(Call call) {
  auto result = call();
  while (result < 0 && errno == EINTR) {
    result = call();
  }
  return result;
}

} // namespace KOVA::Base

#endif
