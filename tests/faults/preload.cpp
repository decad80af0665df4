// Loaded into programs before their libraries: sends what they log to the report, and begins the
// counting where the dynamic loader has done its work.

#include "tests/faults/allocations.h"
#include "tests/faults/marker.h"
#include "tests/faults/report.h"

#include <cstdlib>

namespace KovaTest::Faults {
namespace {

__attribute__((constructor)) void begin() {
  const char *const number = std::getenv(kReportVariable);
  if (number != nullptr) {
    useReport(std::atoi(number));
    ::unsetenv("LD_PRELOAD"); // what the program starts is its own affair
    markBegin();
    countAllocations(true);
  }
}

} // namespace
} // namespace KovaTest::Faults
