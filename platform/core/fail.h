#ifndef KOVAPLATFORM_CORE_FAIL_H
#define KOVAPLATFORM_CORE_FAIL_H

/// @file How a function of the stand-in fails: it records one code with the place where the
/// failure was found, and hands back what its caller is to see.
///
///     return fail(KLIBC_ERR_NO_FILE, kFile);          // -1
///     return fail(KLIBC_ERR_NO_SECTION, kFile, 0);    // 0
///
/// Whoever passes a failure on records nothing more: the record names its origin.
/// errno:  left as the failing system call set it.

#include "kovaplatform/kovacore.h"

namespace KovaPlatform {

inline int fail(int code, const char *file, int result = -1, int line = __builtin_LINE()) {
  KLIBCErrSetEx(code, file, line);
  return result;
}

/// Runs the body of a C function. What it throws ends here, as a failure: a C caller cannot catch.
template <typename Result, typename Body>
Result guarded(const char *file, Result failed, Body body, int line = __builtin_LINE()) noexcept {
  try {
    return body();
  } catch (...) { // the bodies allocate and throw nothing of their own
    KLIBCErrSetEx(KLIBC_ERR_NO_MEMORY, file, line);
    return failed;
  }
}

} // namespace KovaPlatform

#endif
