#ifndef KOVABACKUP_OPTION_SECRET_H
#define KOVABACKUP_OPTION_SECRET_H

/// @file Secret options: clear text to the platform's cipher text and back.
///
///     const std::string cipher = secretEncrypt("open sesame");
///     const ClearText clear{secretDecrypt(cipher)};
///     ...use clear.text...                           // overwritten when clear goes out of scope
///
/// Failure: "", which is logged; nothing is thrown but std::bad_alloc.
/// Log:     LOG_ERR under the module path of the option store.
/// Threads: as the platform's two calls.

#include <string>

namespace KOVA::Backup {

/// The cipher text of a clear text, which ends at its first NUL byte.
/// Returns: "" on failure.
std::string secretEncrypt(const std::string &clear);

/// The clear text of a cipher text. An empty cipher text is "" without a call of the platform.
/// Returns: "" on failure.
std::string secretDecrypt(const std::string &cipher);

/// A secret in clear text, overwritten before its memory is released.
struct ClearText {
  std::string text;

  ~ClearText();
};

} // namespace KOVA::Backup

#endif
