#ifndef KOVAPLATFORM_CORE_SECRET_KEY_H
#define KOVAPLATFORM_CORE_SECRET_KEY_H

/// @file The master key of this machine, from which the keys of its secrets are derived.

#include "platform/core/secure_buffer.h"

namespace KovaPlatform {

constexpr std::size_t kMasterKeyBytes = 32;

/// Reads the key from its file: the one that the platform's configuration names, or
/// /var/lib/kovaplatform/secret.key. A key that is not there yet is made, and the folder that it
/// stands in (mode 0700); of several processes that do so at once one wins and all get its key. The
/// file holds the bare bytes, mode 0600; links to it are followed. It is read anew by every call.
/// Returns: true with the key in the kMasterKeyBytes bytes of key; on false the error is recorded.
/// errno:   as the failing system call left it.
bool loadMasterKey(SecureBuffer &key);

} // namespace KovaPlatform

#endif
