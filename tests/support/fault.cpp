#include "tests/support/fault.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace KovaTest {
namespace {
std::array<Fault *, 8> standing{};
}

Fault::Fault(const char *function, int nth, int error, bool lasting)
    : function_(function), nth_(nth), error_(error), lasting_(lasting) {
  for (Fault *&slot : standing) {
    if (slot == nullptr) {
      slot = this;
      return;
    }
  }
  std::abort(); // more than eight at a time
}

Fault::~Fault() {
  for (Fault *&slot : standing) {
    if (slot == this) {
      slot = nullptr;
    }
  }
}

bool failsNow(const char *function) {
  bool fails = false;
  for (Fault *fault : standing) {
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

} // namespace KovaTest
