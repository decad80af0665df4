#include "platform/core/fail.h"

using namespace KOVA::Platform;

namespace {
constexpr const char *kFile = "core/section_file.cpp";
}

int KLIBCFileEnumSection(const char *, KLIBCSzList **) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile);
}

int KLIBCFileSetSection(const char *, const char *, const char *, KLIBCSzHash *, int) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile);
}

int KLIBCFileAddSection(const char *, const char *, KLIBCSzHash *, int) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile);
}

int KLIBCFileRemoveSection(const char *, const char *) {
  return fail(KLIBC_ERR_NOT_AVAILABLE, kFile);
}
