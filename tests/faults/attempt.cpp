#include "tests/faults/attempt.h"

namespace KovaTest::Faults {

void checkAttempt(const Seen &seen, Findings &findings, const std::string &name) {
  const std::string value = seen.valueOf(name);
  const bool outOfMemory = value == kBadAlloc && seen.failedIn("memory mmap mremap brk");
  findings.expect(value.empty() || outOfMemory || seen.clean == nullptr ||
                      value == seen.clean->valueOf(name),
                  name + " is " + value);
  findings.expect(!value.empty() || seen.killed() || seen.clean == nullptr ||
                      seen.clean->valueOf(name).empty() || !seen.valueOf("threw").empty(),
                  name + " is missing");
}

void checkAttempts(const Seen &seen, Findings &findings) {
  const auto &names = seen.clean == nullptr ? seen.said : seen.clean->said;
  for (const auto &entry : names) {
    checkAttempt(seen, findings, entry.first);
  }
}

} // namespace KovaTest::Faults
