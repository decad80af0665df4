#include "service/name_stack.h"

namespace KOVA::Backup::Service {

void NameStack::push(std::string_view name) {
  starts_.push_back(names_.size());
  names_ += name;
}

void NameStack::take(std::string &text) {
  text.append(names_, starts_.back());
  shrinkTo(size() - 1);
}

void NameStack::shrinkTo(std::size_t size) noexcept {
  if (size < starts_.size()) {
    names_.resize(starts_[size]);
    starts_.resize(size);
    release();
  }
}

// Frees what a large folder needed as its names are taken. Small buffers are kept.
void NameStack::release() noexcept {
  constexpr std::size_t kKept = 65536;
  if (names_.capacity() > kKept && names_.size() < names_.capacity() / 4) {
    names_.shrink_to_fit();
    starts_.shrink_to_fit();
  }
}

} // namespace KOVA::Backup::Service
