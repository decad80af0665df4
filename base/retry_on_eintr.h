#ifndef KOVA_BASE_RETRY_ON_EINTR_H
#define KOVA_BASE_RETRY_ON_EINTR_H

/// @file Repeats a system call for as long as signals interrupt it. Not for close(2), which has
/// closed the descriptor even when it reports EINTR.

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
