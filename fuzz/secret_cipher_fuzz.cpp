// Secrets: an operation, the master key and the bytes that it applies to. The cipher is compared
// with a plain use of libsodium by the description in secret_cipher.h. No cipher text is accepted
// but the one that a text has under this key: bytes that come from outside, changed cipher texts,
// and those of another key. The caller's buffer changes only with a success.
//
// Input: one byte for the size of the buffer, 32 for the key, one that chooses, and then the bytes.

#include "kovaplatform/kovacore.h"
#include "platform/core/secret_cipher.h"
#include "platform/core/secret_key.h"

#include "fuzz/support.h"

#include <array>
#include <cstring>
#include <optional>
#include <sodium.h>
#include <vector>

namespace {

std::string master; // what this target's loadMasterKey returns

} // namespace

// In place of the platform's, which reads a file.
bool KovaPlatform::loadMasterKey(SecureBuffer &key) {
  std::memcpy(key.data(), master.data(), master.size());
  return true;
}

namespace {

using KovaFuzz::require;
using KovaPlatform::kMasterKeyBytes;
using KovaPlatform::SecureBuffer;
using Bytes = std::vector<unsigned char>;

constexpr char kFill = '\x55';
// From here on a forger has one chance in 2^64 or fewer. Shorter texts have tags of 2 to 7 bytes,
// for which a forgery may turn out to be the cipher text of another text.
constexpr std::size_t kLongEnough = 12;

Bytes plainKey(std::uint64_t use) {
  Bytes key(32);
  require(::crypto_kdf_derive_from_key(key.data(), key.size(), use, "kovasecr",
                                       reinterpret_cast<const unsigned char *>(master.data())) ==
          0);
  return key;
}

Bytes plainHash(const Bytes &key, const std::string &text, std::size_t size) {
  Bytes hash(size);
  require(::crypto_generichash(hash.data(), size,
                               reinterpret_cast<const unsigned char *>(text.data()), text.size(),
                               key.data(), key.size()) == 0);
  return hash;
}

// The text XOR the key stream of its tag and length.
std::string plainStream(const std::string &tag, const std::string &text) {
  std::string seed = tag;
  seed.resize(16);
  const std::uint64_t length = text.size();
  for (std::size_t i = 0; i < 8; ++i) {
    seed += static_cast<char>(length >> (8 * i));
  }
  const Bytes nonce = plainHash(plainKey(2), seed, crypto_stream_xchacha20_NONCEBYTES);
  const Bytes key = plainKey(3);
  Bytes stream(text.size() + 1);
  require(::crypto_stream_xchacha20(stream.data(), stream.size(), nonce.data(), key.data()) == 0);
  std::string out = text;
  for (std::size_t i = 0; i < text.size(); ++i) {
    out[i] = static_cast<char>(static_cast<unsigned char>(text[i]) ^ stream[i]);
  }
  return out;
}

std::string plainBase64(const std::string &bytes) {
  static const char kDigits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
  std::string out;
  unsigned held = 0;
  int bits = 0;
  for (const char byte : bytes) {
    held = held << 8U | static_cast<unsigned char>(byte);
    for (bits += 8; bits >= 6; bits -= 6) {
      out += kDigits[held >> (bits - 6) & 63U];
    }
  }
  return bits == 0 ? out : out + kDigits[held << (6 - bits) & 63U];
}

std::string plainCipherText(const std::string &text) {
  const std::size_t tagSize = std::min<std::size_t>(16, text.size() / 2 + 2);
  const Bytes hash = plainHash(plainKey(1), text, 32);
  const std::string tag(hash.begin(), hash.begin() + static_cast<std::ptrdiff_t>(tagSize));
  return plainBase64(tag + plainStream(tag, text));
}

// The platform's service with a buffer of that size.
std::optional<std::string> serve(int (*service)(const char *, char *, int), const std::string &text,
                                 std::size_t size) {
  std::vector<char> buffer(size + 1, kFill);
  const int result = service(text.c_str(), buffer.data(), static_cast<int>(size));
  require(buffer.back() == kFill);
  if (result == 0) {
    require(std::count(buffer.begin(), buffer.end(), kFill) ==
            static_cast<std::ptrdiff_t>(buffer.size()));
    return std::nullopt;
  }
  require(result == 1);
  return std::string(buffer.data());
}

// Room is left for every text.
std::optional<std::string> decrypt(const std::string &cipherText) {
  return serve(&KLIBCCryptSzDecrypt, cipherText, cipherText.size() + 1);
}

void checkLengths(const std::string &text, const std::string &cipherText) {
  require(cipherText.size() == KovaPlatform::cipherLength(text.size()));
  require(cipherText.size() <= 2 * text.size() + 3);
  require(KovaPlatform::textLength(cipherText.size()) == text.size());
}

void checkText(const std::string &text, std::size_t room) {
  const std::string cipherText = plainCipherText(text);
  checkLengths(text, cipherText);
  const auto encrypted = serve(&KLIBCCryptSzEncrypt, text, room);
  require(encrypted ? *encrypted == cipherText && room > cipherText.size()
                    : room <= cipherText.size());
  const auto decrypted = serve(&KLIBCCryptSzDecrypt, cipherText, room);
  require(decrypted ? *decrypted == text && room > text.size() : room <= text.size());
}

// Whatever is accepted was made of that text with this key.
void checkForgery(const std::string &cipherText) {
  const auto length = KovaPlatform::textLength(cipherText.size());
  require(!length || KovaPlatform::cipherLength(*length) == cipherText.size());
  SecureBuffer text(length.value_or(0));
  SecureBuffer key(kMasterKeyBytes);
  (void)KovaPlatform::loadMasterKey(key);
  if (!length || !KovaPlatform::decryptText(key, cipherText, text)) {
    require(!decrypt(cipherText));
    require(::sodium_is_zero(text.data(), text.size()) == 1);
    return;
  }
  require(plainCipherText({text.data(), text.data() + text.size()}) == cipherText);
}

// It was made of another text or with another key.
void checkRefused(const std::string &cipherText) {
  checkForgery(cipherText);
  const auto length = KovaPlatform::textLength(cipherText.size());
  require(length.value_or(0) < kLongEnough || !decrypt(cipherText));
}

void changeByte(std::string &bytes, std::size_t at, unsigned change) {
  char &byte = bytes[at % bytes.size()];
  byte = static_cast<char>(static_cast<unsigned char>(byte) ^ (1 + change % 255));
}

void checkChanged(const std::string &text, std::size_t at, unsigned change) {
  std::string forged = plainCipherText(text);
  changeByte(forged, at, change);
  checkRefused(forged.c_str()); // the change may have made a NUL of it
}

void checkOtherKey(const std::string &text, std::size_t at, unsigned change) {
  const std::string cipherText = plainCipherText(text);
  changeByte(master, at, change);
  checkRefused(cipherText);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  require(::sodium_init() >= 0);
  KovaFuzz::Input input(data, size);
  const std::size_t room = input.byte();
  master = input.bytes(kMasterKeyBytes);
  master.resize(kMasterKeyBytes);
  const unsigned choice = input.byte() % 4;
  const std::size_t at = choice < 2 ? 0 : input.byte();
  const unsigned change = choice < 2 ? 0 : input.byte();
  const std::string bytes = input.rest().c_str();
  switch (choice) {
  case 0:
    checkText(bytes, room);
    break;
  case 1:
    checkForgery(bytes);
    break;
  case 2:
    checkChanged(bytes, at, change);
    break;
  default:
    checkOtherKey(bytes, at, change);
  }
  return 0;
}
