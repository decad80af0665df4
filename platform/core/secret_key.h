#ifndef KOVAPLATFORM_CORE_SECRET_KEY_H
#define KOVAPLATFORM_CORE_SECRET_KEY_H

/// @file This machine's master key, from which the keys of its secrets are derived.

#include "platform/core/secure_buffer.h"

namespace KovaPlatform {

constexpr std::size_t kMasterKeyBytes = 32;

/// Reads the key from its file: the one that the platform's configuration names, or
/// /var/lib/kovaplatform/secret.key. The first use creates the file and, with mode 0700, its
/// folder. When several processes do so at the same time, one wins and all of them get its key. The
/// file holds nothing but the bytes of the key and has mode 0600; symbolic links to it are
/// followed. Every call reads it again. Returns: true with the key in the kMasterKeyBytes bytes of
/// key; on false the error is recorded. errno:   as the failing system call left it.
bool loadMasterKey(SecureBuffer &key);

} // namespace KovaPlatform

#endif
