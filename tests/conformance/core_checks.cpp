// libkovacore: error record, lists, hashes, encryption, fork. Section files have their
// own source.

#include "tests/conformance/check.h"

#include "kovaplatform/kovacore.h"

#include <algorithm>
#include <cstring>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace KovaConformance {
namespace {

constexpr int kCapacity = 1024; // the library's own
constexpr char kSecret[] = "open sesame";
const std::string kGuard(64, '\x5A');

void errorRecordKeepsWhatWasSet() {
  KLIBCErrSetEx(0x1234, "here.c", 56);
  expectErrorCode(0x1234, "KLIBCErrSetEx(0x1234, \"here.c\", 56)");
  const char *file = KLIBCErrorGetFile();
  expect(file != nullptr && std::strcmp(file, "here.c") == 0, "the file is not \"here.c\"");
  expect(KLIBCErrorGetLine() == 56, "the line is not 56");
  KLIBCErrSetEx(0, "here.c", 57);
  expectErrorCode(0, "KLIBCErrSetEx(0, ...)");
}

void threadsHaveRecordsOfTheirOwn() {
  KLIBCErrSetEx(0x1234, "here.c", 56);
  std::thread([] { KLIBCErrSetEx(0x4321, "there.c", 65); }).join();
  if (KLIBCErrGet() != 0x1234) {
    note("another thread's error replaces this one's: log lines may show the wrong error");
  }
}

void listBeginsEmpty() {
  KLIBCSzList *list = KLIBCSzListAlloc(kCapacity);
  expect(list != nullptr, "KLIBCSzListAlloc(1024) gave null");
  expect(list->count == 0,
         "the count (bytes 4 to 7) of a new list is " + std::to_string(list->count) + " and not 0");
  KLIBCSzListFree(list);
  KLIBCSzListFree(nullptr);
}

void hashTakesManyPairs() {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(kCapacity);
  expect(hash != nullptr, "KLIBCSzHashAlloc(1024) gave null");
  for (int i = 0; i < 3 * kCapacity; ++i) {
    const std::string key = "key" + std::to_string(i);
    expect(KLIBCSzHashSetValue(&hash, key.c_str(), "\"value\"") >= 0,
           "KLIBCSzHashSetValue refused pair " + std::to_string(i));
    expect(hash != nullptr, "KLIBCSzHashSetValue took the hash away");
  }
  KLIBCSzHashFree(hash);
  KLIBCSzHashFree(nullptr);
}

// As the library calls it: with a zeroed buffer of exactly this size, here with a guard behind it.
std::string encrypted(const std::string &clear) {
  const std::size_t size = 2 * (clear.size() + 2);
  std::string buffer = std::string(size, '\0') + kGuard;
  if (KLIBCCryptSzEncrypt(clear.c_str(), buffer.data(), static_cast<int>(size)) == 0) {
    fail("a text of " + std::to_string(clear.size()) + " bytes is not encrypted");
  }
  const std::size_t length = ::strnlen(buffer.data(), size);
  expect(length < size && buffer.substr(size) == kGuard,
         "the cipher text of " + std::to_string(clear.size()) + " bytes does not end within " +
             std::to_string(size) + " bytes");
  return buffer.substr(0, length);
}

// Likewise. Returns: whether the platform accepted it.
bool decrypted(const std::string &cipher, std::string &clear) {
  const std::size_t size = std::max<std::size_t>(cipher.size(), 10);
  std::string buffer = std::string(size, '\0') + kGuard;
  const int result = KLIBCCryptSzDecrypt(cipher.c_str(), buffer.data(), static_cast<int>(size));
  expect(buffer.substr(size) == kGuard, "KLIBCCryptSzDecrypt wrote past its buffer");
  clear = buffer.substr(0, ::strnlen(buffer.data(), size));
  return result != 0;
}

std::vector<std::string> secrets() {
  std::vector<std::string> texts;
  for (const std::size_t size :
       {0U, 1U, 2U, 3U, 7U, 8U, 9U, 15U, 16U, 27U, 28U, 29U, 100U, 4000U}) {
    texts.emplace_back(size, 'x');
  }
  texts.emplace_back("p\xC3\xA4ss \"word\" = [1] # \\ '\x01\x7F\xFF'");
  return texts;
}

void secretsComeBack() {
  for (const std::string &text : secrets()) {
    const std::string cipher = encrypted(text);
    std::string again;
    expect(decrypted(cipher, again),
           "a cipher text of " + std::to_string(text.size()) + " bytes' text is not decrypted");
    expect(again == text, inQuotes(text) + " comes back as " + inQuotes(again));
    expect(text.empty() || cipher.find(text) == std::string::npos || text.size() < 4,
           "the cipher text of " + inQuotes(text) + " shows it");
  }
}

// The other process executes this program again: a forked one would inherit a key held in memory.
void secretsComeBackInAnotherProcess() {
  const std::string cipher = encrypted(kSecret);
  const pid_t child = ::fork();
  if (child == 0) {
    ::execl("/proc/self/exe", "kovaplatform-conformance", "--decrypts", cipher.c_str(), nullptr);
    ::_exit(127);
  }
  int status = 0;
  expect(::waitpid(child, &status, 0) == child && status == 0,
         "another process cannot decrypt what this one encrypted");
}

void changedSecretsAreRefused() {
  std::string cipher = encrypted("open sesame, open sesame, open sesame");
  char &middle = cipher[cipher.size() / 2];
  middle = middle == 'A' ? 'B' : 'A';
  std::string again;
  if (decrypted(cipher, again)) {
    note("a changed cipher text is decrypted, to " + inQuotes(again));
  }
  if (decrypted("no cipher text", again)) {
    note("a plain text is decrypted, to " + inQuotes(again));
  }
  expectErrorRecorded("decrypting a plain text");
}

void forkForks() {
  const pid_t child = KLIBCProcFork();
  if (child == 0) {
    ::_exit(7);
  }
  expect(child > 0, "KLIBCProcFork gave " + std::to_string(child) + " to the parent");
  int status = 0;
  expect(::waitpid(child, &status, 0) == child, "its child cannot be waited for");
  expect(WIFEXITED(status) && WEXITSTATUS(status) == 7, "its child did not run on with 0");
}

} // namespace

bool decryptsTheSecret(const std::string &cipher) {
  std::string clear;
  return decrypted(cipher, clear) && clear == kSecret;
}

std::vector<Check> coreChecks() {
  return {
      {"core.error.round-trip", "code, file and line come back as they were set",
       errorRecordKeepsWhatWasSet},
      {"core.error.threads", "each thread has an error record of its own",
       threadsHaveRecordsOfTheirOwn},
      {"core.list.empty", "a new list counts 0 strings in its second 32-bit field",
       listBeginsEmpty},
      {"core.hash.many", "a hash grows past its first capacity", hashTakesManyPairs},
      {"core.secret.round-trip",
       "texts of any length come back, in the buffers that the library has", secretsComeBack},
      {"core.secret.other-process", "another process decrypts what one encrypted",
       secretsComeBackInAnotherProcess},
      {"core.secret.changed", "changed and foreign cipher texts are refused",
       changedSecretsAreRefused},
      {"core.fork", "fork answers 0 in the child and the child's number in the parent", forkForks},
  };
}

} // namespace KovaConformance
