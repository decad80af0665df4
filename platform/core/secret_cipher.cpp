#include "platform/core/secret_cipher.h"

#include "platform/core/secret_key.h"

#include <algorithm>
#include <cstdint>
#include <cstring>

namespace KovaPlatform {
namespace {

constexpr std::size_t kMaxTagBytes = 16;
constexpr std::size_t kHashBytes = 32;
constexpr int kBase64 = sodium_base64_VARIANT_URLSAFE_NO_PADDING;
constexpr char kContext[] = "kovasecr"; // separates these keys from others of the same master
constexpr std::string_view kAlphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";

static_assert(sizeof kContext == crypto_kdf_CONTEXTBYTES + 1);
static_assert(kMasterKeyBytes == crypto_kdf_KEYBYTES);

// A separate key for each use, so that what one primitive reveals of its key helps against no
// other. The uses are numbered in this order; another order would make old cipher texts unreadable.
class Keys {
public:
  explicit Keys(const SecureBuffer &master) {
    std::uint64_t use = 0;
    for (SecureBuffer *key : {&tag, &nonce, &stream}) {
      (void)::crypto_kdf_derive_from_key(key->data(), key->size(), ++use, kContext, master.data());
    }
  }

  SecureBuffer tag{crypto_generichash_KEYBYTES};
  SecureBuffer nonce{crypto_generichash_KEYBYTES};
  SecureBuffer stream{crypto_stream_xchacha20_KEYBYTES};
};

// As many bytes as keep the cipher text within the limit that callers' buffers have, 2 * (n + 2)
// bytes with the NUL, and no more than 16, which no forger can guess.
std::size_t tagBytes(std::size_t textBytes) {
  return std::min(kMaxTagBytes, textBytes / 2 + 2);
}

std::size_t base64Length(std::size_t bytes) {
  return (bytes * 4 + 2) / 3;
}

// The full hash, of which a tag is the first bytes.
void hashText(const Keys &keys, const unsigned char *text, std::size_t size, SecureBuffer &hash) {
  (void)::crypto_generichash(hash.data(), hash.size(), text, size, keys.tag.data(),
                             keys.tag.size());
}

// Turns a text into a body or a body into a text; in and out may be the same. The length is part of
// what the nonce is made of, because short tags are padded with zeros: two texts of different
// lengths never share a nonce by the padding alone. It is written byte by byte, so that a key file
// that moves to a machine of the other byte order still decrypts.
void applyStream(const Keys &keys, const unsigned char *tag, const unsigned char *in,
                 std::size_t size, unsigned char *out) {
  unsigned char tagAndLength[kMaxTagBytes + sizeof(std::uint64_t)] = {};
  const std::uint64_t length = size;
  std::memcpy(tagAndLength, tag, tagBytes(size));
  for (std::size_t i = 0; i < sizeof length; ++i) {
    tagAndLength[kMaxTagBytes + i] = static_cast<unsigned char>(length >> (8 * i));
  }
  unsigned char nonce[crypto_stream_xchacha20_NONCEBYTES];
  (void)::crypto_generichash(nonce, sizeof nonce, tagAndLength, sizeof tagAndLength,
                             keys.nonce.data(), keys.nonce.size());
  (void)::crypto_stream_xchacha20_xor(out, in, size, nonce, keys.stream.data());
}

} // namespace

std::size_t cipherLength(std::size_t textBytes) {
  return base64Length(tagBytes(textBytes) + textBytes);
}

std::optional<std::size_t> textLength(std::size_t cipherCharacters) {
  const std::size_t bytes = cipherCharacters / 4 * 3 + cipherCharacters % 4 * 3 / 4; // tag and body
  // The two inverses of tagBytes: a tag of 16 bytes, and one of n / 2 + 2. Both are only
  // candidates; the length that they would give decides, since not every number of characters can
  // occur. Fewer than 16 bytes make the first difference wrap around, which text <= bytes rules
  // out.
  for (const std::size_t text : {bytes - kMaxTagBytes, (bytes * 2 - 2) / 3}) {
    if (bytes >= 2 && text <= bytes && cipherLength(text) == cipherCharacters) {
      return text;
    }
  }
  return std::nullopt;
}

std::string encryptText(const SecureBuffer &master, std::string_view text) {
  const Keys keys(master);
  const auto *const clear = reinterpret_cast<const unsigned char *>(text.data());
  const std::size_t tagSize = tagBytes(text.size());
  SecureBuffer hash(kHashBytes);
  hashText(keys, clear, text.size(), hash);
  std::string sealed(tagSize + text.size(), '\0');
  auto *const bytes = reinterpret_cast<unsigned char *>(sealed.data());
  std::memcpy(bytes, hash.data(), tagSize);
  applyStream(keys, bytes, clear, text.size(), bytes + tagSize);
  std::string cipherText(cipherLength(text.size()) + 1, '\0'); // the encoder writes a NUL, too
  (void)::sodium_bin2base64(cipherText.data(), cipherText.size(), bytes, sealed.size(), kBase64);
  cipherText.pop_back();
  return cipherText;
}

bool decryptText(const SecureBuffer &master, std::string_view cipherText, SecureBuffer &text) {
  const std::size_t tagSize = tagBytes(text.size());
  std::string sealed(tagSize + text.size(), '\0');
  auto *const bytes = reinterpret_cast<unsigned char *>(sealed.data());
  std::size_t decoded = 0;
  // Some versions of the decoder accept bytes above 0x7f as letters, hence the alphabet. The
  // decoder itself refuses spare bits that are not zero, so every text has exactly one cipher text.
  if (cipherText.find_first_not_of(kAlphabet) != std::string_view::npos ||
      ::sodium_base642bin(bytes, sealed.size(), cipherText.data(), cipherText.size(), nullptr,
                          &decoded, nullptr, kBase64) != 0 ||
      decoded != sealed.size()) {
    return false;
  }
  const Keys keys(master);
  applyStream(keys, bytes, bytes + tagSize, text.size(), text.data());
  SecureBuffer hash(kHashBytes);
  hashText(keys, text.data(), text.size(), hash);
  // In constant time: the position of the first difference would help a forger.
  const bool authentic = ::sodium_memcmp(hash.data(), bytes, tagSize) == 0;
  if (!authentic) {
    ::sodium_memzero(text.data(), text.size());
  }
  return authentic;
}

} // namespace KovaPlatform
