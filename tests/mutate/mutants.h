// What scripts/mutate adds to each source of its copy: which mutant is chosen, and which of them a
// test reaches. The shipped sources do not include it.
#ifndef KOVABACKUP_TESTS_MUTATE_MUTANTS_H
#define KOVABACKUP_TESTS_MUTATE_MUTANTS_H

#include <cstddef>
#include <sys/resource.h>
#include <sys/shm.h>

// The number of the chosen mutant is the soft limit of RLIMIT_MSGQUEUE, since children inherit that
// even where the environment is cleared, and no test looks at it. Shared memory of System V is
// attached without a descriptor, and by calls that no test replaces.
constexpr rlim_t kKovaRecording = 500000; // plus a number that makes the key of the memory
constexpr rlim_t kKovaRecordings = 100000;
constexpr key_t kKovaKey = 0x6b6f0000;

struct KovaReached {
  unsigned mutants;         // in a row of the table
  volatile unsigned test;   // the row of the test that runs
  unsigned char reached[1]; // a row for each test, a byte for each mutant
};

__attribute__((visibility("hidden"))) inline int kovaChosen = -1;
__attribute__((visibility("hidden"))) inline KovaReached *kovaReached = nullptr;

// Once in each program and each library: the first source that is loaded does it for all.
__attribute__((constructor(101))) static inline void kovaLoadMutant() {
  if (kovaChosen != -1) {
    return;
  }
  kovaChosen = 0;
  struct rlimit limit {};
  if (::getrlimit(RLIMIT_MSGQUEUE, &limit) != 0) {
    return;
  }
  if (limit.rlim_cur < kKovaRecording) {
    kovaChosen = static_cast<int>(limit.rlim_cur);
  } else if (limit.rlim_cur < kKovaRecording + kKovaRecordings) {
    const key_t key = kKovaKey + static_cast<key_t>(limit.rlim_cur - kKovaRecording);
    void *memory = ::shmat(::shmget(key, 0, 0), nullptr, 0);
    kovaReached =
        memory == reinterpret_cast<void *>(-1) ? nullptr : static_cast<KovaReached *>(memory);
  }
}

/// Whether a mutant is the chosen one.
inline bool kovaMutant(int number) {
  if (kovaReached != nullptr) {
    const std::size_t row = std::size_t(kovaReached->test) * kovaReached->mutants;
    kovaReached->reached[row + static_cast<std::size_t>(number)] = 1;
  }
  return kovaChosen == number;
}

/// In place of retryOnEintr.
template <typename Call>
auto kovaOnce(Call call) {
  return call();
}

#endif
