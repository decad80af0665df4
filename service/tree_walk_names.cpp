#include "service/tree_walk_names.h"

#include "base/retry_on_eintr.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <dirent.h>
#include <endian.h>
#include <string_view>

namespace KOVA::Backup::Service {
namespace {

constexpr std::size_t kBufferSize = 32768;

struct Name {
  std::uint64_t prefix; // the first eight bytes as a number, which settles most comparisons
  std::size_t start;
  std::size_t size;
};

std::uint64_t prefixOf(std::string_view name) {
  std::uint64_t bytes = 0;
  std::memcpy(&bytes, name.data(), std::min(name.size(), sizeof bytes));
  return be64toh(bytes);
}

// The names of one folder in the order of the file system.
class Listing {
public:
  void add(std::string_view name) {
    if (name != "." && name != "..") {
      names_.push_back({prefixOf(name), text_.size(), name.size()});
      text_ += name;
    }
  }

  void sortDescending() {
    std::sort(names_.begin(), names_.end(), [this](const Name &one, const Name &other) {
      return one.prefix != other.prefix ? one.prefix > other.prefix : view(one) > view(other);
    });
  }

  const std::vector<Name> &names() const { return names_; }
  std::size_t textSize() const { return text_.size(); }
  std::string_view view(const Name &name) const {
    return std::string_view(text_).substr(name.start, name.size);
  }

private:
  std::vector<Name> names_;
  std::string text_;
};

void addRecords(const char *record, const char *end, Listing &listing) {
  while (record != end) {
    decltype(dirent64::d_reclen) size = 0;
    std::memcpy(&size, record + offsetof(dirent64, d_reclen), sizeof size);
    listing.add(record + offsetof(dirent64, d_name));
    record += size;
  }
}

int readAll(int folder, char *buffer, Listing &listing) {
  for (;;) {
    const ssize_t size =
        Base::retryOnEintr([&] { return ::getdents64(folder, buffer, kBufferSize); });
    if (size <= 0) {
      return size == 0 ? 0 : errno;
    }
    addRecords(buffer, buffer + size, listing);
  }
}

} // namespace

DueNames::DueNames() : buffer_(new char[kBufferSize]) {}

int DueNames::add(int folder) {
  Listing listing;
  const int error = readAll(folder, buffer_.get(), listing);
  listing.sortDescending();
  for (const Name &name : listing.names()) {
    starts_.push_back(names_.size());
    names_ += listing.view(name);
  }
  return error;
}

void DueNames::take(std::string &text) {
  text.append(names_, starts_.back());
  shrinkTo(size() - 1);
}

void DueNames::shrinkTo(std::size_t size) noexcept {
  if (size < starts_.size()) {
    names_.resize(starts_[size]);
    starts_.resize(size);
    release();
  }
}

// Frees what a large folder needed as its names are taken. Small buffers are kept.
void DueNames::release() noexcept {
  constexpr std::size_t kKept = 65536;
  if (names_.capacity() > kKept && names_.size() < names_.capacity() / 4) {
    names_.shrink_to_fit();
    starts_.shrink_to_fit();
  }
}

} // namespace KOVA::Backup::Service
