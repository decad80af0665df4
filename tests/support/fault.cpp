#include "tests/support/fault.h"

#include "tests/support/shared_memory.h"

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <unistd.h>

namespace KovaTest {
namespace {

std::array<Fault *, 8> active{};

// What the test's process and its forked children share.
struct Shared {
  char function[32] = ""; // "" while there is no ChildFault
  int nth = 0;
  int error = 0;
  bool lasting = false;
  std::atomic<int> calls{0};
  std::atomic<bool> fired{false};
};

// Made before main, so that no child makes its own. Functions may be called earlier; until then,
// both are 0.
Shared *const shared = makeShared<Shared>();
const pid_t testPid = ::getpid();

} // namespace

Fault::Fault(const char *function, int nth, int error, bool lasting)
    : function_(function), nth_(nth), error_(error), lasting_(lasting) {
  for (Fault *&slot : active) {
    if (slot == nullptr) {
      slot = this;
      return;
    }
  }
  std::abort(); // more than eight at a time
}

Fault::~Fault() {
  for (Fault *&slot : active) {
    if (slot == this) {
      slot = nullptr;
    }
  }
}

bool failsNow(const char *function) {
  bool fails = false;
  for (Fault *fault : active) {
    if (fault == nullptr || std::strcmp(fault->function_, function) != 0) {
      continue;
    }
    ++fault->calls_;
    if (fault->calls_ == fault->nth_ || (fault->lasting_ && fault->calls_ > fault->nth_)) {
      fault->fired_ = true;
      errno = fault->error_;
      fails = true;
    }
  }
  return fails;
}

ChildFault::ChildFault(const char *function, int nth, int error, bool lasting) {
  shared->nth = nth;
  shared->error = error;
  shared->lasting = lasting;
  shared->calls = 0;
  shared->fired = false;
  std::snprintf(shared->function, sizeof shared->function, "%s", function);
}

ChildFault::~ChildFault() {
  shared->function[0] = '\0';
}

int ChildFault::calls() const {
  return shared->calls;
}

bool ChildFault::fired() const {
  return shared->fired;
}

bool failsInChild(const char *function) {
  if (!inForkedChild() || std::strcmp(shared->function, function) != 0) {
    return false;
  }
  const int call = ++shared->calls;
  if (call != shared->nth && !(shared->lasting && call > shared->nth)) {
    return false;
  }
  shared->fired = true;
  errno = shared->error;
  return true;
}

void *definitionOf(const char *function, void *handle) {
  if constexpr (sizeof(void *) == 4) {
    constexpr const char *kForms[][2] = {
        {"__", "64_time64"}, {"__", "_time64"}, {"", "64"}, {"__", "64"}};
    for (const auto &[prefix, suffix] : kForms) {
      char name[64] = "";
      (void)std::snprintf(name, sizeof name, "%s%s%s", prefix, function, suffix);
      if (void *const found = ::dlsym(handle, name)) {
        return found;
      }
    }
  }
  return ::dlsym(handle, function);
}

bool inForkedChild() {
  return testPid != 0 && ::getpid() != testPid;
}

} // namespace KovaTest
