#include "tests/session/session_fixture.h"

#include <cstdlib>
#include <cstring>

namespace KovaTest {
namespace {
const char *chosenLetters = nullptr;
}

ChosenName::ChosenName(const char *letters) {
  chosenLetters = letters;
}

ChosenName::~ChosenName() {
  chosenLetters = nullptr;
}

} // namespace KovaTest

extern "C" char *mkdtemp(char *path) noexcept {
  static auto *const real = KovaTest::realFunction<char *(char *)>("mkdtemp");
  if (KovaTest::failsNow("mkdtemp")) {
    return nullptr;
  }
  if (KovaTest::chosenLetters == nullptr) {
    return real(path);
  }
  std::memcpy(path + std::strlen(path) - 6, KovaTest::chosenLetters, 6);
  return ::mkdir(path, 0700) == 0 ? path : nullptr;
}
