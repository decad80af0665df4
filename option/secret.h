#ifndef KOVABACKUP_OPTION_SECRET_H
#define KOVABACKUP_OPTION_SECRET_H

/// @file Encrypts and decrypts secret options with the platform's key.
///
///     const std::string cipher = secretEncrypt("open sesame");
///     const ClearText clear{secretDecrypt(cipher)};
///     ...use clear.text...                           // overwritten when clear goes out of scope
///
/// Failure: returns "" and logs why. secretDecrypt also returns "" for an empty secret, without a
/// log
///          line. Only std::bad_alloc is thrown.
/// Log:     LOG_ERR lines under the module path "option_map".
/// Threads: any that may call KLIBCCryptSzEncrypt and KLIBCCryptSzDecrypt.

#include <string>

namespace KOVA::Backup {

/// Encrypts clear, up to its first NUL byte.
/// Returns: "" on failure.
std::string secretEncrypt(const std::string &clear);

/// Decrypts cipher. Returns "" for an empty cipher text without calling the platform.
/// Returns: "" on failure.
std::string secretDecrypt(const std::string &cipher);

/// A secret in clear text. The destructor overwrites text. A buffer that text has outgrown is not
/// overwritten, so do not append to it.
struct ClearText {
  std::string text;

  ~ClearText();
};

} // namespace KOVA::Backup

#endif
