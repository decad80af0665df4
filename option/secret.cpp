#include "option/secret.h"

#include "common/log.h"
#include "kovaplatform/kovacore.h"
#include "option/option_map_private.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

namespace KOVA::Backup {
namespace {

constexpr std::size_t kSmallestClearBuffer = 10;

// A zeroed buffer that is overwritten before its memory is released.
class SecretBuffer {
public:
  explicit SecretBuffer(std::size_t size) : size_(size) {
    if (size > INT_MAX) {
      errno = ENOMEM; // the platform takes a size as int
      return;
    }
    data_ = static_cast<char *>(::calloc(1, size));
  }
  ~SecretBuffer() {
    if (data_ != nullptr) {
      ::explicit_bzero(data_, size_);
      ::free(data_);
    }
  }
  SecretBuffer(const SecretBuffer &) = delete;
  SecretBuffer &operator=(const SecretBuffer &) = delete;

  explicit operator bool() const { return data_ != nullptr; }
  char *data() const { return data_; }
  int size() const { return static_cast<int>(size_); }
  std::string text() const { return std::string(data_, ::strnlen(data_, size_)); }

private:
  std::size_t size_;
  char *data_ = nullptr;
};

// Encryption, too, reports under the name of the decrypt function: support knows the message by it.
void logCryptFailed(int number) {
  const auto error = PlatformError::last();
  Log::error(kOptionModule, number, "KLIBCCryptSzDecrypt: [0x%04X %s:%d]", error.code, error.file,
             error.line);
}

} // namespace

ClearText::~ClearText() {
  ::explicit_bzero(text.data(), text.size());
}

std::string secretEncrypt(const std::string &clear) {
  const SecretBuffer buffer(2 * (clear.size() + 2));
  if (!buffer) {
    Log::error(kOptionModule, 148, "calloc: %m");
    return std::string();
  }
  if (KLIBCCryptSzEncrypt(clear.c_str(), buffer.data(), buffer.size()) == 0) {
    logCryptFailed(152);
    return std::string();
  }
  return buffer.text();
}

std::string secretDecrypt(const std::string &cipher) {
  // Deliberately without asking the platform, whereas an empty clear text is passed to it.
  if (cipher.empty()) {
    return std::string();
  }
  const SecretBuffer buffer(std::max(cipher.size(), kSmallestClearBuffer));
  if (!buffer) {
    Log::error(kOptionModule, 128, "calloc: %m");
    return std::string();
  }
  if (KLIBCCryptSzDecrypt(cipher.c_str(), buffer.data(), buffer.size()) == 0) {
    logCryptFailed(132);
    return std::string();
  }
  return buffer.text();
}

} // namespace KOVA::Backup
