#ifndef KOVABACKUP_TESTS_RACE_SUPPORT_H
#define KOVABACKUP_TESTS_RACE_SUPPORT_H

/// @file How long the tests of this folder race, and their random numbers.
///
/// In the suite each takes a few seconds. scripts/soak race sets KOVA_SOAK, and then they take as
/// long as it takes. KOVA_SEED replaces the seed, which every test prints: it repeats what
/// processes do, though not the moments at which the kernel lets them.

#include <cstdio>
#include <cstdlib>
#include <random>
#include <string>
#include <vector>

namespace KovaTest {

inline bool isSoak() {
  const char *const soak = std::getenv("KOVA_SOAK");
  return soak != nullptr && *soak != '\0';
}

/// How often something happens, in the suite and in the long run.
inline int share(int inSuite, int inSoak) {
  return isSoak() ? inSoak : inSuite;
}

/// The seed of a test, which is printed. Of a long run a new one each time.
inline unsigned printedSeed() {
  const char *const given = std::getenv("KOVA_SEED");
  unsigned seed = isSoak() ? std::random_device()() : 20261122U;
  if (given != nullptr) {
    seed = static_cast<unsigned>(std::strtoul(given, nullptr, 10));
  }
  std::printf("KOVA_SEED=%u\n", seed);
  (void)std::fflush(stdout); // or every forked child would print it again
  return seed;
}

/// What execv(2) takes, as long as the words live. It changes none of them.
inline std::vector<char *> argumentVector(const std::vector<std::string> &words) {
  std::vector<char *> pointers;
  pointers.reserve(words.size() + 1);
  for (const std::string &word : words) {
    pointers.push_back(const_cast<char *>(word.c_str()));
  }
  pointers.push_back(nullptr);
  return pointers;
}

} // namespace KovaTest

#endif
