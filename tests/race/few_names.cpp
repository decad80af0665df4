#include "tests/race/few_names.h"

#include "tests/support/fault.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <random>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest {
namespace {

constexpr char kLetters[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789";
constexpr unsigned kCount = sizeof kLetters - 1;
constexpr int kTries = 100000;

unsigned count = 0; // 0: names are chosen by libc
unsigned seed = 0;
pid_t seeded = -1; // the process for which the source was made
std::mt19937 source;

unsigned nextName() {
  if (seeded != ::getpid()) {
    seeded = ::getpid();
    source.seed(seed + static_cast<unsigned>(seeded));
  }
  return static_cast<unsigned>(source()) % count;
}

// Calls make for one name after another until it returns something else than EEXIST.
template <typename Make>
int makeFresh(char *path, Make make) {
  char *const end = path + std::strlen(path) - 6;
  const int before = errno;
  for (int tries = 0; tries < kTries; ++tries) {
    std::memcpy(end, FewNames::letters(nextName()).data(), 6);
    const int made = make(path);
    if (made >= 0 || errno != EEXIST) {
      errno = made >= 0 ? before : errno;
      return made;
    }
  }
  return -1;
}

} // namespace

FewNames::FewNames(unsigned names, unsigned randomSeed) {
  count = names;
  seed = randomSeed;
  seeded = -1;
}

FewNames::~FewNames() {
  count = 0;
}

std::string FewNames::letters(unsigned number) {
  return {'N', 'a', 'm', 'e', kLetters[number / kCount % kCount], kLetters[number % kCount]};
}

} // namespace KovaTest

extern "C" {

char *mkdtemp(char *path) noexcept {
  if (KovaTest::failsNow("mkdtemp")) {
    return nullptr;
  }
  if (KovaTest::count == 0) {
    return KovaTest::realFunction<char *(char *)>("mkdtemp")(path);
  }
  const int made = KovaTest::makeFresh(path, [](const char *name) { return ::mkdir(name, 0700); });
  return made == 0 ? path : nullptr;
}

int mkstemp(char *path) {
  if (KovaTest::failsNow("mkstemp")) {
    return -1;
  }
  if (KovaTest::count == 0) {
    return KovaTest::realFunction<int(char *)>("mkstemp")(path);
  }
  return KovaTest::makeFresh(
      path, [](const char *name) { return ::open(name, O_RDWR | O_CREAT | O_EXCL, 0600); });
}
}
