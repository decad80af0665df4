#include "base/open_file.h"
#include "platform/core/secret_cipher.h"
#include "platform/core/secret_key.h"
#include "platform/support/failure.h"

#include <atomic>
#include <cstring>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>

using namespace KovaPlatform;

namespace {

constexpr const char *kFile = "core/crypt.cpp";

// The results of this interface; other services of the platform fail with -1.
constexpr int kDone = 1;
constexpr int kFailed = 0;

bool fits(std::size_t length, int size) {
  return size > 0 && length < static_cast<std::size_t>(size);
}

void copyOut(const void *text, std::size_t length, char *buf) {
  std::memcpy(buf, text, length);
  buf[length] = '\0';
}

// The size is checked before the key is loaded, so that a call that cannot succeed does not create
// a key file.
int encrypt(const char *plain, char *buf, int size) {
  const std::size_t length = std::strlen(plain);
  if (!fits(cipherLength(length), size)) {
    return fail({KLIBC_ERR_BUFFER_SIZE, kFile}, kFailed);
  }
  SecureBuffer key(kMasterKeyBytes);
  if (!loadMasterKey(key)) {
    return kFailed;
  }
  const std::string cipherText = encryptText(key, {plain, length});
  copyOut(cipherText.data(), cipherText.size(), buf);
  return kDone;
}

// The buffer is written last: callers count on an untouched one after a failure, and no text is
// shown before it is known to be authentic.
int decrypt(const char *cipher, char *buf, int size) {
  const std::string_view cipherText = cipher;
  const std::optional<std::size_t> length = textLength(cipherText.size());
  if (!length) {
    return fail({KLIBC_ERR_BAD_CIPHER, kFile}, kFailed);
  }
  if (!fits(*length, size)) {
    return fail({KLIBC_ERR_BUFFER_SIZE, kFile}, kFailed);
  }
  SecureBuffer key(kMasterKeyBytes);
  if (!loadMasterKey(key)) {
    return kFailed;
  }
  SecureBuffer text(*length);
  if (!decryptText(key, cipherText, text)) {
    return fail({KLIBC_ERR_BAD_CIPHER, kFile}, kFailed);
  }
  copyOut(text.data(), text.size(), buf);
  return kDone;
}

// More than the primitives use: they leave words of the text and of keys on the stack, such as the
// state of a hash, which the encryption library does not wipe.
constexpr std::size_t kStackBytes = 8192;

bool isRandomDevice(const char *path) {
  const KOVA::Base::UniqueFd fd = KOVA::Base::openFile(path, O_RDONLY);
  struct stat status {};
  return fd && ::fstat(fd.get(), &status) == 0 && S_ISCHR(status.st_mode);
}

// libsodium ends the process when it finds neither of its sources of random bytes, as in a chroot
// without /dev below a filter of system calls.
bool hasRandomness() {
  static std::atomic<bool> found{false};
  char byte = 0;
  found = found || ::getrandom(&byte, sizeof byte, 0) == sizeof byte ||
          isRandomDevice("/dev/urandom") || isRandomDevice("/dev/random");
  return found;
}

int run(int (*service)(const char *, char *, int), const char *text, char *buf, int size) {
  if (text == nullptr || buf == nullptr) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile}, kFailed);
  }
  // Does nothing after the first call; safe in any thread.
  if (!hasRandomness() || ::sodium_init() < 0) {
    return fail({KLIBC_ERR_CRYPT, kFile}, kFailed);
  }
  const int result =
      guarded({KLIBC_ERR_NO_MEMORY, kFile}, kFailed, [&] { return service(text, buf, size); });
  ::sodium_stackzero(kStackBytes);
  return result;
}

} // namespace

int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size) {
  return run(encrypt, plain, buf, size);
}

int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size) {
  return run(decrypt, cipher, buf, size);
}
