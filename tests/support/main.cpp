#include "tests/support/census.h"
#include "tests/support/private_tmp.h"

#include <csignal>
#include <cstdio>
#include <cstring>
#include <gmock/gmock.h>

namespace {

// Signals that the caller ignores, as nohup(1) does, are ignored by the children of a test, too,
// which then waits for ever for one of them to end by a signal.
void stopIgnoringSignals() {
  for (const int sig : {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGPIPE, SIGCHLD}) {
    (void)std::signal(sig, SIG_DFL);
  }
}

} // namespace

int main(int argc, char **argv) {
  stopIgnoringSignals();
  testing::InitGoogleMock(&argc, argv);
  if (!testing::GTEST_FLAG(list_tests)) {
    const std::string why = KovaTest::enterPrivateTmp();
    if (!why.empty()) {
      // CTest recognises a skipped test by this text.
      std::printf("[  SKIPPED ] skipped: no private /tmp: %s\n", why.c_str());
      return 0;
    }
  }
  testing::UnitTest::GetInstance()->listeners().Append(new KovaTest::CensusGuard);
  return RUN_ALL_TESTS();
}
