#ifndef KOVAPLATFORM_CORE_SECRET_CIPHER_H
#define KOVAPLATFORM_CORE_SECRET_CIPHER_H

/// @file Encryption of texts into few characters.
///
///     tag  = keyed hash of the text, cut to t bytes
///     body = text XOR key stream, under a nonce that is a keyed hash of tag and length
///     cipher text = URL-safe base64 of tag and body, without padding
///
/// A text of n bytes becomes at most 2 * n + 3 characters, which leaves no room for a random nonce:
/// the tag takes its place, so that different texts meet different key streams. t is what fits, up
/// to 16 bytes: 2 for no text at all, 6 for 8 bytes, 16 from 28 bytes on. Equal texts have equal
/// forms, the length of a cipher tells n, and what holds of a tag of t bytes is that one in 256^t
/// forgeries passes.

#include "platform/core/secure_buffer.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace KovaPlatform {

/// Characters of the cipher of a text of so many bytes.
std::size_t cipherLength(std::size_t textBytes);

/// Bytes of the text whose cipher has so many characters; none when no text's has.
std::optional<std::size_t> textLength(std::size_t cipherCharacters);

/// The cipher of a text. master has kMasterKeyBytes bytes.
std::string encryptText(const SecureBuffer &master, std::string_view text);

/// The text of a cipher. text has the size that textLength gives.
/// Returns: false when the cipher was not made from a text with this key; text is then zeroed.
bool decryptText(const SecureBuffer &master, std::string_view cipherText, SecureBuffer &text);

} // namespace KovaPlatform

#endif
