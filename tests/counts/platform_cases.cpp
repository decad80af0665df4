// The services of the stand-ins that process texts of any size, and addresses.

#include "kovabackup/network.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovanetsdk.h"

#include "tests/counts/counted.h"

#include <memory>

namespace KovaCounts {
namespace {

using Hash = std::unique_ptr<KLIBCSzHash, decltype(&KLIBCSzHashFree)>;

// The size is the number of keys.
Hash makeHash(std::size_t keys) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(16);
  for (std::size_t i = 0; i < keys; ++i) {
    const std::string key = "key" + std::to_string(100000 + i);
    require(KLIBCSzHashSetValue(&hash, key.c_str(), "value") >= 0, "a pair");
  }
  return {hash, &KLIBCSzHashFree};
}

void hashSet(std::size_t keys) {
  count([&] { return makeHash(keys) != nullptr; });
}

// Half of the section's options remain, and a comment precedes each of them.
void setSection(std::size_t keys) {
  std::string text = "[task]\n";
  for (std::size_t i = 0; i < keys; ++i) {
    text += "# comment\nkey" + std::to_string(100000 + i * 2) + "=old\n";
  }
  const std::string path = scratchFolder() + "/platform.conf";
  writeFile(path, text);
  const Hash hash = makeHash(keys);
  count([&] { return KLIBCFileSetSection(path.c_str(), "task", nullptr, hash.get(), 0) == 1; });
}

// The size is that of the text in bytes.
void encrypt(std::size_t bytes) {
  (void)scratchFolder(); // which has the key
  const std::string text(bytes, 's');
  std::string cipher((bytes + 2) * 2, '\0');
  count([&] {
    return KLIBCCryptSzEncrypt(text.c_str(), cipher.data(), static_cast<int>(cipher.size())) != 0;
  });
}

void decrypt(std::size_t bytes) {
  (void)scratchFolder();
  const std::string text(bytes, 's');
  std::string cipher((bytes + 2) * 2, '\0');
  require(KLIBCCryptSzEncrypt(text.c_str(), cipher.data(), static_cast<int>(cipher.size())) != 0,
          "a cipher text");
  std::string back(cipher.size(), '\0');
  count([&] {
    return KLIBCCryptSzDecrypt(cipher.c_str(), back.data(), static_cast<int>(back.size())) != 0 &&
           text == back.c_str();
  });
}

bool isAddress(const std::string &text) {
  return BlKLIBIsIpAddr(text.c_str()) != 0 || BlKLIBIsv6IpAddrValid(text.c_str()) != 0;
}

void addresses(std::size_t) {
  count([] {
    return isAddress("192.168.100.200") && isAddress("2001:db8:1:2:3:4:5:6") && isAddress("::1") &&
           isAddress("::ffff:10.0.0.1") && !isAddress("10.0.0.256") && !isAddress("fe80::1%eth0");
  });
}

void addressItself(std::size_t) {
  count([] {
    return KOVA::Backup::Net::getIpFromAddr("192.168.100.200") == "192.168.100.200" &&
           KOVA::Backup::Net::getIpFromAddr("2001:db8::1") == "2001:db8::1";
  });
}

// Texts that remain plausible as long as possible. The size is that of the text in bytes.
void longAddresses(std::size_t bytes) {
  const std::string digits(bytes, '1');
  const std::string dots = repeated("1.", bytes / 2);
  const std::string colons = repeated("1:", bytes / 2);
  const std::string zeros(bytes, '0');
  count([&] {
    return !isAddress(digits) && !isAddress(dots) && !isAddress(colons) && !isAddress(zeros) &&
           !isAddress("::" + zeros);
  });
}

constexpr Case kCases[] = {
    {"platform.hashSet", hashSet, {10, 1000}, 1000},
    {"platform.setSection", setSection, {10, 1000}, 1000},
    {"platform.encrypt", encrypt, {16, 1024}, 8192},
    {"platform.decrypt", decrypt, {16, 1024}, 8192},
    {"platform.isAddress", addresses},
    {"platform.isAddress.long", longAddresses, {}, 4096},
    {"Net.getIpFromAddr", addressItself},
};

} // namespace

Cases platformCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
