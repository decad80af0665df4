#include "tests/support/census.h"
#include "tests/support/private_tmp.h"

#include <cstdio>
#include <cstring>
#include <gmock/gmock.h>

int main(int argc, char **argv) {
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
