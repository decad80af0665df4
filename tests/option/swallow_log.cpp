// For a program that feeds the library invalid input all the time: log lines are not failures.

#include "tests/support/log_capture.h"

namespace {
const KovaTest::LogCapture swallowed;
}
