#include "tests/crash/shared.h"

#include <cstdio>
#include <cstdlib>
#include <unistd.h>

namespace KovaTest::Crash {

void Refusal::reset() {
  isExpected_ = false;
  isNoted_ = false;
  text_ = {};
}

std::string Refusal::text() const {
  if (!isNoted_) {
    return "";
  }
  return text_.front() == '\0' ? "by a process that was killed then" : text_.data();
}

void Refusal::note(const char *what) {
  if (!isExpected_ && !isNoted_.exchange(true)) {
    std::snprintf(text_.data(), text_.size(), "%s", what);
  }
}

Refusal &refusal() {
  static Refusal *const shared = makeShared<Refusal>();
  if (shared == nullptr) {
    std::abort();
  }
  return *shared;
}

void require(bool succeeded, const char *what) {
  if (succeeded) {
    return;
  }
  refusal().note(what);
  for (;;) {
    ::pause();
  }
}

} // namespace KovaTest::Crash
