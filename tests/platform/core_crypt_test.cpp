// Encryption of secrets, and the key that its first use creates.

#include "tests/platform/core_support.h"
#include "tests/support/fault.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <malloc.h>
#include <new>
#include <numeric>
#include <set>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <tuple>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::string *watched = nullptr; // the text that must be wiped; emptied when that happens
bool areFreesWatched = false;
int freed = 0;     // arrays freed meanwhile
int unwiped = 0;   // those of them that were not all zeros
int inherited = 0; // synced descriptors that a child would have

// A configuration that names a key file in the test's own directory.
class Keyed {
public:
  explicit Keyed(const std::string &name = "secret.key") : file(dir / name) {
    writeFile(dir / "conf", "[secret]\nkeyFile=\"" + file + "\"\n");
    ::setenv("KOVA_PLATFORM_CONF", (dir / "conf").c_str(), 1);
    clearError();
  }
  ~Keyed() { ::unsetenv("KOVA_PLATFORM_CONF"); }
  Keyed(const Keyed &) = delete;
  Keyed &operator=(const Keyed &) = delete;

  // Stores a key of 32 bytes that count up from first.
  void putKey(int first, mode_t mode = 0600, std::size_t size = 32) const {
    std::string key(size, '\0');
    std::iota(key.begin(), key.end(), static_cast<char>(first));
    writeFile(file, key);
    ASSERT_EQ(0, ::chmod(file.c_str(), mode));
  }

  TestFolder dir;
  const std::string file;
};

std::string encrypted(const std::string &text) {
  std::string buffer((text.size() + 2) * 2, '\0');
  const int done =
      KLIBCCryptSzEncrypt(text.c_str(), buffer.data(), static_cast<int>(buffer.size()));
  return done != 0 ? buffer.c_str() : "<failed>";
}

std::string decrypted(const std::string &form) {
  std::string buffer(std::max<std::size_t>(form.size(), 10), '\0');
  const int done =
      KLIBCCryptSzDecrypt(form.c_str(), buffer.data(), static_cast<int>(buffer.size()));
  if (done == 0) {
    EXPECT_EQ(std::string(buffer.size(), '\0'), buffer) << "touched on failure";
  }
  return done != 0 ? buffer.c_str() : "<failed>";
}

bool refuses(const std::string &form) {
  clearError();
  return decrypted(form) == "<failed>" && errorCode() == KLIBC_ERR_BAD_CIPHER;
}

std::string textOf(std::size_t size) {
  std::string text(size, '\0');
  for (std::size_t i = 0; i < size; ++i) {
    text[i] = static_cast<char>(1 + (i * 7 + size) % 255);
  }
  return text;
}

} // namespace

extern "C" void sodium_memzero(void *bytes, std::size_t size) {
  if (watched != nullptr && !watched->empty() && size >= watched->size() &&
      std::memcmp(bytes, watched->data(), watched->size()) == 0) {
    watched->clear();
  }
  ::explicit_bzero(bytes, size);
}

// The buffers of keys and texts are arrays. The library below wipes memory of its own, so only what
// a buffer holds when it is freed shows that the buffer itself was wiped.
void operator delete[](void *array) noexcept {
  if (areFreesWatched) {
    const auto *const bytes = static_cast<const unsigned char *>(array);
    const std::size_t size = ::malloc_usable_size(array);
    ++freed;
    unwiped +=
        std::all_of(bytes, bytes + size, [](unsigned char byte) { return byte == 0; }) ? 0 : 1;
  }
  std::free(array);
}

void operator delete[](void *array, std::size_t /*size*/) noexcept {
  ::operator delete[](array);
}

void *operator new[](std::size_t size) {
  void *const array = std::calloc(1, size); // zeros also beyond the size that was asked for
  return array != nullptr ? array : throw std::bad_alloc();
}

extern "C" int fsync(int fd) {
  static auto *const real = realFunction<int(int)>("fsync");
  inherited += ::fcntl(fd, F_GETFD) == FD_CLOEXEC ? 0 : 1;
  return failsNow("fsync") ? -1 : real(fd);
}

extern "C" int sodium_init() {
  static auto *const real = realFunction<int()>("sodium_init");
  return failsNow("sodium_init") ? -1 : real();
}

TEST(Crypt, FailsWhenTheLibraryBelowDoesNotStart) {
  const Keyed keyed;
  keyed.putKey(0);
  const Fault fault("sodium_init", 1, 0, true);
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_CRYPT, errorCode());
  clearError();
  EXPECT_EQ("<failed>", decrypted("Bpc"));
  EXPECT_EQ(KLIBC_ERR_CRYPT, errorCode());
}

TEST(Crypt, GivesTextsBack) {
  const Keyed keyed;
  for (std::size_t size = 0; size <= 400; ++size) {
    const std::string text = textOf(size);
    ASSERT_EQ(text, decrypted(encrypted(text))) << size;
  }
  const std::string large = textOf(1 << 20);
  EXPECT_EQ(large, decrypted(encrypted(large)));
  EXPECT_EQ(0, errorCode());
}

// Computed by an independent implementation. Whatever changes in the library, files written before
// must stay readable.
TEST(Crypt, KeepsItsForm) {
  const Keyed keyed;
  keyed.putKey(0);
  EXPECT_EQ("Bpc", encrypted(""));
  EXPECT_EQ("Scrl", encrypted("a"));
  EXPECT_EQ("MxEGZ77H", encrypted("abc"));
  EXPECT_EQ("_upE6U9cdZA2KFZecjE", encrypted("password"));
  EXPECT_EQ("ZFiPtlHglR4cUCaE0tskMEw6BesBnDDoaJzkEtfTOacuMgo56vD4zNQOWakN-Q",
            encrypted("The quick brown fox jumps over"));
  EXPECT_EQ("1pK5aKCP1Zu_Nr6qs6eKVXe9", encrypted("gr\xc3\xbc\xc3\x9f dich"));
}

TEST(Crypt, FitsTwiceTheTextAndFourBytes) {
  const Keyed keyed;
  std::size_t last = 0;
  for (std::size_t size = 0; size <= 400; ++size) {
    const std::size_t length = encrypted(textOf(size)).size();
    EXPECT_LE(length + 1, 2 * (size + 2)) << size;
    EXPECT_LT(last, length) << "the length tells that of the text";
    last = length;
  }
}

TEST(Crypt, WritesLettersDigitsDashAndUnderscoreOnly) {
  const Keyed keyed;
  std::set<char> seen;
  for (std::size_t size = 0; size <= 200; ++size) {
    const std::string form = encrypted(textOf(size));
    seen.insert(form.begin(), form.end());
  }
  const std::string alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
  EXPECT_EQ(std::set<char>(alphabet.begin(), alphabet.end()), seen);
}

TEST(Crypt, GivesEqualTextsEqualFormsAndOthersOthers) {
  const Keyed keyed;
  EXPECT_EQ(encrypted("password"), encrypted("password"));
  std::set<std::string> forms;
  for (char c = 'a'; c <= 'z'; ++c) {
    forms.insert(encrypted(std::string("passwor") + c));
  }
  EXPECT_EQ(26U, forms.size());
}

TEST(Crypt, WritesNothingBeyondWhatItNeeds) {
  const Keyed keyed;
  for (const std::size_t size : {0U, 1U, 8U, 27U, 28U, 100U}) {
    const std::string text = textOf(size);
    const std::string form = encrypted(text);
    std::string buffer(form.size() + 9, 'x');
    const int exact = static_cast<int>(form.size()) + 1;
    clearError();
    EXPECT_EQ(0, KLIBCCryptSzEncrypt(text.c_str(), buffer.data(), exact - 1));
    EXPECT_EQ(KLIBC_ERR_BUFFER_SIZE, errorCode());
    EXPECT_EQ(std::string(form.size() + 9, 'x'), buffer);
    EXPECT_NE(0, KLIBCCryptSzEncrypt(text.c_str(), buffer.data(), exact));
    EXPECT_EQ(form + std::string(1, '\0') + "xxxxxxxx", buffer);
    std::string clear(size + 9, 'x');
    EXPECT_EQ(0, KLIBCCryptSzDecrypt(form.c_str(), clear.data(), static_cast<int>(size)));
    EXPECT_EQ(KLIBC_ERR_BUFFER_SIZE, errorCode());
    EXPECT_EQ(std::string(size + 9, 'x'), clear);
    EXPECT_NE(0, KLIBCCryptSzDecrypt(form.c_str(), clear.data(), static_cast<int>(size) + 1));
    EXPECT_EQ(text + std::string(1, '\0') + "xxxxxxxx", clear);
  }
}

TEST(Crypt, RefusesNoBufferAndNoText) {
  const Keyed keyed;
  char buffer[16] = "x";
  for (const auto service : {KLIBCCryptSzEncrypt, KLIBCCryptSzDecrypt}) {
    clearError();
    EXPECT_EQ(0, service(nullptr, buffer, 16));
    EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode());
    clearError();
    EXPECT_EQ(0, service("Bpc", nullptr, 16));
    EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode());
    for (const int size : {0, -1, INT_MIN}) {
      clearError();
      EXPECT_EQ(0, service("Bpc", buffer, size));
      EXPECT_EQ(KLIBC_ERR_BUFFER_SIZE, errorCode());
    }
  }
  EXPECT_STREQ("x", buffer);
}

TEST(Crypt, RefusesEveryChangedByte) {
  const Keyed keyed;
  keyed.putKey(0); // a key for which no change of the shortest texts happens to pass
  for (const std::size_t size : {0U, 1U, 2U, 3U, 8U, 28U, 40U}) {
    const std::string form = encrypted(textOf(size));
    for (std::size_t at = 0; at < form.size(); ++at) {
      for (int byte = 1; byte < 256; ++byte) {
        std::string changed = form;
        changed[at] = static_cast<char>(byte);
        if (changed != form) {
          ASSERT_TRUE(refuses(changed)) << size << ": byte " << at << " made " << byte;
        }
      }
    }
  }
}

TEST(Crypt, RefusesEveryOtherLength) {
  const Keyed keyed;
  keyed.putKey(0);
  for (const std::size_t size : {0U, 1U, 8U, 28U, 100U}) {
    const std::string form = encrypted(textOf(size));
    for (std::size_t cut = 0; cut < form.size(); ++cut) {
      EXPECT_TRUE(refuses(form.substr(0, cut))) << size << " cut to " << cut;
    }
    std::string longer = form;
    for (const char *more : {"A", "A", "=", "B", "_", "\n"}) {
      longer += more;
      EXPECT_TRUE(refuses(longer)) << size << " with more";
    }
  }
}

TEST(Crypt, RefusesTextThatWasNeverEncrypted) {
  const Keyed keyed;
  keyed.putKey(0);
  for (const char *text : {"", "a", "ab", "password", "plain text", "====", "////", "+/+/", " Bpc",
                           "Bpc ", "\x80\x80\x80", "\xff\xff\xff\xff",
                           "B\xb0"
                           "c"}) {
    EXPECT_TRUE(refuses(text)) << text;
  }
}

TEST(Crypt, RefusesAnotherKeysForm) {
  const Keyed keyed;
  keyed.putKey(0);
  std::vector<std::string> forms;
  for (std::size_t size = 0; size <= 64; ++size) {
    forms.push_back(encrypted(textOf(size)));
  }
  keyed.putKey(1);
  for (const std::string &form : forms) {
    EXPECT_TRUE(refuses(form)) << form;
    EXPECT_NE(form, encrypted(textOf(static_cast<std::size_t>(&form - forms.data()))));
  }
}

TEST(Crypt, WipesTextAndKey) {
  const Keyed keyed;
  keyed.putKey(0);
  const std::string form = encrypted("the clear text");
  std::string key = readFile(keyed.file);
  watched = &key;
  EXPECT_EQ(form, encrypted("the clear text"));
  EXPECT_EQ("", key);
  key = readFile(keyed.file);
  EXPECT_EQ("the clear text", decrypted(form));
  EXPECT_EQ("", key);
  std::string text = "the clear text";
  watched = &text;
  EXPECT_EQ("the clear text", decrypted(form));
  EXPECT_EQ("", text);
  watched = nullptr;
}

// The master key, the three keys derived from it, the hash and, when decrypting, the text.
TEST(Crypt, FreesNoKeyAndNoTextUnwiped) {
  const Keyed keyed;
  keyed.putKey(1);
  const std::string form = encrypted("the clear text");
  char buffer[64] = "";
  for (const auto &[service, text, count] :
       {std::make_tuple(KLIBCCryptSzEncrypt, "the clear text", 5),
        std::make_tuple(KLIBCCryptSzDecrypt, form.c_str(), 6)}) {
    freed = 0;
    unwiped = 0;
    areFreesWatched = true;
    const int done = service(text, buffer, sizeof buffer);
    areFreesWatched = false;
    EXPECT_NE(0, done);
    EXPECT_EQ(count, freed);
    EXPECT_EQ(0, unwiped);
  }
}

TEST(SecretKey, KeepsItsOwnersPermissionsWhateverTheUmask) {
  const Keyed keyed("secret.key");
  const mode_t old = ::umask(0777);
  const std::string form = encrypted("text");
  ::umask(old);
  struct stat status {};
  ASSERT_EQ(0, ::stat(keyed.file.c_str(), &status));
  EXPECT_EQ(S_IFREG | 0600U, status.st_mode);
  EXPECT_EQ("text", decrypted(form));
}

TEST(SecretKey, IsMadeOnFirstUseForItsOwnerOnly) {
  const Keyed keyed("folder/secret.key");
  const mode_t old = ::umask(0);
  const std::string form = encrypted("text");
  ::umask(old);
  struct stat status {};
  ASSERT_EQ(0, ::stat(keyed.file.c_str(), &status));
  EXPECT_EQ(S_IFREG | 0600U, status.st_mode);
  EXPECT_EQ(32, status.st_size);
  EXPECT_EQ(1U, status.st_nlink);
  ASSERT_EQ(0, ::stat((keyed.dir / "folder").c_str(), &status));
  EXPECT_EQ(S_IFDIR | 0700U, status.st_mode);
  EXPECT_EQ("text", decrypted(form));
  EXPECT_EQ(form, encrypted("text"));
  EXPECT_EQ(0, errorCode());
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf", "folder"));
  EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(keyed.dir / "folder"), {}));
}

TEST(SecretKey, StandsInTheSystemsFolderWhenNoneIsNamed) {
  if (std::filesystem::exists("/etc/kovaplatform/platform.conf")) {
    GTEST_SKIP() << "skipped: this machine has a configuration";
  }
  if (::mount("tmpfs", "/var/lib", "tmpfs", 0, nullptr) != 0) {
    GTEST_SKIP() << "skipped: no folder of our own in the place of /var/lib";
  }
  clearError();
  EXPECT_EQ("text", decrypted(encrypted("text")));
  EXPECT_EQ(0, errorCode());
  EXPECT_EQ(32U, readFile("/var/lib/kovaplatform/secret.key").size());
  EXPECT_EQ(0, ::umount("/var/lib"));
}

TEST(SecretKey, IsAnotherOnEachMachine) {
  const Keyed keyed;
  const std::string form = encrypted("text of some length");
  const std::string first = readFile(keyed.file);
  ASSERT_EQ(0, ::unlink(keyed.file.c_str()));
  EXPECT_TRUE(refuses(form));
  EXPECT_NE(first, readFile(keyed.file));
}

TEST(SecretKey, IsNotTouchedByUse) {
  const Keyed keyed;
  keyed.putKey(7, 0400);
  const std::string key = readFile(keyed.file);
  encrypted("text");
  EXPECT_EQ(key, readFile(keyed.file));
  EXPECT_EQ(0, errorCode());
}

TEST(SecretKey, IsRefusedWhenOthersMayUseIt) {
  const Keyed keyed;
  for (const mode_t mode : {0640U, 0620U, 0610U, 0604U, 0602U, 0601U, 0644U, 0666U}) {
    keyed.putKey(0, mode);
    clearError();
    EXPECT_EQ("<failed>", encrypted("text")) << mode;
    EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode()) << mode;
    clearError();
    EXPECT_EQ("<failed>", decrypted("Bpc")) << mode;
    EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode()) << mode;
  }
}

TEST(SecretKey, IsRefusedWhenItIsAnothers) {
  const Keyed keyed;
  keyed.putKey(0);
  if (::chown(keyed.file.c_str(), 12345, ::getegid()) != 0) {
    GTEST_SKIP() << "skipped: only root may give files away";
  }
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode());
}

TEST(SecretKey, IsRefusedWhenItHasAnotherSize) {
  const Keyed keyed;
  for (const std::size_t size : {0U, 31U, 33U, 64U}) {
    keyed.putKey(0, 0600, size);
    clearError();
    EXPECT_EQ("<failed>", encrypted("text")) << size;
    EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode()) << size;
  }
}

TEST(SecretKey, IsRefusedWhenItIsNoRegularFile) {
  const Keyed keyed;
  ASSERT_EQ(0, ::mkfifo(keyed.file.c_str(), 0600));
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode());
  ASSERT_EQ(0, ::unlink(keyed.file.c_str()));
  ASSERT_EQ(0, ::mkdir(keyed.file.c_str(), 0700));
  clearError();
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_KEY_UNSAFE, errorCode());
}

TEST(SecretKey, IsReadThroughALink) {
  const Keyed keyed;
  keyed.putKey(0);
  ASSERT_EQ(0, ::rename(keyed.file.c_str(), (keyed.dir / "real").c_str()));
  ASSERT_EQ(0, ::symlink("real", keyed.file.c_str()));
  EXPECT_EQ("Bpc", encrypted(""));
  EXPECT_EQ(0, errorCode());
}

// A key that replaced the link would not be where the link is meant to lead.
TEST(SecretKey, IsNotMadeInPlaceOfALinkThatLeadsNowhere) {
  const Keyed keyed;
  ASSERT_EQ(0, ::symlink("nowhere", keyed.file.c_str()));
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_KEY_READ, errorCode());
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf", "secret.key"));
}

TEST(SecretKey, NeedsAFolderForItsFolder) {
  const Keyed keyed("a/b/secret.key");
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_EQ(KLIBC_ERR_KEY_MAKE, errorCode());
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf"));
}

TEST(SecretKey, IsNotGuessedWhenTheConfigurationIsFaulty) {
  const Keyed keyed;
  writeFile(keyed.dir / "conf", "[secret]\nkeyfile=\"x\"\n");
  LogCapture log;
  EXPECT_EQ("<failed>", encrypted("text"));
  EXPECT_NE(0, KLIBCErrGet());
  EXPECT_EQ(keyed.dir / "conf", KLIBCErrorGetFile());
  EXPECT_EQ(2, KLIBCErrorGetLine());
  EXPECT_EQ(1U, log.take().size());
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf"));
}

namespace {

// Encrypts for the first time while a call fails.
struct FirstUse {
  void run() { failed = encrypted("text of some length") == "<failed>"; }

  // Nothing is left beside the key, a key that exists is complete, and the next use succeeds.
  void check(bool fired) {
    EXPECT_EQ(failed, KLIBCErrGet() != 0);
    EXPECT_TRUE(fired || !failed);
    const bool made = std::filesystem::exists(keyed.file);
    EXPECT_TRUE(made || failed);
    if (made) {
      EXPECT_EQ(32U, readFile(keyed.file).size());
    }
    if (std::filesystem::exists(keyed.dir / "folder")) {
      EXPECT_EQ(made ? 1 : 0,
                std::distance(std::filesystem::directory_iterator(keyed.dir / "folder"), {}));
    }
    EXPECT_EQ("text", decrypted(encrypted("text"))) << "the next use";
  }

  Keyed keyed{"folder/secret.key"};
  LogCapture log; // reading the configuration may be what fails
  bool failed = false;
};

} // namespace

TEST(SecretKey, IsWholeOrNotThereWhateverFails) {
  for (const char *function : {"open", "openat", "write", "fsync", "linkat", "mkdir", "read"}) {
    SCOPED_TRACE(function);
    failEachCall<FirstUse>(function, EIO);
  }
  for (const char *function : {"flock", "fstat"}) {
    SCOPED_TRACE(function);
    failEachCall<FirstUse>(function, ENOLCK);
  }
}

// The folder's name, the key and the key's name. When a power cut destroys a key, everything that
// was encrypted with it is lost.
TEST(SecretKey, IsNotUsedBeforeItIsOnTheDisk) {
  for (int nth = 1; nth <= 3; ++nth) {
    const Keyed keyed("folder/secret.key");
    clearError();
    const Fault fault("fsync", nth, EIO);
    EXPECT_EQ("<failed>", encrypted("text")) << nth;
    EXPECT_EQ(KLIBC_ERR_KEY_MAKE, errorCode()) << nth;
  }
}

TEST(SecretKey, IsMadeWithoutADescriptorForChildren) {
  for (const char *name : {"secret.key", "folder/secret.key"}) {
    const Keyed keyed(name);
    inherited = 0;
    EXPECT_NE("<failed>", encrypted("text"));
    EXPECT_EQ(0, inherited) << name;
  }
}

TEST(SecretKey, ClearsWhatAKilledMakerLeft) {
  const Keyed keyed;
  writeFile(keyed.dir / ".kovacore.3.tmp", "half a key");
  EXPECT_NE("<failed>", encrypted("text"));
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf", "secret.key"));
}

TEST(SecretKey, IsMadeWithoutUnnamedFilesToo) {
  const Keyed keyed;
  const Fault fault("O_TMPFILE", 1, EOPNOTSUPP, true);
  const std::string form = encrypted("text");
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ("text", decrypted(form));
  EXPECT_THAT(keyed.dir.names(), ElementsAre("conf", "secret.key"));
  struct stat status {};
  ASSERT_EQ(0, ::stat(keyed.file.c_str(), &status));
  EXPECT_EQ(S_IFREG | 0600U, status.st_mode);
  EXPECT_EQ(1U, status.st_nlink);
}

TEST(SecretKey, GoesOnWhenASignalInterrupts) {
  for (const char *function : {"open", "openat", "read", "write"}) {
    const Keyed keyed;
    // Where the configuration is read with the same call, that call comes first.
    const Fault fault(function, std::strcmp(function, "open") == 0 ? 2 : 1, EINTR);
    EXPECT_EQ("text", decrypted(encrypted("text"))) << function;
    EXPECT_TRUE(fault.fired()) << function;
    EXPECT_EQ(0, errorCode()) << function;
  }
}

namespace {

// The cipher texts of several processes that encrypt for the first time at the same moment.
std::set<std::string> formsOfFirstUsers(int count) {
  std::array<int, 2> gate{};
  std::array<int, 2> answers{};
  EXPECT_EQ(0, ::pipe(gate.data()));
  EXPECT_EQ(0, ::pipe(answers.data()));
  for (int i = 0; i < count; ++i) {
    if (::fork() == 0) {
      ::close(gate[1]);
      char end = 0;
      (void)!::read(gate[0], &end, 1); // until the parent closes its end
      std::string form = encrypted("the text of all");
      form.resize(64, ' ');
      (void)!::write(answers[1], form.data(), form.size());
      ::_exit(0);
    }
  }
  for (const int fd : {gate[0], gate[1], answers[1]}) {
    ::close(fd);
  }
  std::set<std::string> forms;
  int heard = 0;
  for (std::string form(64, ' '); ::read(answers[0], form.data(), form.size()) == 64; ++heard) {
    forms.insert(form.substr(0, form.find(' ')));
  }
  ::close(answers[0]);
  EXPECT_EQ(count, heard);
  while (::wait(nullptr) > 0) {
  }
  return forms;
}

} // namespace

TEST(SecretKey, IsOneForAllWhoUseItFirstAtOnce) {
  for (int round = 0; round < 100; ++round) {
    const Keyed keyed("folder/secret.key");
    // Every second round runs without unnamed files.
    const Fault fault("O_TMPFILE", round % 2 == 0 ? INT_MAX : 1, EOPNOTSUPP, true);
    EXPECT_THAT(formsOfFirstUsers(8), ElementsAre(encrypted("the text of all")));
    EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(keyed.dir / "folder"), {}));
  }
}
