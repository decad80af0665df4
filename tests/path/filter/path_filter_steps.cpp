#include "tests/path/filter/path_filter_steps.h"

extern "C" void __wrap___sanitizer_cov_trace_pc();

extern "C" void __wrap___sanitizer_cov_trace_pc() {
  ++KovaTest::steps;
}
