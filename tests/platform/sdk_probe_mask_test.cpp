// The facts that a probe asks for, on a file system that reports nothing else.

#include "platform/sdk/system_probe.h"

#include "tests/support/fault.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

using namespace KovaPlatform;

extern "C" int statx(int dir, const char *path, int flags, unsigned int mask,
                     struct statx *out) noexcept {
  static auto *const real =
      KovaTest::realFunction<int(int, const char *, int, unsigned int, struct statx *)>("statx");
  const int result = real(dir, path, flags, mask, out);
  if ((mask & STATX_TYPE) == 0) {
    out->stx_mode = 0;
  }
  out->stx_mask &= mask;
  return result;
}

TEST(SystemProbeMask, HasTheTypeOfAFile) {
  const SystemProbe probe;
  EXPECT_TRUE(probe.facts("/tmp")->isDirectory);
  EXPECT_FALSE(probe.facts("/dev/null")->isDirectory);
}

TEST(SystemProbeMask, HasTheIdOfTheMount) {
  EXPECT_TRUE(SystemProbe().facts("/tmp")->mountId);
}
