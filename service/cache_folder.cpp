#include "service/cache_folder.h"

#include "service/tree_walk_folders.h"

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"

#include <array>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>

namespace KOVA::Backup::Service {
namespace {

constexpr char kTag[] = "CACHEDIR.TAG";
constexpr std::string_view kSignature = "Signature: 8a477f597d28d172789f06886806bc55";

// Opening a device can have effects, so the type is known first. Non-blocking, because a FIFO may
// have taken the file's place meanwhile.
Base::UniqueFd openTag(int folder) {
  constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  struct statx tag = {};
  if (statEntry(folder, kTag, tag) || !S_ISREG(tag.stx_mode)) {
    return Base::UniqueFd();
  }
  return Base::UniqueFd(Base::retryOnEintr([&] { return ::openat(folder, kTag, kFlags); }));
}

} // namespace

bool isCacheFolder(int folder) {
  const Base::UniqueFd tag = openTag(folder);
  std::array<char, kSignature.size()> text = {};
  std::size_t size = 0;
  while (tag && size < text.size()) {
    const ssize_t more = Base::retryOnEintr(
        [&] { return ::read(tag.get(), text.data() + size, text.size() - size); });
    if (more <= 0) {
      return false;
    }
    size += static_cast<std::size_t>(more);
  }
  return std::string_view(text.data(), size) == kSignature;
}

} // namespace KOVA::Backup::Service
