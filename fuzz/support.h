#ifndef KOVABACKUP_FUZZ_SUPPORT_H
#define KOVABACKUP_FUZZ_SUPPORT_H

/// @file What every fuzz target uses: the end of a run with a finding, and the input in pieces.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

namespace KovaFuzz {

/// Ends the run with a finding unless the property holds.
inline void require(bool holds) {
  if (!holds) {
    std::abort();
  }
}

/// What is left of an input. At its end there are zero bytes and empty texts.
class Input {
public:
  Input(const std::uint8_t *data, std::size_t size)
      : rest_(reinterpret_cast<const char *>(data), size) {}

  bool empty() const { return rest_.empty(); }

  unsigned byte() {
    const std::string one = bytes(1);
    return one.empty() ? 0 : static_cast<unsigned char>(one[0]);
  }

  std::string bytes(std::size_t count) {
    std::string taken(rest_.substr(0, count));
    rest_.remove_prefix(taken.size());
    return taken;
  }

  /// The text in front of the separator, which is removed, too; all of it when there is none.
  std::string until(char separator) {
    std::string taken(rest_.substr(0, rest_.find(separator)));
    rest_.remove_prefix(std::min(taken.size() + 1, rest_.size()));
    return taken;
  }

  std::string rest() { return bytes(rest_.size()); }

private:
  std::string_view rest_;
};

} // namespace KovaFuzz

#endif
