#include "service/tree_walk_names.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <endian.h>
#include <string>
#include <string_view>
#include <vector>

namespace KOVA::Backup::Service {
namespace {

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
    names_.push_back({prefixOf(name), text_.size(), name.size()});
    text_ += name;
  }

  void sortDescending() {
    std::sort(names_.begin(), names_.end(), [this](const Name &one, const Name &other) {
      return one.prefix != other.prefix ? one.prefix > other.prefix : view(one) > view(other);
    });
  }

  const std::vector<Name> &names() const { return names_; }
  std::string_view view(const Name &name) const {
    return std::string_view(text_).substr(name.start, name.size);
  }

private:
  std::vector<Name> names_;
  std::string text_;
};

} // namespace

int DueNames::add(int folder) {
  Listing listing;
  const int error =
      records_.read(folder, [&](const char *name, unsigned char /*type*/) { listing.add(name); });
  listing.sortDescending();
  for (const Name &name : listing.names()) {
    push(listing.view(name));
  }
  return error;
}

} // namespace KOVA::Backup::Service
