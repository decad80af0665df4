#ifndef KOVAPLATFORM_CORE_SECURE_BUFFER_H
#define KOVAPLATFORM_CORE_SECURE_BUFFER_H

/// @file Bytes that are wiped before their memory is given back: keys and clear text.

#include <cstddef>
#include <memory>
#include <sodium.h>

namespace KovaPlatform {

class SecureBuffer {
public:
  explicit SecureBuffer(std::size_t size) : size_(size), bytes_(new unsigned char[size]()) {}
  ~SecureBuffer() { ::sodium_memzero(bytes_.get(), size_); }
  SecureBuffer(const SecureBuffer &) = delete;
  SecureBuffer &operator=(const SecureBuffer &) = delete;

  unsigned char *data() { return bytes_.get(); }
  const unsigned char *data() const { return bytes_.get(); }
  std::size_t size() const { return size_; }

private:
  std::size_t size_;
  std::unique_ptr<unsigned char[]> bytes_;
};

} // namespace KovaPlatform

#endif
