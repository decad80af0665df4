#ifndef KOVAPLATFORM_CORE_SECRET_CIPHER_H
#define KOVAPLATFORM_CORE_SECRET_CIPHER_H

/// @file Encryption of short texts into few characters.
///
///     tag         = keyed hash of the text, truncated to t bytes
///     body        = text XOR key stream, under a nonce that is a keyed hash of tag and length
///     cipher text = URL-safe base64 of tag and body, without padding
///
/// A text of n bytes becomes at most 2 * n + 3 characters, which leaves no room for a random nonce.
/// The nonce is derived from the tag instead, so that different texts get different key streams. t
/// is what fits, up to 16 bytes: 2 for an empty text, 6 for 8 bytes, 16 from 28 bytes on.
///
/// What this costs: equal texts have equal cipher texts, the length of a cipher text reveals n, and
/// one in 256^t forgeries passes a tag of t bytes.

#include "platform/core/secure_buffer.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace KovaPlatform {

/// Characters of the cipher text of a text of textBytes bytes.
std::size_t cipherLength(std::size_t textBytes);

/// Bytes of the text whose cipher text has cipherCharacters characters; none when there is no such
/// text.
std::optional<std::size_t> textLength(std::size_t cipherCharacters);

/// Encrypts a text. master has kMasterKeyBytes bytes.
std::string encryptText(const SecureBuffer &master, std::string_view text);

/// Decrypts a cipher text. text has the size that textLength returns for it.
/// Returns: false when the cipher text was not made with this key; text is zeroed then.
bool decryptText(const SecureBuffer &master, std::string_view cipherText, SecureBuffer &text);

} // namespace KovaPlatform

#endif
