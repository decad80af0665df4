// For a program whose input is made to fail all the time: the lines are no finding.

#include "tests/support/log_capture.h"

namespace {
const KovaTest::LogCapture swallowed;
}
