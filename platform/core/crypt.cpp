#include "platform/core/fail.h"

using namespace KOVA::Platform;

namespace {
constexpr const char *kFile = "core/crypt.cpp";
}

int KLIBCCryptSzEncrypt(const char *, char *, int) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile, 0);
}

int KLIBCCryptSzDecrypt(const char *, char *, int) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile, 0);
}
