#ifndef KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H
#define KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H

/// @file What the tests of the core stand-in share: the error record as a value.

#include "kovaplatform/kovacore.h"

#include <string>

namespace KovaTest {

/// Empties the error record, so that a test sees what the next call does to it.
inline void clearError() {
  KLIBCErrSetEx(0, "untouched", 7);
}

/// The code of the last error; -1 when a record is not whole: a failure names its place.
inline int errorCode() {
  const int code = KLIBCErrGet();
  const std::string file = KLIBCErrorGetFile();
  if (code == 0) {
    return file == "untouched" && KLIBCErrorGetLine() == 7 ? 0 : -1;
  }
  return file.rfind("core/", 0) == 0 && KLIBCErrorGetLine() > 0 ? code : -1;
}

} // namespace KovaTest

#endif
