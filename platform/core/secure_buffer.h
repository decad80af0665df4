#ifndef KOVAPLATFORM_CORE_SECURE_BUFFER_H
#define KOVAPLATFORM_CORE_SECURE_BUFFER_H

/// @file Bytes that are wiped before their memory is freed: keys and clear text.

#include <cstddef>
#include <memory>
#include <sodium.h>

namespace KovaPlatform {

/// A zeroed buffer of fixed size. It neither grows nor moves, so no copy of its bytes is left
/// behind, and it is wiped with a function that the compiler may not leave out.
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
