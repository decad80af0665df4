#include "tests/option/fake_platform.h"

#include "kovaplatform/kovacore.h"

#include <cstdio>
#include <cstring>
#include <ostream>

using KovaTest::platform;

struct KLIBCSzHash {
  KovaTest::Pairs pairs;
};

namespace KovaTest {

FakePlatform platform;

std::ostream &operator<<(std::ostream &os, const ErrSet &set) {
  return os << set.code << " at " << set.file << ':' << set.line;
}

std::string fakeCipher(const std::string &clear) {
  std::string cipher = "~";
  for (const char byte : clear) {
    char hex[3];
    std::snprintf(hex, sizeof hex, "%02x", static_cast<unsigned>(static_cast<unsigned char>(byte)));
    cipher += hex;
  }
  return cipher;
}

namespace {

void fail(int code) {
  platform.code = code;
  platform.file = "core/fake.c";
  platform.line = 77;
}

bool isZeroed(const char *buf, int size) {
  for (int i = 0; i < size; ++i) {
    if (buf[i] != '\0') {
      return false;
    }
  }
  return true;
}

int deliver(const std::string &text, char *buf, int size) {
  if (platform.cryptCode != 0) {
    std::memset(buf, 'x', static_cast<std::size_t>(size)); // no NUL: it must not be read
    fail(platform.cryptCode);
    return 0;
  }
  if (text.size() >= static_cast<std::size_t>(size)) {
    fail(0x7777);
    return 0;
  }
  std::memcpy(buf, text.c_str(), text.size() + 1);
  return 1;
}

std::string fakeClear(const std::string &cipher) {
  std::string clear;
  for (std::size_t at = 1; at + 1 < cipher.size(); at += 2) {
    clear += static_cast<char>(std::stoi(cipher.substr(at, 2), nullptr, 16));
  }
  return clear;
}

// Its strings are the sections of the fake, from the first one.
KLIBCSzList *makeList(int capacity) {
  auto *list = new KLIBCSzList{capacity, 0};
  ++platform.alive;
  return list;
}

int write(std::vector<SectionCall> &calls, SectionCall call, int result, int code) {
  if (platform.duringWrite) {
    platform.duringWrite();
  }
  calls.push_back(std::move(call));
  if (result < 0 || code != 0) {
    fail(code);
  }
  return result;
}

} // namespace
} // namespace KovaTest

using namespace KovaTest;

int KLIBCErrGet(void) {
  return platform.code;
}
const char *KLIBCErrorGetFile(void) {
  return platform.file.c_str();
}
int KLIBCErrorGetLine(void) {
  return platform.line;
}
void KLIBCErrSetEx(int code, const char *file, int line) {
  platform.code = code;
  platform.file = file;
  platform.line = line;
  platform.errSets.push_back({code, file, line});
}

KLIBCSzList *KLIBCSzListAlloc(int capacity) {
  platform.capacities.push_back(capacity);
  if (platform.listAllocFails) {
    fail(0x1234);
    return nullptr;
  }
  return makeList(capacity);
}
const char *KLIBCSzListGet(const KLIBCSzList *list, int index) {
  if (list == nullptr || index < 0 || index >= list->count) {
    ADD_FAILURE() << "list read at " << index;
    return nullptr;
  }
  const auto &name = platform.sections[static_cast<std::size_t>(index)];
  return name ? name->c_str() : nullptr;
}
void KLIBCSzListFree(KLIBCSzList *list) {
  if (list != nullptr) {
    --platform.alive;
    delete list;
  }
}

KLIBCSzHash *KLIBCSzHashAlloc(int capacity) {
  platform.capacities.push_back(capacity);
  if (platform.hashAllocFails) {
    fail(0x1234);
    return nullptr;
  }
  auto *hash = new KLIBCSzHash;
  ++platform.alive;
  return hash;
}
int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value) {
  if (platform.setValueCode != 0 && platform.refusedKey == key) {
    fail(platform.setValueCode);
    return -1;
  }
  auto *moved =
      new KLIBCSzHash(**hash); // every time, so that a handle kept by the library is stale
  delete *hash;
  *hash = moved;
  moved->pairs.emplace_back(key, value);
  return platform.setValueResult;
}
void KLIBCSzHashFree(KLIBCSzHash *hash) {
  ASSERT_NE(nullptr, hash);
  --platform.alive;
  delete hash;
}

int KLIBCFileEnumSection(const char *path, KLIBCSzList **list) {
  platform.enumPaths.emplace_back(path);
  auto *moved = new KLIBCSzList(**list);
  delete *list;
  *list = moved;
  moved->count = static_cast<int>(platform.sections.size());
  if (platform.enumResult < 0) {
    fail(platform.enumCode);
  }
  return platform.enumResult;
}
int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags) {
  return write(platform.setCalls, {path, name, hash->pairs, reserved == nullptr, flags},
               platform.setResult, platform.setCode);
}
int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags) {
  return write(platform.addCalls, {path, name, hash->pairs, true, flags}, platform.addResult,
               platform.addCode);
}
int KLIBCFileRemoveSection(const char *path, const char *name) {
  if (platform.duringWrite) {
    platform.duringWrite();
  }
  platform.removeCalls.emplace_back(path, name);
  if (platform.removeResult != 1) {
    fail(platform.removeCode);
  }
  return platform.removeResult;
}

int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size) {
  platform.encrypted.push_back({plain, buf, size, isZeroed(buf, size)});
  return deliver(fakeCipher(plain), buf, size);
}
int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size) {
  platform.decrypted.push_back({cipher, buf, size, isZeroed(buf, size)});
  return deliver(fakeClear(cipher), buf, size);
}
