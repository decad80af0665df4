// A platform with one fault: preloaded before the libraries, it spoils the call that KOVA_FAULT
// names. For the test that the conformance program notices.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovanetsdk.h"
#include "kovaplatform/kovasdk.h"

#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

bool faultIs(const char *name) {
  const char *fault = std::getenv("KOVA_FAULT");
  return fault != nullptr && std::strcmp(fault, name) == 0;
}

template <typename Function>
Function *real(const char *name) {
  return reinterpret_cast<Function *>(::dlsym(RTLD_NEXT, name));
}

// Leaves a file half written, as a writer in place does for a moment.
void halve(const char *path) {
  struct stat info {};
  if (::stat(path, &info) == 0) {
    (void)!::truncate(path, info.st_size / 2);
  }
}

} // namespace

#pragma GCC visibility push(default)
extern "C" {

int KLIBCErrGet(void) {
  return faultIs("no-error-codes") ? 0 : real<decltype(KLIBCErrGet)>("KLIBCErrGet")();
}

int KLIBCErrorGetLine(void) {
  return real<decltype(KLIBCErrorGetLine)>("KLIBCErrorGetLine")() + (faultIs("wrong-line") ? 1 : 0);
}

KLIBCSzList *KLIBCSzListAlloc(int capacity) {
  KLIBCSzList *list = real<decltype(KLIBCSzListAlloc)>("KLIBCSzListAlloc")(capacity);
  if (faultIs("list-not-empty")) {
    list->count = 1;
  }
  return list;
}

int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value) {
  static int pairs = 0;
  if (faultIs("full-hash") && ++pairs > 1024) {
    return -1;
  }
  return real<decltype(KLIBCSzHashSetValue)>("KLIBCSzHashSetValue")(hash, key, value);
}

int KLIBCFileEnumSection(const char *path, KLIBCSzList **list) {
  const int result = real<decltype(KLIBCFileEnumSection)>("KLIBCFileEnumSection")(path, list);
  if (faultIs("section-left-out") && result >= 0 && (*list)->count > 0) {
    --(*list)->count;
  }
  return faultIs("missing-file-is-empty") && result < 0 ? 0 : result;
}

int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags) {
  const int result =
      real<decltype(KLIBCFileSetSection)>("KLIBCFileSetSection")(path, name, reserved, hash, flags);
  if (faultIs("torn-files") && result == 1) {
    halve(path);
  }
  if (faultIs("link-replaced") && result == 1) {
    ::unlink(path);
  }
  return faultIs("set-gives-2") && result == 1 ? 2 : result;
}

int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags) {
  return faultIs("nothing-added")
             ? 0
             : real<decltype(KLIBCFileAddSection)>("KLIBCFileAddSection")(path, name, hash, flags);
}

int KLIBCFileRemoveSection(const char *path, const char *name) {
  return faultIs("nothing-removed")
             ? 1
             : real<decltype(KLIBCFileRemoveSection)>("KLIBCFileRemoveSection")(path, name);
}

int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size) {
  if (faultIs("no-encryption")) {
    std::strncpy(buf, plain, static_cast<std::size_t>(size) - 1);
    return 1;
  }
  if (faultIs("crash")) {
    std::abort();
  }
  return real<decltype(KLIBCCryptSzEncrypt)>("KLIBCCryptSzEncrypt")(plain, buf, size);
}

int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size) {
  const int result = real<decltype(KLIBCCryptSzDecrypt)>("KLIBCCryptSzDecrypt")(cipher, buf, size);
  return faultIs("no-encryption") ? (std::strncpy(buf, cipher, static_cast<std::size_t>(size)), 1)
                                  : result;
}

pid_t KLIBCProcFork(void) {
  return faultIs("no-fork") ? -1 : real<decltype(KLIBCProcFork)>("KLIBCProcFork")();
}

int KOVAVolumeSupportLocGet(void) {
  return real<decltype(KOVAVolumeSupportLocGet)>("KOVAVolumeSupportLocGet")();
}

KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags) {
  KOVAVOLInfo *list =
      real<decltype(KOVAMountVolAllEnum)>("KOVAMountVolAllEnum")(reserved, location, enumFlags);
  if (faultIs("no-volumes")) {
    return nullptr;
  }
  if (faultIs("wrong-type") && list != nullptr) {
    list->fsType = 1;
  }
  if (faultIs("size-0") && list != nullptr) {
    list->size = 0;
  }
  return list;
}

void KOVAMountVolInfoFree(KOVAVOLInfo *list) {
  real<decltype(KOVAMountVolInfoFree)>("KOVAMountVolInfoFree")(list);
}

int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info) {
  const int result = real<decltype(KOVAMountVolInfoGet)>("KOVAMountVolInfoGet")(path, info);
  if (faultIs("long-record")) {
    info->next = nullptr;
  }
  return faultIs("volume-anywhere") ? 0 : result;
}

int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size) {
  const int result =
      real<decltype(KOVAShareTmpPathGet)>("KOVAShareTmpPathGet")(mountPath, buf, size);
  if (faultIs("tmp-elsewhere") && result >= 0) {
    std::strncpy(buf, "/tmp", static_cast<std::size_t>(size));
  }
  return faultIs("tmp-anywhere") ? 0 : result;
}

int KOVAShareNamePathGet(const char *path, char *name, int nameSize, char *sharePath,
                         int sharePathSize) {
  const int result = real<decltype(KOVAShareNamePathGet)>("KOVAShareNamePathGet")(
      path, name, nameSize, sharePath, sharePathSize);
  if (faultIs("nameless-share")) {
    name[0] = '\0';
  }
  return faultIs("share-anywhere") ? 0 : result;
}

int BlKLIBIsIpAddr(const char *text) {
  return faultIs("any-ipv4") ? 1 : real<decltype(BlKLIBIsIpAddr)>("BlKLIBIsIpAddr")(text);
}

int BlKLIBIsv6IpAddrValid(const char *text) {
  return faultIs("no-ipv6") ? 0
                            : real<decltype(BlKLIBIsv6IpAddrValid)>("BlKLIBIsv6IpAddrValid")(text);
}

int KOVANetLookupIP(const char *name, char *buf, int family, int flags) {
  const int result = real<decltype(KOVANetLookupIP)>("KOVANetLookupIP")(name, buf, family, flags);
  if (faultIs("lookup-overflow")) {
    buf[KOVA_NET_IP_TEXT_BYTES] = '\0';
  }
  return faultIs("lookup-always") ? 1 : result;
}

} // extern "C"
#pragma GCC visibility pop
