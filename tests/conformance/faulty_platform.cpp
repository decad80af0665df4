// A platform with one fault: preloaded before the libraries, it spoils the call that KOVA_FAULT
// names. For the test that the conformance program notices.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovanetsdk.h"
#include "kovaplatform/kovasdk.h"

#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace {

bool faultIs(const char *name) {
  const char *fault = std::getenv("KOVA_FAULT");
  return fault != nullptr && std::strcmp(fault, name) == 0;
}

template <typename Function>
Function *real(const char *name) {
  return reinterpret_cast<Function *>(::dlsym(RTLD_NEXT, name));
}

// The section that a platform takes which compares names by their beginnings, or without case.
std::string takenFor(const char *path, const char *name) {
  const bool beginning = faultIs("names-by-beginning");
  if (!beginning && !faultIs("names-without-case")) {
    return name;
  }
  KLIBCSzList *list = real<decltype(KLIBCSzListAlloc)>("KLIBCSzListAlloc")(8);
  (void)real<decltype(KLIBCFileEnumSection)>("KLIBCFileEnumSection")(path, &list);
  std::string taken = name;
  for (int i = list->count - 1; i >= 0; --i) {
    const char *listed = KLIBCSzListGet(list, i);
    if (beginning ? std::strncmp(listed, name, std::strlen(name)) == 0
                  : ::strcasecmp(listed, name) == 0) {
      taken = listed;
    }
  }
  KLIBCSzListFree(list);
  return taken;
}

// Pairs that a hash without copies points to, and the hash as it is when they are used.
std::vector<std::pair<const char *, const char *>> pointedTo;

KLIBCSzHash *filledLate(KLIBCSzHash *hash) {
  for (const auto &[key, value] : pointedTo) {
    (void)real<decltype(KLIBCSzHashSetValue)>("KLIBCSzHashSetValue")(&hash, key, value);
  }
  pointedTo.clear();
  return hash;
}

bool endsInLine(const char *path) {
  std::ifstream in(path);
  const std::string text(std::istreambuf_iterator<char>(in), {});
  return text.empty() || text.back() == '\n';
}

// Enciphers and deciphers with what this process has thrown dice for when it began.
void withKeyOfProcess(std::string &text) {
  static const std::vector<char> key = [] {
    std::random_device dice;
    std::vector<char> bytes(16);
    for (char &byte : bytes) {
      byte = static_cast<char>(1 + dice() % 15);
    }
    return bytes;
  }();
  for (std::size_t i = 0; i < text.size(); ++i) {
    text[i] = static_cast<char>(text[i] ^ key[i % key.size()]);
  }
}

// Leaves a file half written, as a writer in place does for a moment.
void halve(const char *path) {
  struct stat info {};
  if (::stat(path, &info) == 0) {
    (void)!::truncate(path, info.st_size / 2);
  }
}

int onlyCode = 0;

} // namespace

#pragma GCC visibility push(default)
extern "C" {

int KLIBCErrGet(void) {
  if (faultIs("one-error-record")) {
    return onlyCode;
  }
  return faultIs("no-error-codes") ? 0 : real<decltype(KLIBCErrGet)>("KLIBCErrGet")();
}

void KLIBCErrSetEx(int code, const char *file, int line) {
  onlyCode = code;
  real<decltype(KLIBCErrSetEx)>("KLIBCErrSetEx")(code, file, line);
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
  if (faultIs("hash-without-copies")) {
    pointedTo.emplace_back(key, value);
    return 0;
  }
  return real<decltype(KLIBCSzHashSetValue)>("KLIBCSzHashSetValue")(hash, key, value);
}

int KLIBCFileEnumSection(const char *path, KLIBCSzList **list) {
  const int result = real<decltype(KLIBCFileEnumSection)>("KLIBCFileEnumSection")(path, list);
  if (faultIs("section-left-out") && result >= 0 && (*list)->count > 0) {
    --(*list)->count;
  }
  if (faultIs("headers-untrimmed") && result >= 0 && (*list)->count > 0 &&
      std::strstr(KLIBCSzListGet(*list, (*list)->count - 1), "between blanks") != nullptr) {
    --(*list)->count;
  }
  return faultIs("missing-file-is-empty") && result < 0 ? 0 : result;
}

int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags) {
  const int result = real<decltype(KLIBCFileSetSection)>("KLIBCFileSetSection")(
      path, takenFor(path, name).c_str(), reserved, filledLate(hash), flags);
  if (faultIs("torn-files") && result == 1) {
    halve(path);
  }
  if (faultIs("link-replaced") && result == 1) {
    ::unlink(path);
  }
  return faultIs("set-gives-2") && result == 1 ? 2 : result;
}

int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags) {
  if (faultIs("header-glued") && !endsInLine(path)) {
    std::ofstream(path, std::ios::app) << "[" << name << "]\n";
    return 0;
  }
  return faultIs("nothing-added") ? 0
                                  : real<decltype(KLIBCFileAddSection)>("KLIBCFileAddSection")(
                                        path, name, filledLate(hash), flags);
}

int KLIBCFileRemoveSection(const char *path, const char *name) {
  return faultIs("nothing-removed")
             ? 1
             : real<decltype(KLIBCFileRemoveSection)>("KLIBCFileRemoveSection")(
                   path, takenFor(path, name).c_str());
}

int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size) {
  if (faultIs("no-encryption")) {
    std::strncpy(buf, plain, static_cast<std::size_t>(size) - 1);
    return 1;
  }
  if (faultIs("crash")) {
    std::abort();
  }
  const int result = real<decltype(KLIBCCryptSzEncrypt)>("KLIBCCryptSzEncrypt")(plain, buf, size);
  if (faultIs("key-of-process") && result != 0) {
    std::string text = buf;
    withKeyOfProcess(text);
    text.copy(buf, text.size());
  }
  if (faultIs("cipher-overflow")) {
    buf[size] = '\0';
  }
  return result;
}

int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size) {
  std::string text = cipher;
  if (faultIs("key-of-process")) {
    withKeyOfProcess(text);
  }
  const int result =
      real<decltype(KLIBCCryptSzDecrypt)>("KLIBCCryptSzDecrypt")(text.c_str(), buf, size);
  if (faultIs("clear-overflow")) {
    buf[size] = '\0';
  }
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
  if (faultIs("never-writable")) {
    for (KOVAVOLInfo *entry = list; entry != nullptr; entry = entry->next) {
      entry->accessStatus = 0;
    }
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
  if (faultIs("mount-paths-only") && result >= 0 && std::strcmp(path, info->mountPath) != 0) {
    return -1;
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
  if (faultIs("last-name") && result >= 0) {
    std::strncpy(name, std::strrchr(path, '/') + 1, static_cast<std::size_t>(nameSize) - 1);
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
