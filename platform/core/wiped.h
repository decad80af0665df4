#ifndef KOVAPLATFORM_CORE_WIPED_H
#define KOVAPLATFORM_CORE_WIPED_H

/// @file Bytes that are wiped before their memory is given back: keys and clear text.

#include <cstddef>
#include <memory>
#include <sodium.h>

namespace KovaPlatform {

class Wiped {
public:
  explicit Wiped(std::size_t size) : size_(size), bytes_(new unsigned char[size]()) {}
  ~Wiped() { ::sodium_memzero(bytes_.get(), size_); }
  Wiped(const Wiped &) = delete;
  Wiped &operator=(const Wiped &) = delete;

  unsigned char *data() { return bytes_.get(); }
  const unsigned char *data() const { return bytes_.get(); }
  std::size_t size() const { return size_; }

private:
  std::size_t size_;
  std::unique_ptr<unsigned char[]> bytes_;
};

} // namespace KovaPlatform

#endif
